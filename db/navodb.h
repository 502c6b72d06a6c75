// The database client: a small layer over libpq with the operations the library's
// units are written against. Internal: linked into libtorvale.so, never exported.
//
// Texts: fields come back as the server's text form (integers in decimal, booleans
// "t"/"f", bytea in hex) and SQL NULL as a null pointer. Every connection runs with
// standard_conforming_strings on, so escaping a literal only doubles its quotes.
#pragma once

#include <cstddef>

#include "torvale/types.h"

// Connections. NAVODBPConnect hands out the process-wide persistent connection,
// opening it on first use (and again when the server dropped it, or when this process
// is a fork of the one that opened it); NAVODBConnect opens a private one for
// NAVODBClose. Null host and password take libpq's defaults. Null on failure.
DBConn_tag *NAVODBPConnect(const char *host, const char *user, const char *password,
                           const char *dbname) noexcept;
DBConn_tag *NAVODBConnect(const char *host, const char *user, const char *password,
                          const char *dbname) noexcept;
void NAVODBClose(DBConn_tag *conn) noexcept;

// Runs one statement. Returns 0 on success and -1 on failure; when `result` is not
// null it receives the result set (null on failure), released with NAVODBFreeResult.
int NAVODBExecute(DBConn_tag *conn, const char *sql, DBResult_tag **result) noexcept;
// As NAVODBExecute, with " LIMIT limit OFFSET offset" appended to the SELECT.
int NAVODBSelectLimit(DBConn_tag *conn, const char *sql, int limit, int offset,
                      DBResult_tag **result) noexcept;

int NAVODBNumRows(const DBResult_tag *result) noexcept;
// Moves to the next row: sets *row to it and returns 0, or returns -1 when none is
// left. The result keeps its own position; *row names the row for NAVODBFetchField.
int NAVODBFetchRow(DBResult_tag *result, unsigned int *row) noexcept;
// The field's text, or null for SQL NULL, an unknown column or a row out of range.
// Valid until the result is released.
const char *NAVODBFetchField(const DBResult_tag *result, unsigned int row,
                             const char *column) noexcept;
void NAVODBFreeResult(DBResult_tag *result) noexcept;

// The last error of the connection, without its trailing newline; never null.
const char *NAVODBErrorGet(const DBConn_tag *conn) noexcept;
// Rows changed by the statement behind `result`.
long long NAVODBAffectedRows(const DBConn_tag *conn, const DBResult_tag *result) noexcept;

// Escapes `len` bytes of `text` for use between single quotes into `out`, which holds
// at least 2*len+1 bytes. Returns the escaped length, or -1 for null arguments.
int NAVODBEscapeString(char *out, const char *text, size_t len) noexcept;
// A new escaped copy of `text`, released with free(); null on failure.
char *NAVODBEscapeStrAlloc(const char *text) noexcept;

// Builds a statement from `tmpl`, replacing each placeholder, in order, by the next
// argument: "@NAVO:INT" an int in decimal; "@NAVO:LVAR" a text escaped for use inside
// a quoted LIKE pattern (taken literally: %, _ and \ lose their meaning); "@NAVO:NEVAR"
// a text inserted unchanged (clauses built by this same function, or ""). `mode` must
// be 1. Returns a new text released with free(), or null (bad mode, null text
// argument, no memory).
char *NAVODBEscapeStringEX3(int mode, const char *tmpl, ...) noexcept;

// Checks a WHERE condition written in the condition language (see db/condition.h)
// and writes its safe form into `out` (size `out_size`; 2*strlen(condition)+1 is
// always enough). Returns 0, or -1 for a condition outside the language or too small a
// buffer.
int EscapeCondition(const char *condition, char *out, size_t out_size) noexcept;

// Encodes bytes as the text of a bytea literal, to be placed between single quotes.
// Returns a new text released with NAVODBFreemem and its length in *out_len, or null.
char *NAVODBBlogEncode(const unsigned char *bytes, size_t len, size_t *out_len) noexcept;
// Decodes a bytea field's text. Returns a new buffer released with NAVODBFreemem and
// the byte count in *out_len, or null for malformed text.
unsigned char *NAVODBBlogDecode(const char *text, size_t *out_len) noexcept;
void NAVODBFreemem(void *mem) noexcept;
