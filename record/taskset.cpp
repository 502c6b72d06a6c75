// Task field writes: one UPDATE of one row each, never a read first.
#include <cstdio>
#include <cstring>
#include <new>
#include <string>
#include <sys/ipc.h>
#include <sys/shm.h>

#include "db/access.h"
#include "platform/log.h"
#include "torvale/task.h"

namespace {

constexpr char kLogUnit[] = "taskset";

constexpr char kFieldsUpdate[] = "UPDATE download_queue SET %s WHERE task_id=%d";
constexpr char kPidStatusClause[] = "pid=%d, status=%d";
constexpr char kProgressUpdate[] =
    "UPDATE download_queue SET current_size=%lld, current_rate=%d, total_peers=%d, "
    "connected_peers=%d, total_pieces=%d, downloaded_pieces=%d, available_pieces=%d "
    "WHERE task_id=%d";
constexpr char kProgress2Update[] =
    "UPDATE download_queue SET current_size=%lld, current_rate=%d, total_peers=%d, "
    "connected_peers=%d, total_pieces=%d, downloaded_pieces=%d, available_pieces=%d, "
    "upload_rate=%d, total_upload=%lld, seeding_elapsed=%ld,seeders=%d, leechers=%d "
    "WHERE task_id=%d";
constexpr char kFlagsSet[] = "UPDATE download_queue SET task_flags=task_flags|%d WHERE task_id=%d";
constexpr char kFlagsClear[] =
    "UPDATE download_queue SET task_flags=task_flags & ~%d WHERE task_id=%d";
// A mask with the top bit set prints with a minus sign, which the server would read
// together with the operator in front of it ("|-", "~-") as one unknown operator.
constexpr char kFlagsSetNegative[] =
    "UPDATE download_queue SET task_flags=task_flags|(%d) WHERE task_id=%d";
constexpr char kFlagsClearNegative[] =
    "UPDATE download_queue SET task_flags=task_flags & ~(%d) WHERE task_id=%d";
constexpr char kMultiStatusHead[] = "UPDATE download_queue SET status=%d WHERE task_id in (";

// The progress segment as the progress writes see it; kept apart from the attachment
// of DownloadTriggerProgress so that each side attaches on its own first use.
volatile int *g_progress = nullptr;

using Exec = int (*)(const char *sql) noexcept;

// The common writer: "SET <clause>" on one task, through `exec`.
int fields_set(int task_id, const char *clause, Exec exec) noexcept {
    if (task_id < 0 || clause == nullptr) {
        TV_LOG("%s:%d Bad parameters");
        return -1;
    }
    std::string sql;
    try {
        sql = torvale::db::format(kFieldsUpdate, clause, task_id);
    } catch (const std::bad_alloc &) {
        TV_LOG("%s:%d Failed to malloc(). size [%d]", static_cast<int>(std::strlen(clause) + 128));
        return -1;
    }
    int rc = exec(sql.c_str());
    if (rc == -1)
        TV_LOG("%s:%d Failed to exec [%s]", sql.c_str());
    return rc;
}

int DownloadTaskFieldsSet(int task_id, const char *clause) noexcept {
    return fields_set(task_id, clause, DownloadDBExec);
}

// Short clauses of numbers only: formatted in place, no allocation to fail.
template <typename... Args>
int numbers_set(int task_id, const char *clause_fmt, Args... args) noexcept {
    char clause[64];
    std::snprintf(clause, sizeof clause, clause_fmt, args...);
    return DownloadTaskFieldsSet(task_id, clause);
}

// "column='text'" for the two text columns, whose callers have checked the arguments.
int text_set(int task_id, const char *text, const char *clause_fmt) noexcept {
    size_t len = std::strlen(text);
    std::string escaped;
    try {
        escaped = torvale::db::escape(text);
    } catch (const std::bad_alloc &) {
        TV_LOG("%s:%d Failed to calloc(). size [%d]", static_cast<int>(2 * len + 1));
        return -1;
    }
    std::string clause;
    try {
        clause = torvale::db::format(clause_fmt, escaped.c_str());
    } catch (const std::bad_alloc &) {
        TV_LOG("%s:%d Failed to malloc(). size [%d]", static_cast<int>(escaped.size() + 64));
        return -1;
    }
    return DownloadTaskFieldsSet(task_id, clause.c_str());
}

// The statements of their own: "%s (%d) ..." messages, run on the persistent connection.
int run_logged(const char *sql) noexcept {
    int rc = DownloadDBExec(sql);
    if (rc == -1)
        TV_LOG("%s (%d) Failed to exec [%s].", sql);
    return rc;
}

// A bounded statement of its own on one task.
template <typename... Args>
int task_statement(int task_id, const char *sql_fmt, Args... args) noexcept {
    if (task_id < 0) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    char sql[128];
    std::snprintf(sql, sizeof sql, sql_fmt, args...);
    return run_logged(sql);
}

// 1 when somebody has asked for progress. After the first successful attach this is
// one load from shared memory: no system call, no database.
int DownloadProgressRequested() noexcept {
    if (g_progress == nullptr) {
        int id = shmget(DOWNLOAD_SHM_PROGRESS_KEY, DOWNLOAD_SHM_PROGRESS_SIZE, 0666);
        void *addr = id != -1 ? shmat(id, nullptr, 0) : reinterpret_cast<void *>(-1);
        if (addr != reinterpret_cast<void *>(-1))
            g_progress = static_cast<volatile int *>(addr);
    }
    if (g_progress == nullptr) {
        TV_LOG("%s:%d Failed to attach shared memory.");
        return 0;
    }
    return g_progress[0] != 0 ? 1 : 0;
}

} // namespace

