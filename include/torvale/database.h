/*
 * Torvale: database access.
 *
 * Every connection uses the same parameters: the client's default host (PGHOST and
 * PGPORT decide), the account "admin", no password, the database "download".
 */
#ifndef TORVALE_DATABASE_H
#define TORVALE_DATABASE_H

#include "torvale/types.h"

#ifdef __cplusplus
extern "C" {
#endif

/*
 * Returns the process-wide persistent connection, opened on first use and kept for
 * the life of the process (a process that forked opens its own). Null when no
 * connection can be made; nothing is logged. Never close it yourself.
 */
TORVALE_API DBConn_tag *DownloadDBConnect(void) TORVALE_NOEXCEPT;

/* Does nothing, whatever it is given: the persistent connection stays open. */
TORVALE_API void DownloadDBClose(DBConn_tag *conn) TORVALE_NOEXCEPT;

/*
 * Runs one statement that returns no rows on the persistent connection. Returns the
 * number of rows it changed (0 is not a failure), or -1 for a null statement, no
 * connection or a failing statement.
 */
TORVALE_API int DownloadDBExec(const char *sql) TORVALE_NOEXCEPT;

/* As DownloadDBExec, on a private connection that is opened and closed around it. */
TORVALE_API int DownloadDBExecNonPersistent(const char *sql) TORVALE_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_DATABASE_H */
