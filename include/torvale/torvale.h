/*
 * Torvale: the whole exported interface.
 *
 * The plain families (database, task, queue, user, utilities) have C linkage and this
 * header compiles as C; the RSS family works with std::string and Json::Value and is
 * declared only to C++ callers. See torvale/types.h for the conventions that every
 * function follows.
 */
#ifndef TORVALE_TORVALE_H
#define TORVALE_TORVALE_H

#include "torvale/database.h"
#include "torvale/queue.h"
#include "torvale/task.h"
#include "torvale/types.h"
#include "torvale/user.h"
#include "torvale/utils.h"

#ifdef __cplusplus
#include "torvale/rss.h"
#endif

#endif /* TORVALE_TORVALE_H */
