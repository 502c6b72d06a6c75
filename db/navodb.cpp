#include "db/navodb.h"

#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <libpq-fe.h>
#include <new>
#include <poll.h>
#include <pthread.h>
#include <string>
#include <utility>
#include <vector>

struct DBConn_tag {
    PGconn *pg = nullptr;
    std::string last_error;
};

struct DBResult_tag {
    PGresult *pg = nullptr;
    int rows = 0;
    int next = 0; // the row NAVODBFetchRow hands out next
    // Column numbers of the names asked for so far, in the order first asked. Readers
    // ask for the same names in the same order on every row, so `hint` (the entry after
    // the last one found) nearly always answers at once.
    mutable std::vector<std::pair<const char *, int>> columns;
    mutable size_t hint = 0;
};

namespace {

DBConn_tag *g_persistent = nullptr;
bool g_atfork_registered = false;

// A forked child must not talk over its parent's socket, and must not close it
// either: closing would send the server a terminate message on the parent's
// session. The child forgets the connection (its copy of the descriptor stays open
// until it exits) and opens its own on next use.
void forget_persistent_in_child() {
    g_persistent = nullptr;
}

void quiet_notices(void *, const char *) {}

void set_error(DBConn_tag *conn, const char *text) {
    conn->last_error = text != nullptr ? text : "";
    while (!conn->last_error.empty() &&
           (conn->last_error.back() == '\n' || conn->last_error.back() == ' '))
        conn->last_error.pop_back();
}

DBConn_tag *open_connection(const char *host, const char *user, const char *password,
                            const char *dbname) {
    const char *keys[] = {"host",
                          "user",
                          "password",
                          "dbname",
                          "connect_timeout",
                          "client_encoding",
                          "options",
                          "fallback_application_name",
                          nullptr};
    const char *values[] = {host,
                            user,
                            password,
                            dbname,
                            "10",
                            "UTF8",
                            "-c standard_conforming_strings=on -c bytea_output=hex",
                            "torvale",
                            nullptr};
    PGconn *pg = PQconnectdbParams(keys, values, 0);
    if (pg == nullptr)
        return nullptr;
    if (PQstatus(pg) != CONNECTION_OK) {
        PQfinish(pg);
        return nullptr;
    }
    // An asynchronous notice (say, the server announcing its shutdown) must not end up
    // on the caller's stderr.
    PQsetNoticeProcessor(pg, quiet_notices, nullptr);
    auto *conn = new (std::nothrow) DBConn_tag;
    if (conn == nullptr) {
        PQfinish(pg);
        return nullptr;
    }
    conn->pg = pg;
    return conn;
}

// False when the session may be gone. The server says nothing to an idle client of
// ours (no LISTEN, no notices) unless it is ending the session, as on a restart or a
// terminated backend; so a readable socket while idle means: connect again. The
// statement has not been sent yet, so nothing runs twice.
bool still_usable(DBConn_tag *conn) {
    if (PQstatus(conn->pg) != CONNECTION_OK)
        return false;
    pollfd pfd{PQsocket(conn->pg), POLLIN, 0};
    return poll(&pfd, 1, 0) == 0;
}

int run(DBConn_tag *conn, const char *sql, DBResult_tag **result) {
    if (result != nullptr)
        *result = nullptr;
    if (conn == nullptr || conn->pg == nullptr || sql == nullptr)
        return -1;
    PGresult *pg = PQexec(conn->pg, sql);
    ExecStatusType status = pg != nullptr ? PQresultStatus(pg) : PGRES_FATAL_ERROR;
    if (status != PGRES_COMMAND_OK && status != PGRES_TUPLES_OK) {
        set_error(conn, pg != nullptr ? PQresultErrorMessage(pg) : PQerrorMessage(conn->pg));
        PQclear(pg);
        return -1;
    }
    if (result == nullptr) {
        PQclear(pg);
        return 0;
    }
    auto *res = new (std::nothrow) DBResult_tag;
    if (res == nullptr) {
        set_error(conn, "out of memory");
        PQclear(pg);
        return -1;
    }
    res->pg = pg;
    res->rows = PQntuples(pg);
    *result = res;
    return 0;
}

size_t escape_into(char *out, const char *text, size_t len) {
    size_t n = 0;
    for (size_t i = 0; i < len; ++i) {
        if (text[i] == '\'')
            out[n++] = '\'';
        out[n++] = text[i];
    }
    out[n] = '\0';
    return n;
}

void append_escaped(std::string &out, const char *text, bool like_pattern) {
    for (const char *p = text; *p != '\0'; ++p) {
        if (*p == '\'')
            out += '\'';
        else if (like_pattern && (*p == '\\' || *p == '%' || *p == '_'))
            out += '\\';
        out += *p;
    }
}

char *copy_out(const std::string &text) {
    auto *copy = static_cast<char *>(std::malloc(text.size() + 1));
    if (copy != nullptr)
        std::memcpy(copy, text.c_str(), text.size() + 1);
    return copy;
}

int hex_value(char c) {
    if (c >= '0' && c <= '9')
        return c - '0';
    if (c >= 'a' && c <= 'f')
        return c - 'a' + 10;
    if (c >= 'A' && c <= 'F')
        return c - 'A' + 10;
    return -1;
}

} // namespace

