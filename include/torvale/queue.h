/*
 * Torvale: the DownloadQueue family: queue listing.
 */
#ifndef TORVALE_QUEUE_H
#define TORVALE_QUEUE_H

#include "torvale/types.h"

#ifdef __cplusplus
extern "C" {
#endif

#ifdef __cplusplus
}
#endif

#endif /* TORVALE_QUEUE_H */
