// Next-task selection for the daemon, and the counts of tasks really running.
#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>
#include <optional>
#include <string>
#include <strings.h>
#include <vector>

// libpq's growable text buffer. The header is C without linkage guards and expects the
// attribute macro of the server's own headers.
#ifndef pg_attribute_printf
#define pg_attribute_printf(f, a) __attribute__((format(printf, f, a)))
#endif
extern "C" {
#include <internal/pqexpbuffer.h>
}

#include "db/access.h"
#include "platform/log.h"
#include "torvale/task.h"

extern "C" {
TORVALE_API char *gszLastUser = nullptr;
}

namespace {

constexpr char kLogUnit[] = "taskmgt";

constexpr char kFtpDownloading[] =
    "SELECT url FROM download_queue WHERE url ILIKE 'ftp://%%' AND status=%d";
constexpr char kOldest[] = "SELECT task_id, user_setting.user_disabled FROM download_queue, "
                           "user_setting WHERE "
                           "lower(user_setting.username)=lower(download_queue.username) and "
                           "user_disabled!='t' and status=%d and pid=-1 %s ORDER BY task_id";
// The rotation walks users in the order of their lower-case names, the order its cursor
// is compared in. Ordering by the names as stored would, under a case-sensitive
// collation, jump over a user ("Zed" sorts before "bob") on every round and starve it.
constexpr char kAfterCursor[] =
    "SELECT task_id, download_queue.username, user_setting.user_disabled FROM download_queue, "
    "user_setting WHERE lower(user_setting.username)=lower(download_queue.username) and "
    "user_disabled!='t' and lower(download_queue.username) > lower('%s') and status=%d and "
    "pid=-1 %s ORDER BY lower(download_queue.username), task_id";
constexpr char kBeforeCursor[] =
    "SELECT task_id, download_queue.username, user_setting.user_disabled FROM download_queue, "
    "user_setting WHERE lower(user_setting.username)=lower(download_queue.username) and "
    "user_disabled!='t' and lower(download_queue.username) < lower('%s') and status=%d and "
    "pid=-1 %s ORDER BY lower(download_queue.username),task_id";
constexpr char kAnyUser[] =
    "SELECT task_id, download_queue.username, user_setting.user_disabled FROM download_queue, "
    "user_setting WHERE lower(user_setting.username)=lower(download_queue.username) and "
    "user_disabled!='t' and status=%d and pid=-1 %s ORDER BY task_id";

constexpr char kCountByStatus[] = "SELECT task_id, pid FROM download_queue WHERE %s";
constexpr char kTwoStatuses[] = "status=%d or status=%d";

constexpr char kFtpScheme[] = "ftp://";
constexpr size_t kFtpSchemeLen = sizeof kFtpScheme - 1;

class ExpBuffer {
  public:
    ExpBuffer() { initPQExpBuffer(&buf_); }
    ~ExpBuffer() { termPQExpBuffer(&buf_); }
    ExpBuffer(const ExpBuffer &) = delete;
    ExpBuffer &operator=(const ExpBuffer &) = delete;

    PQExpBuffer get() { return &buf_; }
    const char *data() const { return buf_.data; }
    // True when a growth failed; the text is then unusable.
    bool broken() const { return PQExpBufferDataBroken(buf_); }