DBConn_tag *NAVODBPConnect(const char *host, const char *user, const char *password,
                           const char *dbname) noexcept {
    if (!g_atfork_registered) {
        pthread_atfork(nullptr, nullptr, forget_persistent_in_child);
        g_atfork_registered = true;
    }
    if (g_persistent != nullptr && !still_usable(g_persistent)) {
        NAVODBClose(g_persistent);
        g_persistent = nullptr;
    }
    if (g_persistent == nullptr)
        g_persistent = open_connection(host, user, password, dbname);
    return g_persistent;
}

DBConn_tag *NAVODBConnect(const char *host, const char *user, const char *password,
                          const char *dbname) noexcept {
    return open_connection(host, user, password, dbname);
}

void NAVODBClose(DBConn_tag *conn) noexcept {
    if (conn == nullptr)
        return;
    PQfinish(conn->pg);
    delete conn;
}

int NAVODBExecute(DBConn_tag *conn, const char *sql, DBResult_tag **result) noexcept {
    return run(conn, sql, result);
}

int NAVODBSelectLimit(DBConn_tag *conn, const char *sql, int limit, int offset,
                      DBResult_tag **result) noexcept {
    if (sql == nullptr)
        return run(conn, sql, result);
    char paging[64];
    std::snprintf(paging, sizeof paging, " LIMIT %d OFFSET %d", limit, offset);
    std::string statement;
    try {
        statement.reserve(std::strlen(sql) + std::strlen(paging));
        statement.append(sql).append(paging);
    } catch (const std::bad_alloc &) {
        return -1;
    }
    return run(conn, statement.c_str(), result);
}

int NAVODBNumRows(const DBResult_tag *result) noexcept {
    return result != nullptr ? result->rows : 0;
}

int NAVODBFetchRow(DBResult_tag *result, unsigned int *row) noexcept {
    if (result == nullptr || row == nullptr || result->next >= result->rows)
        return -1;
    *row = static_cast<unsigned int>(result->next++);
    return 0;
}

namespace {

bool names_column(const DBResult_tag *result, const std::pair<const char *, int> &entry,
                  const char *column) {
    // Same pointer and still the same text: a caller may reuse a buffer for other names.
    return entry.first == column && std::strcmp(PQfname(result->pg, entry.second), column) == 0;
}

int column_number(const DBResult_tag *result, const char *column) {
    auto &cols = result->columns;
    for (size_t i = 0, n = cols.size(); i < n; ++i) {
        size_t at = (result->hint + i) % n;
        if (names_column(result, cols[at], column)) {
            result->hint = at + 1;
            return cols[at].second;
        }
    }
    int col = PQfnumber(result->pg, column);
    if (col >= 0 && std::strcmp(PQfname(result->pg, col), column) == 0) {
        try {
            cols.emplace_back(column, col);
            result->hint = cols.size();
        } catch (const std::bad_alloc &) {
            // Without the cache the lookup is only slower.
        }
    }
    return col;
}

} // namespace

const char *NAVODBFetchField(const DBResult_tag *result, unsigned int row,
                             const char *column) noexcept {
    if (result == nullptr || column == nullptr || row >= static_cast<unsigned>(result->rows))
        return nullptr;
    int col = column_number(result, column);
    if (col < 0 || PQgetisnull(result->pg, static_cast<int>(row), col))
        return nullptr;
    return PQgetvalue(result->pg, static_cast<int>(row), col);
}

void NAVODBFreeResult(DBResult_tag *result) noexcept {
    if (result == nullptr)
        return;
    PQclear(result->pg);
    delete result;
}

const char *NAVODBErrorGet(const DBConn_tag *conn) noexcept {
    return conn != nullptr ? conn->last_error.c_str() : "no connection";
}

