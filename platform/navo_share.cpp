// Shares, read from our registry file: "name<TAB>path<TAB>flags" per line.
#include <cerrno>
#include <cstdlib>
#include <fstream>
#include <new>
#include <string>
#include <sys/stat.h>
#include <vector>

#include "platform/navosdk.h"
#include "platform/paths.h"

namespace {

// One registry line, or false for a comment, a blank or a malformed line.
bool parse_line(const std::string &line, NAVOSHARE &share) {
    if (line.empty() || line[0] == '#')
        return false;
    size_t tab1 = line.find('\t');
    size_t tab2 = tab1 == std::string::npos ? tab1 : line.find('\t', tab1 + 1);
    if (tab1 == 0 || tab2 == std::string::npos || tab2 == tab1 + 1 || tab2 + 1 >= line.size())
        return false;
    std::string flags = line.substr(tab2 + 1);
    if (flags.back() == '\r')
        flags.pop_back();
    char *end = nullptr;
    errno = 0;
    unsigned long status = std::strtoul(flags.c_str(), &end, 0);
    if (errno != 0 || end == flags.c_str() || *end != '\0' || flags[0] == '-')
        return false;
    share.name = line.substr(0, tab1);
    share.path = line.substr(tab1 + 1, tab2 - tab1 - 1);
    share.status = static_cast<unsigned>(status);
    return true;
}

// Calls `visit(share)` for every share until it returns true. False when the registry
// exists but cannot be read; a host without a registry has no shares.
template <typename Visit> bool each_share(Visit visit) {
    std::string path = torvale::paths::under_root(torvale::paths::kSharesRegistry);
    std::ifstream in(path);
    if (!in.is_open()) {
        struct stat st;
        if (stat(path.c_str(), &st) != 0 && errno == ENOENT)
            return true;
        NLIBCErrSet(kNavoErrSystem);
        return false;
    }
    std::string line;
    NAVOSHARE share;
    while (std::getline(in, line))
        if (parse_line(line, share) && visit(share))
            return true;
    if (in.bad()) {
        NLIBCErrSet(kNavoErrSystem);
        return false;
    }
    return true;
}

} // namespace

int NAVOShareGet(const char *name, NAVOSHARE **share) noexcept {
    if (name == nullptr || *name == '\0' || share == nullptr) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    try {
        NAVOSHARE found;
        bool hit = false;
        bool ok = each_share([&](const NAVOSHARE &s) {
            if (s.name != name)
                return false;
            found = s;
            hit = true;
            return true;
        });
        if (!ok)
            return -1;
        if (!hit) {
            NLIBCErrSet(kNavoErrNoSuchShare);
            return -1;
        }
        *share = new NAVOSHARE(std::move(found));
        return 0;
    } catch (const std::bad_alloc &) {
        NLIBCErrSet(kNavoErrNoMemory);
        return -1;
    }
}

void NAVOShareFree(NAVOSHARE *share) noexcept {
    delete share;
}

int NAVOShareEnumByMntPath(NLIBCSzList *list, const char *mount_path) noexcept {
    if (list == nullptr || mount_path == nullptr) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    try {
        int count = 0;
        bool ok = each_share([&](const NAVOSHARE &s) {
            if (s.path == mount_path) {
                list->items.push_back(s.name);
                ++count;
            }
            return false;
        });
        return ok ? count : -1;
    } catch (const std::bad_alloc &) {
        NLIBCErrSet(kNavoErrNoMemory);
        return -1;
    }
}
