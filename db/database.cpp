// The database access layer: the one connection every unit takes, and the
// statement runners for writes.
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <memory>
#include <new>

#include "db/access.h"
#include "platform/log.h"

namespace {

constexpr char kLogUnit[] = "database";

// Every connection: the client's default host, account "admin", database "download".
constexpr const char *kHost = nullptr;
constexpr char kUser[] = "admin";
constexpr const char *kPassword = nullptr;
constexpr char kDatabase[] = "download";

struct ConnClose {
    void operator()(DBConn_tag *c) const noexcept { NAVODBClose(c); }
};

int exec_on(DBConn_tag *conn, const char *sql) noexcept {
    torvale::db::Result result;
    if (torvale::db::execute(conn, sql, result) == -1) {
        TV_LOG("%s (%d) Failed to exec [%s] (%s)", sql, NAVODBErrorGet(conn));
        return -1;
    }
    return static_cast<int>(NAVODBAffectedRows(conn, result.get()));
}

} // namespace

namespace torvale::db {

std::string format(const char *fmt, ...) {
    va_list ap;
    va_start(ap, fmt);
    va_list copy;
    va_copy(copy, ap);
    int len = std::vsnprintf(nullptr, 0, fmt, ap);
    va_end(ap);
    if (len < 0) {
        // Past INT_MAX bytes: an empty statement must never stand in for the real one.
        va_end(copy);
        throw std::bad_alloc();
    }
    std::string out(static_cast<size_t>(len), '\0');
    std::vsnprintf(out.data(), out.size() + 1, fmt, copy);
    va_end(copy);
    return out;
}

std::string escape(const char *text) {
    size_t len = std::strlen(text);
    std::string out(2 * len, '\0');
    out.resize(static_cast<size_t>(NAVODBEscapeString(out.data(), text, len)));
    return out;
}

long long field_int(const DBResult_tag *result, unsigned row, const char *column) noexcept {
    const char *v = NAVODBFetchField(result, row, column);
    return v != nullptr ? std::strtoll(v, nullptr, 10) : 0;
}

void copy_text(char *out, size_t size, const char *text) noexcept {
    if (out == nullptr || size == 0)
        return;
    size_t n = text != nullptr ? strnlen(text, size - 1) : 0;
    if (n > 0)
        std::memcpy(out, text, n);
    out[n] = '\0';
}

} // namespace torvale::db

extern "C" {

TORVALE_API DBConn_tag *DownloadDBConnect(void) noexcept {
    return NAVODBPConnect(kHost, kUser, kPassword, kDatabase);
}

TORVALE_API void DownloadDBClose(DBConn_tag *) noexcept {}

TORVALE_API int DownloadDBExec(const char *sql) noexcept {
    if (sql == nullptr) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    DBConn_tag *conn = DownloadDBConnect();
    if (conn == nullptr) {
        TV_LOG("%s (%d) Failed to connect to database");
        return -1;
    }
    return exec_on(conn, sql);
}

TORVALE_API int DownloadDBExecNonPersistent(const char *sql) noexcept {
    if (sql == nullptr) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    std::unique_ptr<DBConn_tag, ConnClose> conn(NAVODBConnect(kHost, kUser, kPassword, kDatabase));
    if (conn == nullptr) {
        TV_LOG("%s (%d) Failed to connect to database");
        return -1;
    }
    return exec_on(conn.get(), sql);
}

} // extern "C"