long long NAVODBAffectedRows(const DBConn_tag *, const DBResult_tag *result) noexcept {
    if (result == nullptr)
        return 0;
    return std::strtoll(PQcmdTuples(result->pg), nullptr, 10);
}

int NAVODBEscapeString(char *out, const char *text, size_t len) noexcept {
    if (out == nullptr || text == nullptr)
        return -1;
    return static_cast<int>(escape_into(out, text, len));
}

char *NAVODBEscapeStrAlloc(const char *text) noexcept {
    if (text == nullptr)
        return nullptr;
    size_t len = std::strlen(text);
    auto *out = static_cast<char *>(std::malloc(2 * len + 1));
    if (out != nullptr)
        escape_into(out, text, len);
    return out;
}

char *NAVODBEscapeStringEX3(int mode, const char *tmpl, ...) noexcept {
    static constexpr char kInt[] = "@NAVO:INT";
    static constexpr char kLikeVar[] = "@NAVO:LVAR";
    static constexpr char kVerbatim[] = "@NAVO:NEVAR";
    if (mode != 1 || tmpl == nullptr)
        return nullptr;
    va_list ap;
    va_start(ap, tmpl);
    char *built = nullptr;
    try {
        std::string out;
        bool ok = true;
        for (const char *p = tmpl; *p != '\0' && ok;) {
            if (std::strncmp(p, kInt, sizeof kInt - 1) == 0) {
                out += std::to_string(va_arg(ap, int));
                p += sizeof kInt - 1;
            } else if (std::strncmp(p, kLikeVar, sizeof kLikeVar - 1) == 0 ||
                       std::strncmp(p, kVerbatim, sizeof kVerbatim - 1) == 0) {
                bool like = p[6] == 'L';
                const char *arg = va_arg(ap, const char *);
                ok = arg != nullptr;
                if (ok && like)
                    append_escaped(out, arg, true);
                else if (ok)
                    out += arg;
                p += like ? sizeof kLikeVar - 1 : sizeof kVerbatim - 1;
            } else {
                out += *p++;
            }
        }
        if (ok)
            built = copy_out(out);
    } catch (const std::bad_alloc &) {
        built = nullptr;
    }
    va_end(ap);
    return built;
}

char *NAVODBBlogEncode(const unsigned char *bytes, size_t len, size_t *out_len) noexcept {
    static constexpr char kDigits[] = "0123456789abcdef";
    if ((bytes == nullptr && len != 0) || len > (SIZE_MAX - 3) / 2)
        return nullptr;
    auto *out = static_cast<char *>(std::malloc(2 * len + 3));
    if (out == nullptr)
        return nullptr;
    out[0] = '\\';
    out[1] = 'x';
    char *p = out + 2;
    for (size_t i = 0; i < len; ++i) {
        *p++ = kDigits[bytes[i] >> 4];
        *p++ = kDigits[bytes[i] & 0x0f];
    }
    *p = '\0';
    if (out_len != nullptr)
        *out_len = 2 * len + 2;
    return out;
}

unsigned char *NAVODBBlogDecode(const char *text, size_t *out_len) noexcept {
    if (text == nullptr)
        return nullptr;
    if (text[0] != '\\' || text[1] != 'x') {
        // The older escape format, should a server still send it.
        size_t n = 0;
        unsigned char *pq = PQunescapeBytea(reinterpret_cast<const unsigned char *>(text), &n);
        if (pq == nullptr)
            return nullptr;
        auto *copy = static_cast<unsigned char *>(std::malloc(n + 1));
        if (copy != nullptr) {
            std::memcpy(copy, pq, n);
            if (out_len != nullptr)
                *out_len = n;
        }
        PQfreemem(pq);
        return copy;
    }
    const char *hex = text + 2;
    size_t digits = std::strlen(hex);
    if (digits % 2 != 0)
        return nullptr;
    auto *out = static_cast<unsigned char *>(std::malloc(digits / 2 + 1));
    if (out == nullptr)
        return nullptr;
    for (size_t i = 0; i < digits / 2; ++i) {
        int hi = hex_value(hex[2 * i]);
        int lo = hex_value(hex[2 * i + 1]);
        if (hi < 0 || lo < 0) {
            std::free(out);
            return nullptr;
        }
        out[i] = static_cast<unsigned char>(hi << 4 | lo);
    }
    if (out_len != nullptr)
        *out_len = digits / 2;
    return out;
}

void NAVODBFreemem(void *mem) noexcept {
    std::free(mem);
}
