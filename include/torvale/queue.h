/*
 * Torvale: the DownloadQueue family: queue listing.
 *
 * A listing is one statement over `download_queue`: open it with one of the four open
 * calls, walk it with DownloadQueueGet until that returns null, and release it with
 * DownloadQueueClose. Ordering, limit and offset are applied by the database.
 *
 * Conditions are WHERE texts in the condition language (see the README): columns of
 * `download_queue`, literals, comparisons, AND/OR/NOT, IN, BETWEEN, LIKE, ILIKE, IS and
 * the functions lower, upper and length. They are checked and rewritten before they
 * reach the database, and a condition restricts the whole listing whatever its
 * top-level operator ("status=2 or status=6" needs no parentheses).
 */
#ifndef TORVALE_QUEUE_H
#define TORVALE_QUEUE_H

#include "torvale/types.h"

#ifdef __cplusplus
extern "C" {
#endif

/*
 * The listing cursor. Allocated zeroed by an open call and owned by the caller until
 * DownloadQueueClose; `rows` may be read at any time after the open.
 */
typedef struct DownloadQueueHandle {
    DBConn_tag *conn;     /* the persistent connection */
    DBResult_tag *result; /* the rows of the statement */
    unsigned int row;     /* the row DownloadQueueGet handed out last */
    int rows;             /* number of rows of the statement */
} DownloadQueueHandle;

/*
 * One `download_queue` row. A column that is SQL NULL gives 0, or a null pointer for a
 * text. The texts point into the handle's result: they stay valid until the handle is
 * closed, but the record itself is overwritten by the next DownloadQueueGet, so copy a
 * value you keep.
 */
typedef struct DownloadTaskInfo {
    int task_id;
    const char *username;
    int pid; /* worker process, -1 when none */
    const char *url;
    const char *filename;
    int status;                /* TASK_STATUS_* */
    unsigned int created_time; /* seconds since the epoch */
    unsigned int started_time; /* seconds since the epoch, 0 before the task started */
    long long total_size;      /* 0 while unknown */
    long long current_size;
    int current_rate;
    int total_peers;
    int connected_peers;
    int total_pieces;
    int downloaded_pieces;
    int available_pieces;
    int upload_rate;
    long long total_upload;
    int seeding_ratio;
    int seeding_interval;
    int seeding_elapsed;
    int seeders;
    int leechers;
    int task_flags;  /* creation kind bits 0x02, 0x04, 0x10, 0x20 and callers' bits */
    int has_torrent; /* 1 when file bytes are stored with the task, else 0 */
} DownloadTaskInfo;

/*
 * Lists every task in task id order (condition null), or the tasks matching
 * `condition` in the database's order. Returns a handle, or null (bad condition, no
 * connection, failing statement, no memory). An empty listing is not a failure.
 */
TORVALE_API DownloadQueueHandle *DownloadQueueOpen(const char *condition) TORVALE_NOEXCEPT;

/*
 * Lists the tasks matching `condition` (null: all) ordered by `sort_column` (a column
 * name of `download_queue`; null or empty: "task_id"), ascending when `ascending` is
 * non-zero, else descending; ties are taken in ascending task id. A negative `limit`
 * or `offset` leaves that clause out. Returns a handle, or null (a sort column that is
 * not a column name, bad condition, no connection, failing statement, no memory).
 */
TORVALE_API DownloadQueueHandle *DownloadQueueOpenCondition(const char *condition, int limit,
                                                            int offset, const char *sort_column,
                                                            int ascending) TORVALE_NOEXCEPT;

/*
 * Lists the tasks matching `condition` (null: all) by percentage done
 * (current_size / total_size; 0 for a task of total_size 0), ties by ascending task id.
 * A negative `limit` or `offset` is taken as 0, so a limit of -1 lists nothing.
 * Returns a handle, or null as DownloadQueueOpenCondition.
 */
TORVALE_API DownloadQueueHandle *DownloadQueueOpenProgress(const char *condition, int limit,
                                                           int offset,
                                                           int ascending) TORVALE_NOEXCEPT;

/*
 * Lists the tasks matching `condition` (null: all) by estimated seconds left: for a
 * downloading task with a known size and a rate above 512, the bytes left divided by
 * the rate; for every other task 9999999999. Ties by status in the same direction,
 * then by ascending task id. A negative `limit` or `offset` is taken as 0. Returns a
 * handle, or null as DownloadQueueOpenCondition.
 */
TORVALE_API DownloadQueueHandle *DownloadQueueOpenTimeLeft(const char *condition, int limit,
                                                           int offset,
                                                           int ascending) TORVALE_NOEXCEPT;

/*
 * Hands out the next row of the listing in the one task record of the process, which
 * every call clears first. Returns the record, or null when no row is left or the
 * handle is null (then the record is all zeros). Never free the record.
 */
TORVALE_API DownloadTaskInfo *DownloadQueueGet(DownloadQueueHandle *handle) TORVALE_NOEXCEPT;

/* Releases the handle and its rows; texts taken from its records die with it. Null is
 * ignored. */
TORVALE_API void DownloadQueueClose(DownloadQueueHandle *handle) TORVALE_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_QUEUE_H */
