// Our stand-ins for the platform's core C services: the last-error code, string
// lists, tokenising, key-value files and program execution. Internal: linked into
// libtorvale.so, not exported (NLIBCErrGet/NLIBCErrSet aside, declared in
// torvale/utils.h).
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "torvale/utils.h"

// Last-error codes this layer leaves behind a failure (read with NLIBCErrGet). Feed
// updates leave their own 0x0B00 and 0x4000.
inline constexpr int kNavoErrSystem = 0x0100;      // a system call failed
inline constexpr int kNavoErrNoMemory = 0x0200;    // out of memory
inline constexpr int kNavoErrBadParam = 0x0D00;    // a missing or malformed argument
inline constexpr int kNavoErrNoSuchUser = 0x1D00;  // the name service knows no such user
inline constexpr int kNavoErrNoSuchShare = 0x2200; // the shares registry holds no such share
inline constexpr int kNavoErrChildFailed = 0x2A00; // a program could not run or failed

// ---- String lists -----------------------------------------------------------------

// A growable list of texts; `capacity` is only the first reservation.
struct NLIBCSzList {
    std::vector<std::string> items;
};

// A new empty list, released with NLIBCSzListFree; null on failure.
NLIBCSzList *NLIBCSzListAlloc(int capacity) noexcept;
void NLIBCSzListFree(NLIBCSzList *list) noexcept;
// The number of texts in the list (0 for null).
int NLIBCSzListCount(const NLIBCSzList *list) noexcept;
// The text at `index`, valid until the list changes; null when out of range.
const char *NLIBCSzListGet(const NLIBCSzList *list, int index) noexcept;
// Appends a copy of `text`. Returns 0, or -1 (null argument, no memory).
int NLIBCSzListPush(NLIBCSzList *list, const char *text) noexcept;

// Appends the non-empty pieces of `text` between any of the `delims` bytes, in order.
// Returns the number appended, or -1 (null argument, no memory).
int NLIBCStrTok(const char *text, const char *delims, NLIBCSzList *list) noexcept;

namespace torvale::platform {
struct SzListFree {
    void operator()(NLIBCSzList *l) const noexcept { NLIBCSzListFree(l); }
};
using SzList = std::unique_ptr<NLIBCSzList, SzListFree>;
} // namespace torvale::platform

// ---- Key-value files --------------------------------------------------------------
//
// One key a line, `key="value"`; other lines are kept as they are. A key is matched
// whole at the start of its line.

// Copies the first value of `key` into `buf` (cut to size-1 bytes). Returns 1 when found,
// 0 when the key (or the whole file) is absent, -1 on failure (bad arguments, a file
// that cannot be read). `flags` must be 0.
int NLIBCFileGetKeyValue(const char *file, const char *key, char *buf, int size,
                         int flags) noexcept;

// Writes `key` with `value` using `line_format`, which holds two "%s" (key, value) and
// nothing else but "%%". The line replaces the key's first line (later ones are
// dropped) or is appended. The file is replaced whole (temporary file, fsync, rename),
// so readers see the old file or the new one; writers in other processes are
// serialised through a lock on the directory. Keys may not hold '=', keys and values
// may not hold line breaks. Returns 0, or -1.
int NLIBCFileSetKeyValue(const char *file, const char *key, const char *value,
                         const char *line_format) noexcept;

// Non-zero when `key` holds exactly `value`. `flags` must be 0.
int NLIBCFileCheckKeyValue(const char *file, const char *key, const char *value,
                           int flags) noexcept;

// ---- Program execution ------------------------------------------------------------
//
// The child's standard input, output and error are /dev/null. A program that exits
// with 0 gives 0; one that cannot be started, is killed or cannot be waited for gives
// -1 (a process ignoring SIGCHLD cannot wait); any other exit gives its status.

// Runs `program` with up to four texts (ended by a null pointer) and waits.
int NLIBCExec(const char *program, ...) noexcept;
// Runs `program` with `argv` (its first element the program, ended by a null pointer).
// With `wait` 0 returns 0 once started, and the caller reaps the child.
int NLIBCExecv(const char *program, const char *const argv[], int wait) noexcept;
