// Single-field reads of one task: the common column reader and the reads with
// statements of their own.
#include <cstdlib>
#include <cstring>
#include <new>
#include <string>

#include "db/access.h"
#include "platform/log.h"
#include "record/taskset_read.h"
#include "torvale/task.h"

namespace {

constexpr char kLogUnit[] = "taskset";

constexpr char kFieldSelect[] = "SELECT %s FROM download_queue where task_id=%d";
constexpr char kFlagsSelect[] = "SELECT task_flags FROM download_queue where task_id=%d";
constexpr char kSettingSelect[] =
    "SELECT seeding_ratio, seeding_interval FROM download_queue where task_id=%d";
// Bytes, not characters: callers size their buffer from it for the second call.
constexpr char kExtraInfoLength[] =
    "SELECT octet_length(extra_info) FROM download_queue where task_id=%d";
constexpr char kExtraInfoSelect[] = "SELECT extra_info FROM download_queue where task_id=%d";

constexpr int kNumberBuffer = 32;

int field_get(int task_id, const char *column, char *buf, int size) {
    if (task_id < 0 || column == nullptr || buf == nullptr || size <= 0) {
        TV_LOG("%s:%d Bad parameter");
        return -1;
    }
    DBConn_tag *conn = DownloadDBConnect();
    if (conn == nullptr) {
        TV_LOG("%s:%d Failed to connect to database");
        return -1;
    }
    std::string sql = torvale::db::format(kFieldSelect, column, task_id);
    torvale::db::Result result;
    if (torvale::db::execute(conn, sql.c_str(), result) == -1) {
        TV_LOG("%s:%d Failed to exec [%s] (%s)", sql.c_str(), NAVODBErrorGet(conn));
        return -1;
    }
    unsigned row = 0;
    if (NAVODBNumRows(result.get()) <= 0) {
        TV_LOG("%s:%d No such task id [%d] in database", task_id);
        return -1;
    }
    if (NAVODBFetchRow(result.get(), &row) == -1) {
        TV_LOG("%s:%d Failed to fetch row");
        return -1;
    }
    torvale::db::copy_text(buf, static_cast<size_t>(size),
                           NAVODBFetchField(result.get(), row, column));
    DownloadDBClose(conn);
    return 0;
}

// A field read for a caller: 0, or -1 after one more message naming the field.
int read_field(int task_id, const char *column, char *buf, int size) noexcept {
    if (DownloadTaskFieldGet(task_id, column, buf, size) == -1) {
        TV_LOG("%s:%d Failed to get [%s] value of task [%d]", column, task_id);
        return -1;
    }
    return 0;
}

// The one row of the task that `tmpl` (with the task id) selects, with its row in
// `row`; an empty result after the message.
torvale::db::Result task_row(int task_id, const char *tmpl, unsigned &row) {
    DBConn_tag *conn = DownloadDBConnect();
    if (conn == nullptr) {
        TV_LOG("%s (%d) Failed to connect to database");
        return nullptr;
    }
    std::string sql = torvale::db::format(tmpl, task_id);
    torvale::db::Result result;
    if (torvale::db::execute(conn, sql.c_str(), result) == -1) {
        TV_LOG("%s (%d) Failed to exec [%s] (%s)", sql.c_str(), NAVODBErrorGet(conn));
        return nullptr;
    }
    if (NAVODBNumRows(result.get()) <= 0) {
        TV_LOG("%s (%d) There is no such task id %d in the database...why~~~", task_id);
        return nullptr;
    }
    if (NAVODBFetchRow(result.get(), &row) == -1) {
        TV_LOG("%s (%d) Failed to fetch row...why~~~");
        return nullptr;
    }
    DownloadDBClose(conn);
    return result;
}

int flags_get(int task_id) {
    unsigned row = 0;
    torvale::db::Result result = task_row(task_id, kFlagsSelect, row);
    if (result == nullptr)
        return -1;
    return static_cast<int>(torvale::db::field_int(result.get(), row, "task_flags"));
}

int setting_get(int task_id, DownloadTaskSetting &setting) {
    unsigned row = 0;
    torvale::db::Result result = task_row(task_id, kSettingSelect, row);
    if (result == nullptr)
        return -1;
    using torvale::db::field_int;
    setting.seeding_ratio = static_cast<int>(field_int(result.get(), row, "seeding_ratio"));
    setting.seeding_interval = static_cast<int>(field_int(result.get(), row, "seeding_interval"));
    return 0;
}

int extra_info_get(int task_id, char *buf, int size) {
    unsigned row = 0;
    torvale::db::Result result =
        task_row(task_id, buf == nullptr ? kExtraInfoLength : kExtraInfoSelect, row);
    if (result == nullptr)
        return 0;
    if (buf == nullptr)
        return static_cast<int>(torvale::db::field_int(result.get(), row, "octet_length"));
    const char *text = torvale::db::field_text(result.get(), row, "extra_info");
    torvale::db::copy_text(buf, static_cast<size_t>(size), text);
    return static_cast<int>(std::strlen(text));
}

} // namespace

int DownloadTaskFieldGet(int task_id, const char *column, char *buf, int size) noexcept {
    try {
        return field_get(task_id, column, buf, size);
    } catch (const std::bad_alloc &) {
        TV_LOG("%s:%d Failed to malloc");
        return -1;
    }
}

extern "C" {

TORVALE_API int DownloadTaskSeedElapsedGet(int task_id) noexcept {
    char buf[kNumberBuffer] = {};
    if (read_field(task_id, "seeding_elapsed", buf, sizeof buf) == -1)
        return 0;
    return static_cast<int>(std::strtoll(buf, nullptr, 10));
}

TORVALE_API unsigned long long DownloadTaskTotalUploadGet(int task_id) noexcept {
    char buf[kNumberBuffer] = {};
    if (read_field(task_id, "total_upload", buf, sizeof buf) == -1)
        return 0;
    return std::strtoull(buf, nullptr, 10);
}

TORVALE_API int DownloadTaskUserGet(int task_id, char *buf, int size) noexcept {
    return read_field(task_id, "username", buf, size);
}

TORVALE_API int DownloadTaskDestinationGet(int task_id, char *buf, int size) noexcept {
    return read_field(task_id, "destination", buf, size);
}

TORVALE_API int DownloadTaskFlagsGet(int task_id) noexcept {
    if (task_id < 0) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    try {
        return flags_get(task_id);
    } catch (const std::bad_alloc &) {
        TV_LOG("%s (%d) Failed to malloc");
        return -1;
    }
}

TORVALE_API int DownloadTaskSettingGet(int task_id, DownloadTaskSetting *setting) noexcept {
    if (task_id < 0 || setting == nullptr) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    try {
        return setting_get(task_id, *setting);
    } catch (const std::bad_alloc &) {
        TV_LOG("%s (%d) Failed to malloc");
        return -1;
    }
}

TORVALE_API int DownloadTaskExtraInfoGet(int task_id, char *buf, int size) noexcept {
    if (task_id < 0 || (buf != nullptr && size <= 0)) {
        TV_LOG("%s (%d) Bad parameters.");
        return 0;
    }
    try {
        return extra_info_get(task_id, buf, size);
    } catch (const std::bad_alloc &) {
        TV_LOG("%s (%d) Failed to malloc");
        return 0;
    }
}

} // extern "C"
