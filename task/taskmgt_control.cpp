// Task control: the user's commands on existing tasks, each one statement.
#include <climits>
#include <new>
#include <string>

#include "db/access.h"
#include "platform/log.h"
#include "torvale/task.h"

namespace {

constexpr char kLogUnit[] = "taskmgt";

constexpr char kDeleteListHead[] = "DELETE FROM download_queue WHERE task_id in (";
constexpr char kDelete[] = "DELETE FROM download_queue WHERE task_id=%d";
constexpr char kSettingSet[] =
    "UPDATE download_queue SET seeding_ratio=%d, seeding_interval=%d WHERE task_id=%d";
constexpr char kClearUser[] =
    "DELETE FROM download_queue WHERE status=%d and lower(username)=lower('%s')";
constexpr char kClearEveryone[] = "DELETE FROM download_queue WHERE status=%d";
constexpr char kResumeUser[] = "UPDATE download_queue SET status=%d  WHERE (status=%d OR "
                               "status>=%d) AND lower(username)=lower('%s')";
constexpr char kResumeEveryone[] =
    "UPDATE download_queue SET status=%d  WHERE status=%d OR status>=%d";
constexpr char kPauseUser[] = "UPDATE download_queue SET status=%d  WHERE status IN (%d, %d, %d, "
                              "%d, %d) AND lower(username)=lower('%s')";
constexpr char kPauseEveryone[] =
    "UPDATE download_queue SET status=%d  WHERE status IN (%d, %d, %d, %d, %d)";
constexpr char kDeleteUser[] = "DELETE FROM download_queue  WHERE lower(username)=lower('%s')";
constexpr char kDeleteEveryone[] = "DELETE FROM download_queue";

// The statement of a bulk command: for one user (name escaped, placed last) or, when
// `username` is null, for everybody.
template <typename... Ints>
std::string for_user(const char *username, const char *user_sql, const char *everyone_sql,
                     Ints... values) {
    if (username == nullptr)
        return torvale::db::format(everyone_sql, values...);
    return torvale::db::format(user_sql, values..., torvale::db::escape(username).c_str());
}

// Runs `command`, turning a failed allocation into -1: no exception leaves the library.
template <typename F> int guarded(F command) noexcept {
    try {
        return command();
    } catch (const std::bad_alloc &) {
        return -1;
    }
}

// Runs a command's statement: 0, or -1 after logging it. The single-task commands and
// the bulk ones log in their two forms.
int exec_single(const std::string &sql) {
    if (DownloadDBExec(sql.c_str()) == -1) {
        TV_LOG("%s (%d) Failed to exec [%s].", sql.c_str());
        return -1;
    }
    return 0;
}

int exec_bulk(const std::string &sql) {
    if (DownloadDBExec(sql.c_str()) == -1) {
        TV_LOG("%s:%d Failed to exec [%s]", sql.c_str());
        return -1;
    }
    return 0;
}

// A task id list must be there and hold at least one id.
bool ids_given(const int *task_ids, int count) noexcept {
    if (task_ids != nullptr && count > 0)
        return true;
    TV_LOG("%s (%d) Bad parameters.");
    return false;
}

bool id_given(int task_id) noexcept {
    if (task_id >= 0)
        return true;
    TV_LOG("%s (%d) Bad parameters.");
    return false;
}

std::string delete_list(const int *task_ids, int count) {
    std::string sql = kDeleteListHead;
    for (int i = 0; i < count; ++i) {
        if (i > 0)
            sql += ',';
        sql += std::to_string(task_ids[i]);
    }
    sql += ')';
    return sql;
}

} // namespace

