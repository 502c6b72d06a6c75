// The queue listing: a cursor over `download_queue` rows handed out as task records.
#include <cstdlib>
#include <cstring>
#include <new>
#include <optional>
#include <string>
#include <strings.h>

#include "db/access.h"
#include "platform/log.h"
#include "torvale/queue.h"

namespace {

constexpr char kLogUnit[] = "queue";

constexpr char kColumns[] =
    "task_id, username, pid, url, filename, status, created_time, started_time, total_size, "
    "current_size, upload_rate, total_upload, seeding_ratio, seeding_interval, "
    "seeding_elapsed,seeders,leechers,current_rate, total_peers, connected_peers, "
    "task_flags,total_pieces, downloaded_pieces, available_pieces, length(torrent)";

constexpr char kOpenAll[] = "SELECT %s FROM download_queue ORDER BY task_id";
constexpr char kOpenWhere[] = "SELECT %s FROM download_queue WHERE %s";

// Paging with LIMIT/OFFSET needs a total order, or a task can show on two pages and
// another on none; so equal sort keys are always taken in task id order.
constexpr char kSortAll[] = "SELECT %s FROM download_queue ORDER BY %s %s %s %s %s";
constexpr char kSortWhere[] = "SELECT %s FROM download_queue WHERE %s ORDER BY %s %s %s %s %s";
constexpr char kTieBreak[] = ", task_id asc";

// The computed orders are a union of two halves that split the rows by a test and its
// negation. The caller's condition is parenthesised before the test ("a or b and
// total_size != 0" would put a task of `a` in both halves), so no row can be in both,
// and UNION ALL spares the server a duplicate check that sorts every row on all
// columns.
constexpr char kProgressAll[] =
    "SELECT %s, ((current_size::float/total_size::float)*100) as progress FROM download_queue "
    "WHERE total_size != 0 UNION ALL SELECT %s, 0 as progress FROM download_queue "
    "WHERE total_size = 0 ORDER BY progress %s, task_id asc LIMIT %d OFFSET %d";
constexpr char kProgressWhere[] =
    "SELECT %s, ((current_size::float/total_size::float)*100) as progress FROM download_queue "
    "WHERE (%s) and total_size != 0 UNION ALL SELECT %s, 0 as progress FROM download_queue "
    "WHERE (%s) and total_size = 0 ORDER BY progress %s, task_id asc LIMIT %d OFFSET %d";

constexpr char kTimeLeftAll[] =
    "SELECT %s, ((total_size::float-current_size::float)/current_rate::float) as time_left "
    "FROM download_queue WHERE status = 2 and total_size != 0 and current_rate > 512 "
    "UNION ALL SELECT %s, 9999999999 as time_left FROM download_queue "
    "WHERE (status != 2 or total_size = 0 or current_rate <= 512) "
    "ORDER BY time_left %s, status %s, task_id asc LIMIT %d OFFSET %d";
constexpr char kTimeLeftWhere[] =
    "SELECT %s, ((total_size::float-current_size::float)/current_rate::float) as time_left "
    "FROM download_queue WHERE (%s) and status = 2 and total_size != 0 and current_rate > 512 "
    "UNION ALL SELECT %s, 9999999999 as time_left FROM download_queue "
    "WHERE (%s) and (status != 2 or total_size = 0 or current_rate <= 512) "
    "ORDER BY time_left %s, status %s, task_id asc LIMIT %d OFFSET %d";

// The one task record of the process.
DownloadTaskInfo g_task;

struct HandleClose {
    void operator()(DownloadQueueHandle *h) const noexcept { DownloadQueueClose(h); }
};
using Handle = std::unique_ptr<DownloadQueueHandle, HandleClose>;

const char *direction(int ascending) noexcept {
    return ascending != 0 ? "asc" : "desc";
}

// The sort column goes into the statement as it is, so only a column name may pass:
// a bare word that the condition language reads as a column of the table.
bool sortable(const char *column) noexcept {
    constexpr char kWordChars[] = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ_";
    char rewritten[64];
    size_t length = std::strlen(column);
    return length < sizeof rewritten / 2 && std::strspn(column, kWordChars) == length &&
           EscapeCondition(column, rewritten, sizeof rewritten) == 0 &&
           strcasecmp(column, "true") != 0 && strcasecmp(column, "false") != 0 &&
           strcasecmp(column, "null") != 0;
}

// What a statement carrying these texts may need, for the allocation message.
int statement_room(const char *condition, const char *sort_column) noexcept {
    size_t room = 2 * sizeof kColumns + 512;
    if (condition != nullptr)
        room += 2 * (2 * std::strlen(condition) + 1);
    if (sort_column != nullptr)
        room += std::strlen(sort_column);
    return static_cast<int>(room);
}

Handle open_handle() noexcept {
    Handle handle(new (std::nothrow) DownloadQueueHandle{});
    if (handle == nullptr) {
        TV_LOG("%s (%d) Failed to malloc");
        return nullptr;
    }
    handle->conn = DownloadDBConnect();
    if (handle->conn == nullptr) {
        TV_LOG("%s (%d) Failed to connect to database");
        return nullptr;
    }
    return handle;
}

// The condition in its safe form, or nothing after the message.
std::optional<std::string> rewrite(const char *condition) noexcept {
    size_t size = 2 * std::strlen(condition) + 1;
    std::string out;
    try {
        out.assign(size, '\0');
    } catch (const std::bad_alloc &) {
        TV_LOG("%s (%d) Failed to malloc(%d)", static_cast<int>(size));
        return std::nullopt;
    }
    if (EscapeCondition(condition, out.data(), size) == -1) {
        TV_LOG("%s (%d) Failed to escape condition.");
        return std::nullopt;
    }
    out.resize(std::strlen(out.c_str()));
    return out;
}

DownloadQueueHandle *run(Handle handle, const std::string &sql, bool conditioned) noexcept {
    DBResult_tag *result = nullptr;
    if (NAVODBExecute(handle->conn, sql.c_str(), &result) == -1) {
        if (conditioned)
            TV_LOG("%s (%d) Failed to exec [%s] (%s)", sql.c_str(), NAVODBErrorGet(handle->conn));
        else
            TV_LOG("%s (%d) Failed to query database. (%s)", NAVODBErrorGet(handle->conn));
        NAVODBFreeResult(result);
        return nullptr;
    }
    handle->result = result;
    handle->rows = NAVODBNumRows(result);
    return handle.release();
}

// Every open call: handle, connection, condition, then the statement `build` makes of
// the rewritten condition (null without one).
template <typename Build>
DownloadQueueHandle *open(const char *condition, const char *sort_column, Build build) noexcept {
    try {
        Handle handle = open_handle();
        if (handle == nullptr)
            return nullptr;
        std::optional<std::string> where;
        if (condition != nullptr) {
            where = rewrite(condition);
            if (!where)
                return nullptr;
        }
        std::string sql = build(where ? where->c_str() : nullptr);
        return run(std::move(handle), sql, where.has_value());
    } catch (const std::bad_alloc &) {
        TV_LOG("%s (%d) Failed to malloc(%d)", statement_room(condition, sort_column));
        return nullptr;
    }
}

// The computed orders always page: a negative limit or offset is sent as 0.
template <typename Build>
DownloadQueueHandle *open_computed(const char *condition, int limit, int offset,
                                   Build build) noexcept {
    limit = limit < 0 ? 0 : limit;
    offset = offset < 0 ? 0 : offset;
    return open(condition, nullptr, [&](const char *where) { return build(where, limit, offset); });
}

int int32(const DBResult_tag *result, unsigned row, const char *column) noexcept {
    return static_cast<int>(torvale::db::field_int(result, row, column));
}

unsigned int uint32(const DBResult_tag *result, unsigned row, const char *column) noexcept {
    const char *v = NAVODBFetchField(result, row, column);
    return v != nullptr ? static_cast<unsigned int>(std::strtoul(v, nullptr, 10)) : 0;
}

void fill(const DBResult_tag *r, unsigned row, DownloadTaskInfo &t) noexcept {
    using torvale::db::field_int;
    t.task_id = int32(r, row, "task_id");
    t.username = NAVODBFetchField(r, row, "username");
    t.pid = int32(r, row, "pid");
    t.url = NAVODBFetchField(r, row, "url");
    t.filename = NAVODBFetchField(r, row, "filename");
    t.status = int32(r, row, "status");
    t.created_time = uint32(r, row, "created_time");
    t.started_time = uint32(r, row, "started_time");
    t.total_size = field_int(r, row, "total_size");
    t.current_size = field_int(r, row, "current_size");
    t.current_rate = int32(r, row, "current_rate");
    t.total_peers = int32(r, row, "total_peers");
    t.connected_peers = int32(r, row, "connected_peers");
    t.total_pieces = int32(r, row, "total_pieces");
    t.downloaded_pieces = int32(r, row, "downloaded_pieces");
    t.available_pieces = int32(r, row, "available_pieces");
    t.upload_rate = int32(r, row, "upload_rate");
    t.total_upload = field_int(r, row, "total_upload");
    t.seeding_ratio = int32(r, row, "seeding_ratio");
    t.seeding_interval = int32(r, row, "seeding_interval");
    t.seeding_elapsed = int32(r, row, "seeding_elapsed");
    t.seeders = int32(r, row, "seeders");
    t.leechers = int32(r, row, "leechers");
    t.task_flags = int32(r, row, "task_flags");
    const char *length = NAVODBFetchField(r, row, "length");
    t.has_torrent = length != nullptr && std::strtol(length, nullptr, 10) != 0 ? 1 : 0;
}

} // namespace

