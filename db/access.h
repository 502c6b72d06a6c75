// What the library's units share on top of the database client: ownership guards for
// results and client-allocated texts, and whole-statement formatting.
#pragma once

#include <cstdlib>
#include <memory>
#include <string>

#include "db/navodb.h"
#include "torvale/database.h"

namespace torvale::db {

struct ResultFree {
    void operator()(DBResult_tag *r) const noexcept { NAVODBFreeResult(r); }
};
// A result set released on every path.
using Result = std::unique_ptr<DBResult_tag, ResultFree>;

struct MemFree {
    void operator()(void *p) const noexcept { NAVODBFreemem(p); }
};
// A text or buffer from the client (escaped copies, built statements, blobs).
using Text = std::unique_ptr<char, MemFree>;
using Bytes = std::unique_ptr<unsigned char, MemFree>;

// Runs `sql`, handing the result set to `out`. Returns 0 or -1 as NAVODBExecute.
inline int execute(DBConn_tag *conn, const char *sql, Result &out) noexcept {
    DBResult_tag *raw = nullptr;
    int rc = NAVODBExecute(conn, sql, &raw);
    out.reset(raw);
    return rc;
}

inline int select_limit(DBConn_tag *conn, const char *sql, int limit, int offset,
                        Result &out) noexcept {
    DBResult_tag *raw = nullptr;
    int rc = NAVODBSelectLimit(conn, sql, limit, offset, &raw);
    out.reset(raw);
    return rc;
}

// A required text argument: given and not empty.
inline bool present(const char *text) noexcept {
    return text != nullptr && text[0] != '\0';
}

// A statement formatted whole, however long its texts. Throws std::bad_alloc.
std::string format(const char *fmt, ...) __attribute__((format(printf, 1, 2)));

// `text` escaped for use between single quotes. Throws std::bad_alloc.
std::string escape(const char *text);

// An integer field, 0 when NULL (or missing).
long long field_int(const DBResult_tag *result, unsigned row, const char *column) noexcept;

// A text field, "" when NULL.
inline const char *field_text(const DBResult_tag *result, unsigned row,
                              const char *column) noexcept {
    const char *v = NAVODBFetchField(result, row, column);
    return v != nullptr ? v : "";
}

// Copies `text` into `out` of `size` bytes, cut to fit and always terminated.
void copy_text(char *out, size_t size, const char *text) noexcept;

} // namespace torvale::db
