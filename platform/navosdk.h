// Our stand-ins for the platform's user, group, share, file-system and indexing
// services. Internal: linked into libtorvale.so, not exported. Each failure leaves a
// code for NLIBCErrGet (platform/navocore.h).
#pragma once

#include <memory>
#include <string>
#include <sys/types.h>

#include "platform/navocore.h"

// ---- Users and groups (the host's name service) ------------------------------------

struct NAVOUSER {
    std::string name;
    uid_t uid = 0;
    gid_t gid = 0; // primary group
};

// Looks the user up. Returns 0 and a record released with NAVOUserFree, or -1 (null
// arguments, no such user: kNavoErrNoSuchUser, name service failure).
int NAVOUserGet(const char *name, NAVOUSER **user) noexcept;
void NAVOUserFree(NAVOUSER *user) noexcept;

// 1 when the user is a member of the group "administrators" (primary or supplementary),
// 0 when not (also when the host has no such group), -1 on failure (unknown user).
int NAVOGroupIsAdminGroupMem(const char *user) noexcept;

// ---- Shares (the registry file kSharesRegistry) ---------------------------------------
//
// One share a line: name, a tab, the share path ("/volume1/video", or the mount
// directory of an external partition), a tab, the status flags as an integer in C
// notation. Lines starting with '#' and blank lines are skipped; malformed lines too.

inline constexpr unsigned kNavoShareEncrypted = 0x2;
inline constexpr unsigned kNavoShareEncryptedMounted = 0x4;

struct NAVOSHARE {
    std::string name;
    std::string path;
    unsigned status = 0;
};

// Looks the share up by name (exact bytes). Returns 0 and a record released with
// NAVOShareFree, or -1 (no such share: kNavoErrNoSuchShare; unreadable registry).
int NAVOShareGet(const char *name, NAVOSHARE **share) noexcept;
void NAVOShareFree(NAVOSHARE *share) noexcept;

// Appends to `list` the names of the shares whose path equals `mount_path`, in
// registry order. Returns how many, or -1.
int NAVOShareEnumByMntPath(NLIBCSzList *list, const char *mount_path) noexcept;

// ---- File-system types --------------------------------------------------------------

inline constexpr int kNavoFsOther = 0;
inline constexpr int kNavoFsFat = 1; // msdos, vfat, exfat: no owners to change
inline constexpr int kNavoFsExt = 2; // ext2, ext3, ext4
inline constexpr int kNavoFsBtrfs = 3;
inline constexpr int kNavoFsNtfs = 4; // ntfs, ntfs3 and fuseblk (ntfs-3g): owners fixed at mount

// The type code of the file system holding `path` (`flags` must be 0), or -1.
int NAVOGetFSType(const char *path, int flags) noexcept;

namespace torvale::platform {
// The code for a statfs f_type magic number.
int fs_type_code(unsigned long magic) noexcept;
} // namespace torvale::platform

// ---- Media indexing ------------------------------------------------------------------
//
// The indexing service is outside the system: these queue "kind path" lines in its spool
// files (kIndexSpool for media, kFileIndexSpool for file search). Kinds: 1 file,
// 3 directory. Returns 0, or -1 (bad arguments, a path holding a line break, a spool
// that cannot be written).

inline constexpr int kNavoIndexFile = 1;
inline constexpr int kNavoIndexDirectory = 3;

int NLIBNavoIndexAdd(const char *path, int kind) noexcept;
int NLIBNavoFileIndexAdd(const char *path, int flags, int kind) noexcept;

// ---- Ownership guards ------------------------------------------------------------------

namespace torvale::platform {

struct UserFree {
    void operator()(NAVOUSER *u) const noexcept { NAVOUserFree(u); }
};
using User = std::unique_ptr<NAVOUSER, UserFree>;

struct ShareFree {
    void operator()(NAVOSHARE *s) const noexcept { NAVOShareFree(s); }
};
using Share = std::unique_ptr<NAVOSHARE, ShareFree>;

} // namespace torvale::platform
