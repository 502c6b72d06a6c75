// Database-free utilities: link classification and free file names.
#include <cstdio>
#include <cstring>
#include <strings.h>
#include <sys/stat.h>

#include "platform/log.h"
#include "torvale/utils.h"

namespace {

constexpr char kLogUnit[] = "utilswithoutdb";

constexpr char kMagnetPrefix[] = "magnet:?";
constexpr char kFtpsPrefix[] = "ftps://";
constexpr char kSftpPrefix[] = "sftp://";

// The highest counter tried before giving up on finding a free name.
constexpr int kLastCounter = 268435453;
constexpr size_t kNameBytes = 1024;

bool has_prefix(const char *link, const char *prefix) {
    return strncasecmp(link, prefix, std::strlen(prefix)) == 0;
}

bool exists(const char *path) {
    struct stat st;
    return stat(path, &st) == 0;
}

// A candidate that does not fit would name some other file, so it is refused rather
// than cut, and the buffer is cleared.
bool fits(int len, char *out, int size) {
    if (len >= 0 && len < size)
        return true;
    TV_LOG("%s:%d Buffer size too small, string length [%d], buffer size [%d]", len + 1, size);
    out[0] = '\0';
    return false;
}

} // namespace

extern "C" {

TORVALE_API int DownloadUtilsIsMagnetLink(const char *link) noexcept {
    if (link == nullptr) {
        TV_LOG("%s:%d Bad parameter");
        return 0;
    }
    return has_prefix(link, kMagnetPrefix) ? 1 : 0;
}

TORVALE_API int DownloadUtilsIsFTPEncrptionLink(const char *link) noexcept {
    if (link == nullptr) {
        TV_LOG("%s:%d Bad parameter");
        return 0;
    }
    if (has_prefix(link, kFtpsPrefix))
        return 1;
    if (has_prefix(link, kSftpPrefix))
        return 2;
    return 0;
}

TORVALE_API int NAVODLValidateFilename(char *out, int size, const char *dir,
                                       const char *name) noexcept {
    if (dir == nullptr || name == nullptr || out == nullptr || size < 1) {
        TV_LOG("%s:%d Bad parameter");
        return -1;
    }
    char work[kNameBytes];
    std::snprintf(work, sizeof work, "%s", name);
    const size_t cap = static_cast<size_t>(size);
    if (!fits(std::snprintf(out, cap, "%s/%s", dir, work), out, size))
        return -1;
    char *dot = std::strrchr(work, '.');
    const char *ext = "";
    if (dot != nullptr) {
        *dot = '\0';
        ext = dot + 1;
    }
    const char *sep = dot != nullptr ? "." : "";
    for (int counter = 0; exists(out) && counter <= kLastCounter;) {
        ++counter;
        if (!fits(std::snprintf(out, cap, "%s/%s%d%s%s", dir, work, counter, sep, ext), out, size))
            return -1;
    }
    return 0;
}

} // extern "C"
