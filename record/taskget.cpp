// Reads of one task through the queue listing, and totals over the queue.
#include <cstdio>
#include <memory>
#include <new>
#include <string>

#include "db/access.h"
#include "platform/log.h"
#include "platform/navosdk.h"
#include "torvale/queue.h"
#include "torvale/task.h"
#include "torvale/utils.h"

namespace {

constexpr char kLogUnit[] = "taskget";

constexpr char kCountAll[] = "SELECT count(*) FROM download_queue";
constexpr char kCountUser[] =
    "SELECT count(*) FROM download_queue WHERE lower(username)=lower('%s')";
constexpr char kLastIdAll[] = "SELECT max(task_id) FROM download_queue";
constexpr char kLastIdUser[] =
    "SELECT max(task_id) FROM download_queue WHERE lower(username)=lower('%s')";

// Downloading, seeding and seeding (aux): the tasks whose rates make the totals.
constexpr char kRateAll[] = "SELECT sum(current_rate) as sumdl, sum(upload_rate) as sumul "
                            "FROM download_queue WHERE status=%d or status=%d or status=%d";
constexpr char kRateUser[] =
    "SELECT sum(current_rate) as sumdl, sum(upload_rate) as sumul FROM download_queue "
    "WHERE (status=%d or status=%d or status=%d) and lower(username)=lower('%s')";

struct HandleClose {
    void operator()(DownloadQueueHandle *h) const noexcept { DownloadQueueClose(h); }
};
using Handle = std::unique_ptr<DownloadQueueHandle, HandleClose>;

// The task's record, or null after the message. Its texts live as long as `handle`.
const DownloadTaskInfo *task_record(int task_id, Handle &handle) noexcept {
    char condition[32];
    std::snprintf(condition, sizeof condition, "task_id=%d", task_id);
    handle.reset(DownloadQueueOpen(condition));
    if (handle == nullptr) {
        TV_LOG("%s (%d) Failed to open queue handler.");
        return nullptr;
    }
    const DownloadTaskInfo *task = DownloadQueueGet(handle.get());
    if (task == nullptr)
        TV_LOG("%s (%d) Failed to get the queue infor.");
    return task;
}

// Runs a totals statement on `conn`: its result with the one row in `row`, or an empty
// result after the message. Statements with a caller's text are logged whole.
torvale::db::Result total_row(DBConn_tag *conn, const std::string &sql, bool with_text,
                              unsigned &row) noexcept {
    torvale::db::Result result;
    if (torvale::db::execute(conn, sql.c_str(), result) == -1) {
        if (with_text)
            TV_LOG("%s (%d) Failed to exec [%s] (%s)", sql.c_str(), NAVODBErrorGet(conn));
        else
            TV_LOG("%s (%d) Failed to query database. (%s)", NAVODBErrorGet(conn));
        return nullptr;
    }
    if (NAVODBNumRows(result.get()) <= 0) {
        TV_LOG("%s (%d) Nothing is gotten from database ");
        return nullptr;
    }
    if (NAVODBFetchRow(result.get(), &row) == -1) {
        TV_LOG("%s (%d) NAVODBFetchRow() failed ");
        return nullptr;
    }
    return result;
}

// One number over all tasks (username null) or over the user's: `field` of the
// statement made of `all` or of `per_user` with the escaped name; -1 on failure.
int user_total(const char *username, const char *all, const char *per_user,
               const char *field) noexcept try {
    DBConn_tag *conn = DownloadDBConnect();
    if (conn == nullptr) {
        TV_LOG("%s (%d) Failed to connect to database");
        return -1;
    }
    std::string sql = username == nullptr
                          ? std::string(all)
                          : torvale::db::format(per_user, torvale::db::escape(username).c_str());
    unsigned row = 0;
    torvale::db::Result result = total_row(conn, sql, username != nullptr, row);
    if (result == nullptr)
        return -1;
    DownloadDBClose(conn);
    return static_cast<int>(torvale::db::field_int(result.get(), row, field));
} catch (const std::bad_alloc &) {
    TV_LOG("%s (%d) Failed to malloc");
    return -1;
}

int total_rate(const char *username, int &download_rate, int &upload_rate) noexcept try {
    DBConn_tag *conn = DownloadDBConnect();
    if (conn == nullptr) {
        TV_LOG("%s (%d) Failed to connect to database");
        return -1;
    }
    int admin = NAVOGroupIsAdminGroupMem(username);
    if (admin == -1) {
        TV_LOG("%s:%d Failed to check admin group, user [%s]. [0x%04X]", username, NLIBCErrGet());
        return -1;
    }
    std::string sql = admin == 1 ? torvale::db::format(kRateAll, TASK_STATUS_DOWNLOADING,
                                                       TASK_STATUS_SEEDING, TASK_STATUS_SEED_AUX)
                                 : torvale::db::format(kRateUser, TASK_STATUS_DOWNLOADING,
                                                       TASK_STATUS_SEEDING, TASK_STATUS_SEED_AUX,
                                                       torvale::db::escape(username).c_str());
    unsigned row = 0;
    torvale::db::Result result = total_row(conn, sql, true, row);
    if (result == nullptr)
        return -1;
    download_rate = static_cast<int>(torvale::db::field_int(result.get(), row, "sumdl"));
    upload_rate = static_cast<int>(torvale::db::field_int(result.get(), row, "sumul"));
    DownloadDBClose(conn);
    return 0;
} catch (const std::bad_alloc &) {
    TV_LOG("%s (%d) Failed to malloc");
    return -1;
}

} // namespace

extern "C" {

TORVALE_API int DownloadTaskFilenameGet(int task_id, char *buf, size_t size) noexcept {
    Handle handle;
    const DownloadTaskInfo *task = task_record(task_id, handle);
    if (task == nullptr)
        return -1;
    torvale::db::copy_text(buf, size, task->filename);
    return 0;
}

TORVALE_API int DownloadTaskPidGet(int task_id) noexcept {
    Handle handle;
    const DownloadTaskInfo *task = task_record(task_id, handle);
    return task != nullptr ? task->pid : -2;
}

TORVALE_API int DownloadTaskStatusGet(int task_id) noexcept {
    Handle handle;
    const DownloadTaskInfo *task = task_record(task_id, handle);
    return task != nullptr ? task->status : -1;
}

TORVALE_API int DownloadTaskCount(const char *username) noexcept {
    return user_total(username, kCountAll, kCountUser, "count");
}

TORVALE_API int DownloadLastTaskIDGet(const char *username) noexcept {
    return user_total(username, kLastIdAll, kLastIdUser, "max");
}

TORVALE_API int DownloadTotalRateGet(const char *username, int *download_rate,
                                     int *upload_rate) noexcept {
    if (username == nullptr || download_rate == nullptr || upload_rate == nullptr) {
        TV_LOG("%s (%d) Bad parameter.");
        return -1;
    }
    return total_rate(username, *download_rate, *upload_rate);
}

} // extern "C"
