/*
 * Torvale: the DownloadUser family: per-user settings.
 */
#ifndef TORVALE_USER_H
#define TORVALE_USER_H

#include "torvale/types.h"

#ifdef __cplusplus
extern "C" {
#endif

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_USER_H */
