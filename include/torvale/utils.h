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

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_UTILS_H */
