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

#include <stddef.h>

/*
 * A file's bytes in memory. A caller may fill one to hand a file to task creation
 * instead of a path; it keeps ownership of the record and of the bytes.
 */
typedef struct DLFileSet {
    unsigned char *data; /* the bytes; may be null only when length is 0 */
    size_t length;       /* number of bytes at data */
} DLFileSet;

/* Task flag bits set at creation (task_flags). */
#define DOWNLOAD_TASK_FLAG_FILE_KIND 0x02 /* added from a file with a non-zero kind */
#define DOWNLOAD_TASK_FLAG_TORRENT 0x04   /* a magnet link, or a file with kind 0 */
#define DOWNLOAD_TASK_FLAG_FTPS 0x10      /* a link beginning "ftps://" */
#define DOWNLOAD_TASK_FLAG_SFTP 0x20      /* a link beginning "sftp://" */

/* Files read from a path may hold at most this many bytes (100 MiB). */
#define DOWNLOAD_TASK_FILE_MAX 104857600

/*
 * Every creation function inserts one waiting task (status 1, pid -1) with the seeding
 * ratio and interval of the system configuration, and returns 0; on any failure it
 * returns -1 and leaves the queue as it was. None returns the new task's id and none
 * wakes the daemon: call NAVODownloadTrigger for that. A missing system configuration
 * makes every creation fail.
 */

/*
 * Adds a link for `user`, to be saved in `destination`. The file name is the text after
 * the link's last '/' (the whole link when nothing follows it). A magnet link is named
 * after its dn parameter, else after its info hash, when a further parameter follows
 * (else after the whole link), and gets flag 0x04; "ftps://" links get 0x10, "sftp://"
 * links 0x20. All three texts are required and must not be empty.
 */
TORVALE_API int DownloadTaskAddWithDst(const char *user, const char *url,
                                       const char *destination) TORVALE_NOEXCEPT;

/*
 * As DownloadTaskAddWithDst, to the user's default share (DownloadUserShareGet). Fails
 * for a user without a setting or a disabled user.
 */
TORVALE_API int DownloadTaskAdd(const char *user, const char *url) TORVALE_NOEXCEPT;

/*
 * DownloadTaskAddWithDst when `destination` is not null (an empty one is refused
 * there), DownloadTaskAdd when it is null.
 */
TORVALE_API int DownloadTaskAddURLHandler(const char *user, const char *url,
                                          const char *destination) TORVALE_NOEXCEPT;

/*
 * Adds a file task: the bytes of `content`, or when it is null those of the file at
 * `path` (a regular file of at most DOWNLOAD_TASK_FILE_MAX bytes; bytes handed in
 * through `content` are not limited). The task's url and file name are the base name
 * of `path`. Flag 0x02 when `kind` is non-zero, 0x04 when it is 0. `extra_info` may be
 * null or empty (stored as ''). user, path and destination are required and non-empty.
 */
TORVALE_API int DownloadTaskAddFileEX(const char *user, const char *path, const char *destination,
                                      const DLFileSet *content, int kind,
                                      const char *extra_info) TORVALE_NOEXCEPT;

/* DownloadTaskAddFileEX with kind 0 (a torrent file). */
TORVALE_API int DownloadTaskAddTorrent(const char *user, const char *path, const char *destination,
                                       const DLFileSet *content,
                                       const char *extra_info) TORVALE_NOEXCEPT;

/* DownloadTaskAddFileEX without extra information. */
TORVALE_API int DownloadTaskAddFileWithDst(const char *user, const char *path,
                                           const char *destination, const DLFileSet *content,
                                           int kind) TORVALE_NOEXCEPT;

/*
 * DownloadTaskAddFileWithDst to the user's default share. Fails for a user without a
 * setting or a disabled user. `content` may be null.
 */
TORVALE_API int DownloadTaskAddDLFileSet(const char *user, const char *path,
                                         const DLFileSet *content, int kind) TORVALE_NOEXCEPT;

/*
 * DownloadTaskAddFileWithDst when `destination` is neither null nor empty, otherwise
 * DownloadTaskAddDLFileSet (the user's default share).
 */
TORVALE_API int DownloadTaskAddFileHandler(const char *user, const char *path,
                                           const char *destination, const DLFileSet *content,
                                           int kind) TORVALE_NOEXCEPT;

/* ---- Change trigger --------------------------------------------------------------- */

/*
 * Two System V shared-memory segments owned by the download daemon, which creates them
 * (IPC_CREAT, mode 0666), resets their flags and removes them. Words are 32-bit
 * integers in host byte order.
 *  - trigger segment: word 0 is the change flag, set to 1 by NAVODownloadTrigger;
 *  - progress segment: word 0 is the progress-wanted flag, set to 1 by
 *    DownloadTriggerProgress, word 1 the system uptime in seconds at that call.
 * The library attaches each at most once per process and keeps the attachment.
 */
#define DOWNLOAD_SHM_TRIGGER_KEY 0x01856E96
#define DOWNLOAD_SHM_TRIGGER_SIZE 4
#define DOWNLOAD_SHM_PROGRESS_KEY 0x01856EA1
#define DOWNLOAD_SHM_PROGRESS_SIZE 8

/*
 * Attaches the segment `key` of at least `size` bytes, read-write; with `create`
 * non-zero it is created (mode 0666) when missing. Returns its address, or null when
 * the segment cannot be found, created or attached (errno says why). Logs nothing.
 */
TORVALE_API void *NAVODownloadShmAttach(int key, size_t size, int create) TORVALE_NOEXCEPT;

