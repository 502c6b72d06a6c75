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

/* ---- Task control ----------------------------------------------------------------- */

/*
 * Each command below is one statement on `download_queue`. None stops or starts a worker
 * and none wakes the daemon: acting on the new statuses, or on rows that have gone, is
 * the caller's business. An id that has no row is no failure: nothing changes.
 */

/*
 * Deletes the tasks whose ids are listed (`count` of them, whatever their status).
 * Returns the number of rows deleted, or -1 (null ids, count 0 or less, failing
 * statement).
 */
TORVALE_API int DownloadTaskMultiDelete(const int *task_ids, int count) TORVALE_NOEXCEPT;

/* Deletes one task, whatever its status. Returns 0, or -1 (negative id, failure). */
TORVALE_API int DownloadTaskDelete(int task_id) TORVALE_NOEXCEPT;

/*
 * Pauses one task (status TASK_STATUS_PAUSED), or the listed ones. Returns 0, or -1
 * (negative id, null ids, count 0 or less, failing statement).
 */
TORVALE_API int DownloadTaskPause(int task_id) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskMultiPause(const int *task_ids, int count) TORVALE_NOEXCEPT;

/*
 * Puts one task, or the listed ones, back in the queue (status TASK_STATUS_WAITING).
 * Returns 0, or -1 as the pause functions.
 */
TORVALE_API int DownloadTaskContinue(int task_id) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskMultiContinue(const int *task_ids, int count) TORVALE_NOEXCEPT;

/*
 * The bulk commands. `username` null means every user's tasks; otherwise only the
 * tasks of that user, whose name is compared case-insensitively. Each returns 0, or -1
 * when the statement fails.
 *  - DownloadTaskClear deletes the finished tasks (TASK_STATUS_FINISHED);
 *  - DownloadTaskResumeAll sets the paused tasks and those in any error status (101 or
 *    above) to TASK_STATUS_WAITING;
 *  - DownloadTaskPauseAll pauses the waiting, downloading and seeding tasks (statuses
 *    1, 2, 6, 7, 8); finished and failed tasks stay as they are;
 *  - DownloadTaskDeleteAll deletes every task, whatever its status.
 */
TORVALE_API int DownloadTaskClear(const char *username) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskResumeAll(const char *username) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskPauseAll(const char *username) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskDeleteAll(const char *username) TORVALE_NOEXCEPT;

/* ---- Next-task selection and counts ----------------------------------------------- */

/*
 * The rotation cursor: the user name of the task that DownloadTaskGetNext last handed
 * out in rotating order, or null (at start, and after a rotating call found nothing).
 * The library owns the text and frees it when it moves the cursor; a caller may read it,
 * or replace it by a text allocated with malloc() (the library frees it later) to
 * start the rotation after a given user. Not locked: calls must not overlap.
 */
extern TORVALE_API char *gszLastUser;

/*
 * Chooses the waiting task (TASK_STATUS_WAITING, no worker pid) to start next; users
 * that are disabled or have no settings row are passed over. `order` 1 takes users in
 * turn, in the alphabetical order of their lower-case names, one task each, starting
 * after gszLastUser and moving it; any other value takes the oldest task of anyone and
 * leaves gszLastUser alone. Within one user the oldest task comes first.
 * With `ftp_host_limit` above 0, a waiting ftp:// link is held back while its server
 * (the link up to the first '/' behind the host, compared case-insensitively) already
 * has that many downloading ftp:// tasks; should counting them fail, the call goes on
 * without the limit. The chosen row is not changed: set its pid and status before
 * asking again, or it is handed out again.
 * Returns the task id, 0 when no task can be started (gszLastUser becomes null in
 * rotating order), or -1 when a statement fails (gszLastUser is then left as it was).
 */
TORVALE_API int DownloadTaskGetNext(int order, int ftp_host_limit) TORVALE_NOEXCEPT;

/*
 * Counts the tasks that match `condition` (the condition language of the listings,
 * for example "status=2 or status=6") and whose worker process is alive. A matching task
 * whose pid is 0 or less, or whose process has gone without the task having finished or
 * having been taken over by another live process, is set to TASK_STATUS_ERROR.
 * Returns the count, or -1 (null condition, condition outside the language, failing
 * statement).
 */
TORVALE_API int DownloadTaskCountByStatus(const char *condition) TORVALE_NOEXCEPT;

/* DownloadTaskCountByStatus over the downloading tasks (statuses 2 and 6). */
TORVALE_API int DownloadTaskDownloadingCount(void) TORVALE_NOEXCEPT;

/* DownloadTaskCountByStatus over the seeding tasks (statuses 8 and 7). */
TORVALE_API int DownloadTaskSeedingCount(void) TORVALE_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_TASK_H */
