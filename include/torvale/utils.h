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

/* ---- Platform last-error code ------------------------------------------------------ */

/* The calling thread's last platform error code (feed updates leave 0x0B00, 0x4000). */
TORVALE_API int NLIBCErrGet(void) TORVALE_NOEXCEPT;
TORVALE_API void NLIBCErrSet(int code) TORVALE_NOEXCEPT;

/* ---- Storage, share, ownership and notification utilities ------------------------- */

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_UTILS_H */