/* Detaches an address from NAVODownloadShmAttach. Returns 0, or -1. */
TORVALE_API int NAVODownloadShmDetach(void *addr) TORVALE_NOEXCEPT;

/*
 * Removes the segment `key` of at least `size` bytes. Returns 0, or -1 when it does not
 * exist or cannot be removed.
 */
TORVALE_API int NAVODownloadShmRemove(int key, size_t size) TORVALE_NOEXCEPT;

/*
 * Sets the change flag to wake the daemon. Always returns 0; when the daemon's segment
 * is missing nothing happens and nothing is logged.
 */
TORVALE_API int NAVODownloadTrigger(void) TORVALE_NOEXCEPT;

/*
 * Asks the daemon for progress: stamps the uptime, then sets the progress-wanted flag.
 * Returns the flag's value before the call, or 0 when the segment cannot be attached
 * (silently when it does not exist).
 */
TORVALE_API int DownloadTriggerProgress(void) TORVALE_NOEXCEPT;

/*
 * The database server's loadable-module magic block: five ints, the block's length in
 * bytes (20), the server version (803), the maximum function arguments (100), index
 * keys (32) and identifier length (64).
 */
typedef struct DownloadModuleMagic {
    int len;
    int version;
    int funcmaxargs;
    int indexmaxkeys;
    int namedatalen;
} DownloadModuleMagic;

/* The constant magic block; never null, never to be released. */
TORVALE_API const DownloadModuleMagic *Pg_magic_func(void) TORVALE_NOEXCEPT;

/* ---- Task field writes ------------------------------------------------------------ */

/*
 * Each function runs one UPDATE of a task's row and returns the number of rows it
 * changed: 1 for an existing task, 0 when no task has that id. -1 means failure: a
 * negative id (except for DownloadTaskClearDURate), a null text or a failing
 * statement. Nothing is read before it is written.
 */

TORVALE_API int DownloadTaskPidStatusSet(int task_id, int pid, int status) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskPidSet(int task_id, int pid) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskStatusSet(int task_id, int status) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskSeedElapsedSet(int task_id, int seconds) TORVALE_NOEXCEPT;

/* `started_time` (seconds since the epoch) must be greater than 0. */
TORVALE_API int DownloadTaskStartedTimeSet(int task_id, long started_time) TORVALE_NOEXCEPT;

/* The text may be empty; it is stored exactly as given. */
TORVALE_API int DownloadTaskFilenameSet(int task_id, const char *filename) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskDestinationSet(int task_id, const char *destination) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskExtraInfoSet(int task_id, const char *extra_info) TORVALE_NOEXCEPT;

/*
 * As DownloadTaskPidStatusSet, on a connection opened and closed for this one
 * statement, leaving the process's persistent connection alone.
 */
TORVALE_API int DownloadTaskPidStatusSetNonPersistent(int task_id, int pid,
                                                      int status) TORVALE_NOEXCEPT;

TORVALE_API int DownloadTaskTotalSizeSet(int task_id, long long total_size) TORVALE_NOEXCEPT;

/*
 * Set, resp. clear, the bits of `flags` in the stored flags and keep the others. The
 * change is made by the database on the stored value, so concurrent callers that touch
 * different bits never lose one another's.
 */
TORVALE_API int DownloadTaskFlagsSet(int task_id, int flags) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskFlagsClear(int task_id, int flags) TORVALE_NOEXCEPT;

/* Zeroes both rates. Checks no argument: a negative id changes nothing and gives 0. */
TORVALE_API int DownloadTaskClearDURate(int task_id) TORVALE_NOEXCEPT;

/*
 * Sets the status of every listed task, in one statement. Ids are not checked; those
 * without a row are not counted. Returns the rows changed, or -1 for a null list or a
 * count of 0 or less.
 */
TORVALE_API int DownloadTaskMultiStatusSet(const int *task_ids, int count,
                                           int status) TORVALE_NOEXCEPT;

/* A task's progress figures, as the daemon reports them. */
typedef struct DownloadProgressInfo {
    long long current_size;
    int current_rate;
    int upload_rate;
    int total_peers;
    int connected_peers;
    int total_pieces;
    int downloaded_pieces;
    int available_pieces;
    long long total_upload;
    long seeding_elapsed; /* seconds */
    int seeders;
    int leechers;
} DownloadProgressInfo;

/*
 * Write a task's progress figures. Unless `force` is non-zero the write happens only
 * while somebody wants progress (DownloadTriggerProgress); otherwise, and when the
 * daemon's progress segment is missing, nothing is written and 1 is returned before
 * any argument is checked. Written: the rows changed (1 or 0), or -1 for a negative
 * id, a null record or a failing statement.
 */
TORVALE_API int DownloadTaskProgressSet(int task_id, long long current_size, int current_rate,
                                        int total_peers, int connected_peers, int total_pieces,
                                        int downloaded_pieces, int available_pieces,
                                        int force) TORVALE_NOEXCEPT;
TORVALE_API int DownloadTaskProgressSet2(int task_id, const DownloadProgressInfo *progress,
                                         int force) TORVALE_NOEXCEPT;

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
 * Stores the task's seeding ratio and seeding time from `setting`, which must not be
 * null. Returns the rows changed (1, or 0 when no task has that id), or -1 (negative
 * id, null setting, failing statement).
 */
TORVALE_API int DownloadTaskSettingSet(int task_id,
                                       const DownloadTaskSetting *setting) TORVALE_NOEXCEPT;

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
