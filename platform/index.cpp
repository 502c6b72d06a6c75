// Media and file indexing: requests queued as "kind path" lines in spool files that the
// indexing service (outside the system) consumes.
#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/navosdk.h"
#include "platform/paths.h"

namespace {

// Creates every missing directory above `file`.
bool make_parents(const std::string &file) {
    for (size_t slash = file.find('/', 1); slash != std::string::npos;
         slash = file.find('/', slash + 1)) {
        std::string dir = file.substr(0, slash);
        if (mkdir(dir.c_str(), 0755) != 0 && errno != EEXIST)
            return false;
    }
    return true;
}

int queue(const char *spool, const char *path, int kind) noexcept {
    // A line break in the path would forge a second request.
    if (path == nullptr || *path == '\0' || std::strpbrk(path, "\r\n") != nullptr ||
        (kind != kNavoIndexFile && kind != kNavoIndexDirectory)) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    try {
        std::string file = torvale::paths::under_root(spool);
        std::string line = std::to_string(kind) + " " + path + "\n";
        if (!make_parents(file)) {
            NLIBCErrSet(kNavoErrSystem);
            return -1;
        }
        int fd = ::open(file.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0644);
        if (fd < 0) {
            NLIBCErrSet(kNavoErrSystem);
            return -1;
        }
        // One write per request: appends of a line stay whole between processes.
        ssize_t n = ::write(fd, line.data(), line.size());
        bool ok = n == static_cast<ssize_t>(line.size());
        ok = ::close(fd) == 0 && ok;
        if (!ok) {
            NLIBCErrSet(kNavoErrSystem);
            return -1;
        }
        return 0;
    } catch (const std::bad_alloc &) {
        NLIBCErrSet(kNavoErrNoMemory);
        return -1;
    }
}

} // namespace

int NLIBNavoIndexAdd(const char *path, int kind) noexcept {
    return queue(torvale::paths::kIndexSpool, path, kind);
}

int NLIBNavoFileIndexAdd(const char *path, int flags, int kind) noexcept {
    if (flags != 0) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    return queue(torvale::paths::kFileIndexSpool, path, kind);
}