extern "C" {

TORVALE_API int DownloadTaskMultiDelete(const int *task_ids, int count) noexcept {
    if (!ids_given(task_ids, count))
        return -1;
    std::string sql;
    try {
        sql = delete_list(task_ids, count);
    } catch (const std::bad_alloc &) {
        long long size = 24LL * count + 64;
        TV_LOG("%s (%d) Failed to malloc(%d).", static_cast<int>(size < INT_MAX ? size : INT_MAX));
        return -1;
    }
    int rc = DownloadDBExec(sql.c_str());
    if (rc == -1)
        TV_LOG("%s (%d) Failed to exec [%s].", sql.c_str());
    return rc;
}

TORVALE_API int DownloadTaskDelete(int task_id) noexcept {
    if (!id_given(task_id))
        return -1;
    return guarded([&] { return exec_single(torvale::db::format(kDelete, task_id)); });
}

TORVALE_API int DownloadTaskPause(int task_id) noexcept {
    if (!id_given(task_id))
        return -1;
    if (DownloadTaskStatusSet(task_id, TASK_STATUS_PAUSED) < 0) {
        TV_LOG("%s (%d) Failed to run DownloadTaskPause().");
        return -1;
    }
    return 0;
}

TORVALE_API int DownloadTaskMultiPause(const int *task_ids, int count) noexcept {
    if (!ids_given(task_ids, count))
        return -1;
    if (DownloadTaskMultiStatusSet(task_ids, count, TASK_STATUS_PAUSED) < 0) {
        TV_LOG("%s (%d) Failed to run DownloadTaskMulitPause().");
        return -1;
    }
    return 0;
}

TORVALE_API int DownloadTaskContinue(int task_id) noexcept {
    if (!id_given(task_id))
        return -1;
    if (DownloadTaskStatusSet(task_id, TASK_STATUS_WAITING) < 0) {
        TV_LOG("%s (%d) Failed to run DownloadTaskContinue().");
        return -1;
    }
    return 0;
}

TORVALE_API int DownloadTaskMultiContinue(const int *task_ids, int count) noexcept {
    if (!ids_given(task_ids, count))
        return -1;
    if (DownloadTaskMultiStatusSet(task_ids, count, TASK_STATUS_WAITING) < 0) {
        TV_LOG("%s (%d) Failed to run DownloadTaskMulitContinue().");
        return -1;
    }
    return 0;
}

TORVALE_API int DownloadTaskSettingSet(int task_id, const DownloadTaskSetting *setting) noexcept {
    if (setting == nullptr || task_id < 0) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    return guarded([&] {
        std::string sql = torvale::db::format(kSettingSet, setting->seeding_ratio,
                                              setting->seeding_interval, task_id);
        int rc = DownloadDBExec(sql.c_str());
        if (rc == -1)
            TV_LOG("%s (%d) Failed to exec [%s].", sql.c_str());
        return rc;
    });
}

TORVALE_API int DownloadTaskClear(const char *username) noexcept {
    return guarded([&] {
        return exec_single(for_user(username, kClearUser, kClearEveryone, TASK_STATUS_FINISHED));
    });
}

TORVALE_API int DownloadTaskResumeAll(const char *username) noexcept {
    return guarded([&] {
        return exec_bulk(for_user(username, kResumeUser, kResumeEveryone, TASK_STATUS_WAITING,
                                  TASK_STATUS_PAUSED, TASK_STATUS_ERROR));
    });
}

TORVALE_API int DownloadTaskPauseAll(const char *username) noexcept {
    return guarded([&] {
        return exec_bulk(for_user(username, kPauseUser, kPauseEveryone, TASK_STATUS_PAUSED,
                                  TASK_STATUS_WAITING, TASK_STATUS_DOWNLOADING,
                                  TASK_STATUS_DOWNLOAD_AUX, TASK_STATUS_SEED_AUX,
                                  TASK_STATUS_SEEDING));
    });
}

TORVALE_API int DownloadTaskDeleteAll(const char *username) noexcept {
    return guarded([&] {
        return exec_bulk(
            username != nullptr
                ? torvale::db::format(kDeleteUser, torvale::db::escape(username).c_str())
                : std::string(kDeleteEveryone));
    });
}

} // extern "C"
