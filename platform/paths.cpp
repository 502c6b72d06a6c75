#include "platform/paths.h"

#include <cstdlib>

namespace torvale::paths {

std::string root() {
    const char *env = secure_getenv("TORVALE_ROOT");
    std::string r = env != nullptr ? env : "";
    while (!r.empty() && r.back() == '/')
        r.pop_back();
    return r;
}

std::string under_root(const char *absolute) {
    return root() + absolute;
}

} // namespace torvale::paths
