/*
 * Torvale: the DownloadUser family: per-user settings.
 */
#ifndef TORVALE_USER_H
#define TORVALE_USER_H

#include "torvale/types.h"

#ifdef __cplusplus
extern "C" {
#endif

/*
 * Each function below takes the user's name, matched case-insensitively; a null or
 * empty name is refused with -1. A user's row is created by the first successful
 * DownloadUserShareSet or DownloadUserWatchInfoSet, for users the host knows only.
 */

/*
 * Stores `share` as the user's default destination share. Returns 0, or -1 (null or
 * empty arguments, a user the host does not know, a failing statement).
 */
TORVALE_API int DownloadUserShareSet(const char *user, const char *share) TORVALE_NOEXCEPT;

/*
 * Copies the user's default destination share into `share` (cut to size-1 bytes).
 * Returns 1 when copied and the user is enabled, 2 when copied and the user is
 * disabled, 0 when the user has no setting (the buffer is cleared), -1 on failure.
 */
TORVALE_API int DownloadUserShareGet(const char *user, char *share, int size) TORVALE_NOEXCEPT;

/*
 * Reads the user's watch-folder settings: copies the folder into `folder` (cut to
 * size-1 bytes) and sets *enabled and *delete_torrent to 1 or 0. Returns 1 when found,
 * 0 when the user has no setting (the buffer is cleared, the ints are left alone), -1
 * on failure (any null pointer, size below 1, a failing statement).
 */
TORVALE_API int DownloadUserWatchInfoGet(const char *user, int *enabled, int *delete_torrent,
                                         char *folder, int size) TORVALE_NOEXCEPT;

/*
 * Switches the user's watch folder on (enable non-zero: `folder` required, stored with
 * the delete-torrent flag) or off (enable 0: `folder` may be null; a stored folder and
 * flag are kept). Returns 0, or -1 (bad arguments, a user the host does not know, a
 * failing statement).
 */
TORVALE_API int DownloadUserWatchInfoSet(const char *user, int enable, int delete_torrent,
                                         const char *folder) TORVALE_NOEXCEPT;

/*
 * Tells whether `folder` is free to watch for this user: 1 when no other enabled user
 * watches exactly that folder (bytes compared, so "a/" and "a" differ), 0 when one does,
 * -1 on failure (null folder, a failing statement).
 */
TORVALE_API int DownloadCheckWatchfolder(const char *user, const char *folder) TORVALE_NOEXCEPT;

/*
 * Disables the user (disabled non-zero; also switches the watch folder off) or enables
 * the user again (the watch folder stays off). A user without a row is no failure.
 * Returns 0, or -1.
 */
TORVALE_API int DownloadUserDisable(const char *user, int disabled) TORVALE_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_USER_H */
