/*
 * Torvale: shared types, codes and the export macro.
 *
 * Conventions that hold for every exported function:
 *  - A result of -1 means failure; each failure is written once to syslog at LOG_ERR.
 *    Success is 0, or a count, an id or a flag where a function says so. A few reads
 *    use another failure value (for example -2) because -1 is a legal value for them.
 *  - Texts passed in are NUL-terminated UTF-8 byte strings and stay the caller's.
 *    Out buffers are `char *` with their size; a copy is cut to fit and terminated.
 *  - Records and buffers passed in are owned by the caller. What the library allocates
 *    is handed over together with its release function, named where it is returned.
 *  - The library starts no threads and takes no locks. Process-wide state (the database
 *    connection, the rotation cursor, the shared-memory attachments, the queue record)
 *    means that calls into one process must not overlap.
 *  - User names are compared case-insensitively in the task and user tables.
 */
#ifndef TORVALE_TYPES_H
#define TORVALE_TYPES_H

#if defined(__GNUC__)
#define TORVALE_API __attribute__((visibility("default")))
#else
#define TORVALE_API
#endif

#ifdef __cplusplus
#define TORVALE_NOEXCEPT noexcept
#else
#define TORVALE_NOEXCEPT
#endif

/* Task status codes, the `status` column of `download_queue`. */
#define TASK_STATUS_WAITING 1
#define TASK_STATUS_DOWNLOADING 2
#define TASK_STATUS_PAUSED 3
#define TASK_STATUS_FINISHED 5
#define TASK_STATUS_DOWNLOAD_AUX 6
#define TASK_STATUS_SEED_AUX 7
#define TASK_STATUS_SEEDING 8
/* 101 and every value above it is an error status. */
#define TASK_STATUS_ERROR 101

/* Opaque handles of the database client. */
typedef struct DBConn_tag DBConn_tag;
typedef struct DBResult_tag DBResult_tag;

#endif /* TORVALE_TYPES_H */