  private:
    PQExpBufferData buf_;
};

struct FtpHostCount {
    std::string key;
    int count;
};

// The server part of an ftp:// link: scheme, account and host with port, up to the
// first '/' behind them. A link without a host ("ftp:///x") names no server: its key
// would be the bare scheme and hold back every ftp:// link.
std::optional<std::string> ftp_server_key(const char *url) {
    if (strncasecmp(url, kFtpScheme, kFtpSchemeLen) != 0 || url[kFtpSchemeLen] == '\0' ||
        url[kFtpSchemeLen] == '/')
        return std::nullopt;
    const char *slash = std::strchr(url + kFtpSchemeLen, '/');
    if (slash == nullptr)
        return std::nullopt;
    return std::string(url, static_cast<size_t>(slash - url));
}

// The key as the literal start of an ILIKE pattern: an account part may well hold '_'
// or '%', which would otherwise match other servers' links too.
std::string like_literal(const std::string &key) {
    std::string out;
    out.reserve(key.size() + 8);
    for (char c : key) {
        if (c == '\\' || c == '%' || c == '_')
            out += '\\';
        out += c;
    }
    return out;
}

std::vector<FtpHostCount> count_ftp_hosts(DBResult_tag *result) {
    std::vector<FtpHostCount> hosts;
    unsigned row = 0;
    while (NAVODBFetchRow(result, &row) != -1) {
        std::optional<std::string> key =
            ftp_server_key(torvale::db::field_text(result, row, "url"));
        if (!key)
            continue;
        auto same = [&key](const FtpHostCount &h) {
            return strcasecmp(h.key.c_str(), key->c_str()) == 0;
        };
        auto it = std::find_if(hosts.begin(), hosts.end(), same);
        if (it != hosts.end())
            ++it->count;
        else
            hosts.push_back({std::move(*key), 1});
    }
    return hosts;
}

// Appends to `clause` the exclusion of waiting links to servers that already carry
// `limit` or more downloading ftp:// tasks; appends nothing when none does. A failure
// to count only costs the limit, never the call.
void ftp_exclusion(DBConn_tag *conn, int limit, ExpBuffer &clause) {
    ExpBuffer sql;
    printfPQExpBuffer(sql.get(), kFtpDownloading, TASK_STATUS_DOWNLOADING);
    torvale::db::Result result;
    if (sql.broken() || torvale::db::execute(conn, sql.data(), result) == -1) {
        TV_LOG("%s (%d) Failed to exec [%s] (%s)", sql.data(), NAVODBErrorGet(conn));
        return;
    }
    std::vector<FtpHostCount> hosts = count_ftp_hosts(result.get());
    result.reset();
    bool any = false;
    for (const FtpHostCount &host : hosts) {
        if (host.count < limit)
            continue;
        torvale::db::Text escaped(NAVODBEscapeStrAlloc(like_literal(host.key).c_str()));
        if (escaped == nullptr)
            continue;
        if (!any)
            appendPQExpBufferStr(clause.get(), "AND ( ");
        appendPQExpBuffer(clause.get(), " url NOT ILIKE '%s%%' AND ", escaped.get());
        any = true;
    }
    if (any)
        appendPQExpBufferStr(clause.get(), " TRUE )");
}

// Runs one candidate query for a single row. Returns 0 (result set, possibly empty)
// or -1 after logging.
int select_one(DBConn_tag *conn, ExpBuffer &sql, torvale::db::Result &result) {
    if (sql.broken()) {
        TV_LOG("%s (%d) Failed to malloc");
        return -1;
    }
    if (torvale::db::select_limit(conn, sql.data(), 1, 0, result) == -1) {
        TV_LOG("%s (%d) Failed to exec [%s] (%s)", sql.data(), NAVODBErrorGet(conn));
        return -1;
    }
    return 0;
}

int next_oldest(DBConn_tag *conn, const char *clause) {
    ExpBuffer sql;
    printfPQExpBuffer(sql.get(), kOldest, TASK_STATUS_WAITING, clause);
    torvale::db::Result result;
    if (select_one(conn, sql, result) == -1)
        return -1;
    unsigned row = 0;
    if (NAVODBFetchRow(result.get(), &row) == -1)
        return 0;
    return static_cast<int>(torvale::db::field_int(result.get(), row, "task_id"));
}

// Queries A, B and C in turn, stopping at the first that finds a row: the next user
// after the cursor, wrapping round to the users before it, then the cursor's own user.
int find_rotating(DBConn_tag *conn, const char *cursor, const char *clause,
                  torvale::db::Result &result) {
    for (int step = 0; step < 3; ++step) {
        ExpBuffer sql;
        if (step < 2)
            printfPQExpBuffer(sql.get(), step == 0 ? kAfterCursor : kBeforeCursor, cursor,
                              TASK_STATUS_WAITING, clause);
        else
            printfPQExpBuffer(sql.get(), kAnyUser, TASK_STATUS_WAITING, clause);
        if (select_one(conn, sql, result) == -1)
            return -1;
        if (NAVODBNumRows(result.get()) > 0)
            return 0;
    }
    return 0;
}

int next_rotating(DBConn_tag *conn, const char *clause) {
    torvale::db::Text cursor(gszLastUser != nullptr ? NAVODBEscapeStrAlloc(gszLastUser)
                                                    : static_cast<char *>(std::calloc(1, 1)));
    if (cursor == nullptr) {
        if (gszLastUser != nullptr)
            TV_LOG("%s (%d) Failed to escape %s", gszLastUser);
        else
            TV_LOG("%s (%d) Failed to malloc");
        return -1;
    }
    torvale::db::Result result;
    if (find_rotating(conn, cursor.get(), clause, result) == -1)
        return -1;
    unsigned row = 0;
    if (NAVODBFetchRow(result.get(), &row) == -1) {
        std::free(gszLastUser);
        gszLastUser = nullptr;
        return 0;
    }
    // Without a copy the cursor restarts at the first user: a fair restart, not a fault.
    char *user = strdup(torvale::db::field_text(result.get(), row, "username"));
    std::free(gszLastUser);
    gszLastUser = user;
    return static_cast<int>(torvale::db::field_int(result.get(), row, "task_id"));
}

int get_next(int order, int ftp_host_limit) {
    DBConn_tag *conn = DownloadDBConnect();
    if (conn == nullptr) {
        TV_LOG("%s (%d) Failed to connect to database");
        return -1;
    }
    ExpBuffer clause;
    if (ftp_host_limit > 0)
        ftp_exclusion(conn, ftp_host_limit, clause);
    if (clause.broken()) {
        TV_LOG("%s (%d) Failed to malloc");
        return -1;
    }
    int rc = order == 1 ? next_rotating(conn, clause.data()) : next_oldest(conn, clause.data());
    DownloadDBClose(conn);
    return rc;
}

// Whether the process answers the null signal. A process of another account refuses
// the signal but is there all the same: taking it for gone would fail a running task
// whenever a caller without the daemon's rights counts.
bool process_alive(int pid) noexcept {
    return kill(pid, 0) == 0 || errno == EPERM;
}

// A task whose worker has gone is fine when it finished meanwhile, or when another live
// process took it over and stored its own pid (wget handing a torrent to rtorrent);
// otherwise it is marked failed.
void check_gone_worker(int task_id, int pid) {
    TV_LOG("%s (%d) The process [%d] of downloading task(%d) is gone. The status now is:%d", pid,
           task_id, DownloadTaskStatusGet(task_id));
    if (DownloadTaskStatusGet(task_id) == TASK_STATUS_FINISHED) {
        TV_LOG("%s (%d) The status is changed to finished. So it's normal.");
        return;
    }
    int now = DownloadTaskPidGet(task_id);
    if (now > 0 && process_alive(now)) {
        TV_LOG("%s (%d) The pid is changed. It's wget->rtorrent. So that's normal.");
        return;
    }
    TV_LOG("%s (%d) What happened?");
    DownloadTaskStatusSet(task_id, TASK_STATUS_ERROR);
}

int count_running(const char *condition) {
    // The condition goes through the condition language, and the statement is built
    // whole: a cut condition can mean something else entirely.
    std::string safe(2 * std::strlen(condition) + 1, '\0');
    if (EscapeCondition(condition, safe.data(), safe.size()) == -1) {
        TV_LOG("%s (%d) Failed to escape condition.");
        return -1;
    }
    DBConn_tag *conn = DownloadDBConnect();
    if (conn == nullptr) {
        TV_LOG("%s (%d) Failed to connect to database");
        return -1;
    }
    std::string sql = torvale::db::format(kCountByStatus, safe.c_str());
    torvale::db::Result result;
    if (torvale::db::execute(conn, sql.c_str(), result) == -1) {
        TV_LOG("%s (%d) Failed to exec [%s] (%s)", sql.c_str(), NAVODBErrorGet(conn));
        return -1;
    }
    int count = 0;
    unsigned row = 0;
    while (NAVODBFetchRow(result.get(), &row) != -1) {
        int task_id = static_cast<int>(torvale::db::field_int(result.get(), row, "task_id"));
        int pid = static_cast<int>(torvale::db::field_int(result.get(), row, "pid"));
        if (pid <= 0) {
            TV_LOG("%s (%d) The status task [%d] is downloading but pid is %d", task_id, pid);
            DownloadTaskStatusSet(task_id, TASK_STATUS_ERROR);
        } else if (process_alive(pid)) {
            ++count;
        } else {
            check_gone_worker(task_id, pid);
        }
    }
    DownloadDBClose(conn);
    return count;
}

int count_two_statuses(int first, int second) noexcept {
    char condition[128];
    std::snprintf(condition, sizeof condition, kTwoStatuses, first, second);
    return DownloadTaskCountByStatus(condition);
}

} // namespace

extern "C" {

TORVALE_API int DownloadTaskCountByStatus(const char *condition) noexcept {
    if (condition == nullptr) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    try {
        return count_running(condition);
    } catch (const std::bad_alloc &) {
        TV_LOG("%s (%d) Failed to malloc");
        return -1;
    }
}

TORVALE_API int DownloadTaskDownloadingCount(void) noexcept {
    return count_two_statuses(TASK_STATUS_DOWNLOADING, TASK_STATUS_DOWNLOAD_AUX);
}

TORVALE_API int DownloadTaskSeedingCount(void) noexcept {
    return count_two_statuses(TASK_STATUS_SEEDING, TASK_STATUS_SEED_AUX);
}

TORVALE_API int DownloadTaskGetNext(int order, int ftp_host_limit) noexcept {
    try {
        return get_next(order, ftp_host_limit);
    } catch (const std::bad_alloc &) {
        TV_LOG("%s (%d) Failed to malloc");
        return -1;
    }
}

} // extern "C"
