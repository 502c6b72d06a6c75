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
 * Copies the user's default destination share into `share` (cut to size-1 bytes).
 * Returns 1 when copied and the user is enabled, 2 when copied and the user is
 * disabled, 0 when the user has no setting (the buffer is cleared), -1 on failure.
 */
TORVALE_API int DownloadUserShareGet(const char *user, char *share, int size) TORVALE_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_USER_H */
