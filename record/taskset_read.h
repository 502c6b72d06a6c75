// The common column reader of the single-task reads. Internal.
#pragma once

// Copies the `column` field of task `task_id` into `buf` of `size` bytes, cut to
// size-1 bytes and terminated (NULL reads as ""). `column` goes into the statement as
// it is: only the library's own column names are passed. Returns 0, or -1 (negative
// id, null column or buffer, size 0 or less, no connection, failing statement, no such
// task).
int DownloadTaskFieldGet(int task_id, const char *column, char *buf, int size) noexcept;
