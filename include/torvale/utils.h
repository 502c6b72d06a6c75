/*
 * Torvale: the DownloadUtils family: host utilities: links, file names, storage, shares,
 * notifications.
 */
#ifndef TORVALE_UTILS_H
#define TORVALE_UTILS_H

#include "torvale/types.h"

#ifdef __cplusplus
extern "C" {
#endif

/* ---- Link classification and file names ------------------------------------------- */

/* 1 when the link begins "magnet:?" (letter case ignored), else 0. */
TORVALE_API int DownloadUtilsIsMagnetLink(const char *link) TORVALE_NOEXCEPT;

/* 1 for a link beginning "ftps://", 2 for "sftp://" (letter case ignored), else 0. */
TORVALE_API int DownloadUtilsIsFTPEncrptionLink(const char *link) TORVALE_NOEXCEPT;

/*
 * Finds a name in `dir` that does not exist yet: "dir/name" when free, else the name
 * numbered before its last extension ("movie1.avi", "a.tar1.gz", "README1", "1.hidden"),
 * counting up from 1. Names are cut to 1023 bytes. Writes the path into `out` of `size`
 * bytes. Returns 0, or -1 when an argument is null or size below 1 (`out` left alone)
 * or a candidate does not fit in `out` (`out` cleared).
 */
TORVALE_API int NAVODLValidateFilename(char *out, int size, const char *dir,
                                       const char *name) TORVALE_NOEXCEPT;

/* ---- Platform last-error code ------------------------------------------------------ */

/* The calling thread's last platform error code (feed updates leave 0x0B00, 0x4000). */
TORVALE_API int NLIBCErrGet(void) TORVALE_NOEXCEPT;
TORVALE_API void NLIBCErrSet(int code) TORVALE_NOEXCEPT;

/* ---- Storage, share, ownership and notification utilities ------------------------- */

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_UTILS_H */
