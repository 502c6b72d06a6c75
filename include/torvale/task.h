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

/* ---- Next-task selection and counts ----------------------------------------------- */

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_TASK_H */
