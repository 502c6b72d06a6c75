/*
 * Torvale: the DownloadTask family: system configuration, task creation and control,
 * next-task selection, the change trigger, and single-task reads and writes.
 */
#ifndef TORVALE_TASK_H
#define TORVALE_TASK_H

#include "torvale/types.h"

#ifdef __cplusplus
extern "C" {
#endif

/* ---- System download configuration ---------------------------------------------- */

/*
 * The system download configuration, one row of `sysconf`. The leading fields are
 * fixed; the daemon keeps further fields of its own in the reserved words, which the
 * functions below neither read nor write. Zero the whole record before DownloadConfGet.
 */
typedef struct DownloadConf {
    int enabled;            /* always 1 when read; always stored as 1 */
    char download_when[12]; /* schedule text, at most 11 characters */
    int download_order;
    int reserved[6];       /* the daemon's; untouched here */
    int seeding_ratio;     /* default seeding ratio of new tasks */
    int seeding_interval;  /* default seeding time of new tasks */
    int daemon_fields[32]; /* room for the daemon's further fields; untouched here */
} DownloadConf;

/*
 * Stores the record in the `sysconf` row: inserts it into an empty table, otherwise
 * updates every row. The enabled field is ignored and 1 is stored.
 * Returns 0, or -1 (null record, no connection, failing statement).
 */
TORVALE_API int DownloadConfSet(const DownloadConf *conf) TORVALE_NOEXCEPT;

/*
 * Fills the record from the `sysconf` row: enabled 1, download_when cut to 11
 * characters, download_order, seeding_ratio and seeding_interval. Other fields are left
 * alone. Returns 0, or -1 (null record, no connection, failing statement, no row), in
 * which case the record is left exactly as it was passed.
 */
TORVALE_API int DownloadConfGet(DownloadConf *conf) TORVALE_NOEXCEPT;

/* ---- Task creation ---------------------------------------------------------------- */

/* ---- Change trigger --------------------------------------------------------------- */

/* ---- Task field writes ------------------------------------------------------------ */

/* ---- Task field reads and totals -------------------------------------------------- */

#include <stddef.h> /* size_t */

/* A task's seeding settings, the columns of the same names. */
typedef struct DownloadTaskSetting {
    int seeding_ratio;
    int seeding_interval;
} DownloadTaskSetting;

/*
 * Copies the task's file name into `buf` of `size` bytes, cut to size-1 bytes and
 * terminated (a NULL name reads as ""). Returns 0, or -1 (no such task, no connection,
 * failing statement).
 */
TORVALE_API int DownloadTaskFilenameGet(int task_id, char *buf, size_t size) TORVALE_NOEXCEPT;

/* The task's worker pid, -1 when none. Returns -2 on failure (no such task, ...). */
TORVALE_API int DownloadTaskPidGet(int task_id) TORVALE_NOEXCEPT;

/* The task's status code (TASK_STATUS_*). Returns -1 on failure (no such task, ...). */
TORVALE_API int DownloadTaskStatusGet(int task_id) TORVALE_NOEXCEPT;

/*
 * The task's seeding time so far. Returns 0 on failure as well (negative id, no such
 * task, ...); only the log tells a failure from a stored 0.
 */
TORVALE_API int DownloadTaskSeedElapsedGet(int task_id) TORVALE_NOEXCEPT;

/* The task's uploaded bytes. Returns 0 on failure as well, as DownloadTaskSeedElapsedGet. */
TORVALE_API unsigned long long DownloadTaskTotalUploadGet(int task_id) TORVALE_NOEXCEPT;

/*
 * Copy the task's owner, resp. destination folder, into `buf` of `size` bytes, cut to
 * size-1 bytes and terminated (NULL reads as ""). Return 0, or -1 (negative id, null
 * buffer, size 0 or less, no such task, no connection, failing statement).
 */
TORVALE_API int DownloadTaskUserGet(int task_id, char *buf, int size) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskDestinationGet(int task_id, char *buf, int size) TORVALE_NOEXCEPT;

/* The task's flag bits. Returns -1 on failure (negative id, no such task, ...). */
TORVALE_API int DownloadTaskFlagsGet(int task_id) TORVALE_NOEXCEPT;

/*
 * Fills `setting` with the task's seeding settings. Returns 0, or -1 (negative id,
 * null record, no such task, ...), in which case the record is left as it was.
 */
TORVALE_API int DownloadTaskSettingGet(int task_id, DownloadTaskSetting *setting) TORVALE_NOEXCEPT;

/*
 * The task's extra information, in two steps. With `buf` null: returns its length in
 * characters (0 for none). With a buffer of `size` bytes: copies it, cut to size-1
 * bytes and terminated, and returns its full length in bytes, which exceeds size-1
 * when the copy was cut. Returns 0 on failure (negative id, a buffer with a size of 0
 * or less, no such task, ...); only the log tells a failure from an empty text.
 */
TORVALE_API int DownloadTaskExtraInfoGet(int task_id, char *buf, int size) TORVALE_NOEXCEPT;

/* The number of tasks of `username` (letter case ignored), or of all users when it is
 * null. Returns -1 on failure. */
TORVALE_API int DownloadTaskCount(const char *username) TORVALE_NOEXCEPT;

/* The highest task id of `username` (letter case ignored), or of all users when it is
 * null; 0 when there is no task. Returns -1 on failure. */
TORVALE_API int DownloadLastTaskIDGet(const char *username) TORVALE_NOEXCEPT;

/*
 * Sums the download and upload rates of the downloading and seeding tasks (statuses
 * TASK_STATUS_DOWNLOADING, TASK_STATUS_SEEDING and TASK_STATUS_SEED_AUX): over every
 * user's tasks for a member of the administrators' group, over the user's own tasks
 * (letter case ignored) for anybody else. Rates of no task are 0. Returns 0, or -1
 * (null argument, the group check failed, no connection, failing statement), in which
 * case the outputs are left as they were.
 */
TORVALE_API int DownloadTotalRateGet(const char *username, int *download_rate,
                                     int *upload_rate) TORVALE_NOEXCEPT;

/* ---- Task control ----------------------------------------------------------------- */

/* ---- Next-task selection and counts ----------------------------------------------- */

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_TASK_H */
