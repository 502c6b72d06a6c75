// File-system types, from statfs.
#include <cerrno>
#include <sys/vfs.h>

#include "platform/navosdk.h"

namespace {

// Magic numbers of statfs's f_type, as the kernel defines them.
constexpr unsigned long kMsdosMagic = 0x4d44;     // msdos and vfat
constexpr unsigned long kExfatMagic = 0x2011BAB0; // exfat
constexpr unsigned long kNtfsMagic = 0x5346544e;  // ntfs and ntfs3
constexpr unsigned long kFuseMagic = 0x65735546;  // fuseblk: how ntfs-3g mounts NTFS disks
constexpr unsigned long kExtMagic = 0xEF53;       // ext2, ext3, ext4
constexpr unsigned long kBtrfsMagic = 0x9123683E;

} // namespace

namespace torvale::platform {

// FAT-family and NTFS-family file systems have no owner per file (the mount sets one
// for all), so code 1 and 4 tell callers to leave ownership alone. External disks on
// this host carry NTFS through FUSE, so FUSE mounts count as NTFS.
int fs_type_code(unsigned long magic) noexcept {
    switch (magic) {
    case kMsdosMagic:
    case kExfatMagic:
        return kNavoFsFat;
    case kNtfsMagic:
    case kFuseMagic:
        return kNavoFsNtfs;
    case kExtMagic:
        return kNavoFsExt;
    case kBtrfsMagic:
        return kNavoFsBtrfs;
    default:
        return kNavoFsOther;
    }
}

} // namespace torvale::platform

int NAVOGetFSType(const char *path, int flags) noexcept {
    if (path == nullptr || flags != 0) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    struct statfs st;
    int rc;
    do {
        rc = statfs(path, &st);
    } while (rc != 0 && errno == EINTR);
    if (rc != 0) {
        NLIBCErrSet(kNavoErrSystem);
        return -1;
    }
    // f_type is signed on some targets; the magic numbers are 32-bit.
    return torvale::platform::fs_type_code(static_cast<unsigned long>(st.f_type) & 0xffffffffUL);
}
