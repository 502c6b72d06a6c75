/*
 * Torvale: the DownloadRss family: RSS feeds, items and filters (C++).
 */
#ifndef TORVALE_RSS_H
#define TORVALE_RSS_H

#include "torvale/types.h"

#endif /* TORVALE_RSS_H */