extern "C" {

TORVALE_API int DownloadTaskPidStatusSet(int task_id, int pid, int status) noexcept {
    return numbers_set(task_id, kPidStatusClause, pid, status);
}

TORVALE_API int DownloadTaskPidSet(int task_id, int pid) noexcept {
    return numbers_set(task_id, "pid=%d", pid);
}

TORVALE_API int DownloadTaskStatusSet(int task_id, int status) noexcept {
    return numbers_set(task_id, "status=%d", status);
}

TORVALE_API int DownloadTaskSeedElapsedSet(int task_id, int seconds) noexcept {
    return numbers_set(task_id, "seeding_elapsed=%d", seconds);
}

TORVALE_API int DownloadTaskStartedTimeSet(int task_id, long started_time) noexcept {
    if (task_id < 0 || started_time <= 0) {
        TV_LOG("%s:%d Bad parameters");
        return -1;
    }
    return numbers_set(task_id, "started_time=%ld", started_time);
}

TORVALE_API int DownloadTaskFilenameSet(int task_id, const char *filename) noexcept {
    if (task_id < 0 || filename == nullptr) {
        TV_LOG("%s:%d Bad parameters");
        return -1;
    }
    return text_set(task_id, filename, "filename='%s'");
}

TORVALE_API int DownloadTaskDestinationSet(int task_id, const char *destination) noexcept {
    if (task_id < 0 || destination == nullptr) {
        TV_LOG("%s:%d Bad parameter");
        return -1;
    }
    return text_set(task_id, destination, "destination='%s'");
}

TORVALE_API int DownloadTaskPidStatusSetNonPersistent(int task_id, int pid, int status) noexcept {
    char clause[64];
    std::snprintf(clause, sizeof clause, kPidStatusClause, pid, status);
    return fields_set(task_id, clause, DownloadDBExecNonPersistent);
}

TORVALE_API int DownloadTaskTotalSizeSet(int task_id, long long total_size) noexcept {
    return task_statement(task_id, "UPDATE download_queue SET total_size=%lld WHERE task_id=%d",
                          total_size, task_id);
}

TORVALE_API int DownloadTaskFlagsSet(int task_id, int flags) noexcept {
    return task_statement(task_id, flags < 0 ? kFlagsSetNegative : kFlagsSet, flags, task_id);
}

TORVALE_API int DownloadTaskFlagsClear(int task_id, int flags) noexcept {
    return task_statement(task_id, flags < 0 ? kFlagsClearNegative : kFlagsClear, flags, task_id);
}

TORVALE_API int DownloadTaskClearDURate(int task_id) noexcept {
    // Unchecked on purpose: a negative id matches no row and yields 0.
    char sql[128];
    std::snprintf(sql, sizeof sql,
                  "UPDATE download_queue SET current_rate=0, upload_rate=0 WHERE task_id=%d",
                  task_id);
    return run_logged(sql);
}

TORVALE_API int DownloadTaskExtraInfoSet(int task_id, const char *extra_info) noexcept {
    if (task_id < 0 || extra_info == nullptr) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    size_t len = std::strlen(extra_info);
    std::string escaped;
    try {
        escaped = torvale::db::escape(extra_info);
    } catch (const std::bad_alloc &) {
        TV_LOG("%s (%d) Failed to calloc(). Size: %d", static_cast<int>(2 * len + 1));
        return -1;
    }
    std::string sql;
    try {
        sql = torvale::db::format("UPDATE download_queue SET extra_info='%s' WHERE task_id=%d",
                                  escaped.c_str(), task_id);
    } catch (const std::bad_alloc &) {
        TV_LOG("%s (%d) Failed to malloc(). Size: %d", static_cast<int>(escaped.size() + 128));
        return -1;
    }
    return run_logged(sql.c_str());
}

TORVALE_API int DownloadTaskMultiStatusSet(const int *task_ids, int count, int status) noexcept {
    if (task_ids == nullptr || count <= 0) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    long long size = static_cast<long long>(count) * 24 + 88;
    std::string sql;
    try {
        sql.reserve(static_cast<size_t>(size));
        sql += torvale::db::format(kMultiStatusHead, status);
        for (int i = 0; i < count; ++i) {
            if (i > 0)
                sql += ',';
            sql += std::to_string(task_ids[i]);
        }
        sql += ')';
    } catch (const std::exception &) {
        TV_LOG("%s (%d) Failed to malloc(%d).", static_cast<int>(size));
        return -1;
    }
    return run_logged(sql.c_str());
}

TORVALE_API int DownloadTaskProgressSet(int task_id, long long current_size, int current_rate,
                                        int total_peers, int connected_peers, int total_pieces,
                                        int downloaded_pieces, int available_pieces,
                                        int force) noexcept {
    // Progress nobody asked for is dropped before anything else, even a bad id.
    if (force == 0 && DownloadProgressRequested() == 0)
        return 1;
    if (task_id < 0) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    char sql[256];
    std::snprintf(sql, sizeof sql, kProgressUpdate, current_size, current_rate, total_peers,
                  connected_peers, total_pieces, downloaded_pieces, available_pieces, task_id);
    return run_logged(sql);
}

TORVALE_API int DownloadTaskProgressSet2(int task_id, const DownloadProgressInfo *progress,
                                         int force) noexcept {
    if (force == 0 && DownloadProgressRequested() == 0)
        return 1;
    if (task_id < 0 || progress == nullptr) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    const DownloadProgressInfo &p = *progress;
    char sql[512];
    std::snprintf(sql, sizeof sql, kProgress2Update, p.current_size, p.current_rate, p.total_peers,
                  p.connected_peers, p.total_pieces, p.downloaded_pieces, p.available_pieces,
                  p.upload_rate, p.total_upload, p.seeding_elapsed, p.seeders, p.leechers, task_id);
    return run_logged(sql);
}

} // extern "C"