extern "C" {

TORVALE_API DownloadQueueHandle *DownloadQueueOpen(const char *condition) noexcept {
    return open(condition, nullptr, [](const char *where) {
        return where != nullptr ? torvale::db::format(kOpenWhere, kColumns, where)
                                : torvale::db::format(kOpenAll, kColumns);
    });
}

TORVALE_API DownloadQueueHandle *DownloadQueueOpenCondition(const char *condition, int limit,
                                                            int offset, const char *sort_column,
                                                            int ascending) noexcept {
    if (sort_column == nullptr || sort_column[0] == '\0')
        sort_column = "task_id";
    if (!sortable(sort_column)) {
        TV_LOG("%s (%d) Bad sort column [%s].", sort_column);
        return nullptr;
    }
    return open(condition, sort_column, [&](const char *where) {
        using torvale::db::format;
        std::string limit_clause = limit < 0 ? "" : format("LIMIT %d", limit);
        std::string offset_clause = offset < 0 ? "" : format("OFFSET %d", offset);
        const char *tie = std::strcmp(sort_column, "task_id") == 0 ? "" : kTieBreak;
        const char *dir = direction(ascending);
        return where != nullptr ? format(kSortWhere, kColumns, where, sort_column, dir, tie,
                                         limit_clause.c_str(), offset_clause.c_str())
                                : format(kSortAll, kColumns, sort_column, dir, tie,
                                         limit_clause.c_str(), offset_clause.c_str());
    });
}

TORVALE_API DownloadQueueHandle *DownloadQueueOpenProgress(const char *condition, int limit,
                                                           int offset, int ascending) noexcept {
    const char *dir = direction(ascending);
    return open_computed(condition, limit, offset, [&](const char *where, int lim, int off) {
        return where != nullptr
                   ? torvale::db::format(kProgressWhere, kColumns, where, kColumns, where, dir, lim,
                                         off)
                   : torvale::db::format(kProgressAll, kColumns, kColumns, dir, lim, off);
    });
}

TORVALE_API DownloadQueueHandle *DownloadQueueOpenTimeLeft(const char *condition, int limit,
                                                           int offset, int ascending) noexcept {
    const char *dir = direction(ascending);
    return open_computed(condition, limit, offset, [&](const char *where, int lim, int off) {
        return where != nullptr
                   ? torvale::db::format(kTimeLeftWhere, kColumns, where, kColumns, where, dir, dir,
                                         lim, off)
                   : torvale::db::format(kTimeLeftAll, kColumns, kColumns, dir, dir, lim, off);
    });
}

TORVALE_API DownloadTaskInfo *DownloadQueueGet(DownloadQueueHandle *handle) noexcept {
    g_task = DownloadTaskInfo{};
    if (handle == nullptr) {
        TV_LOG("%s (%d) Bad parameter.");
        return nullptr;
    }
    if (NAVODBFetchRow(handle->result, &handle->row) == -1)
        return nullptr;
    fill(handle->result, handle->row, g_task);
    return &g_task;
}

TORVALE_API void DownloadQueueClose(DownloadQueueHandle *handle) noexcept {
    if (handle == nullptr)
        return;
    NAVODBFreeResult(handle->result);
    DownloadDBClose(handle->conn);
    delete handle;
}

} // extern "C"
