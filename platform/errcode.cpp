// The platform's last-error code, one per thread, as the platform keeps it.
#include "platform/navocore.h"

namespace {
thread_local int t_last_error = 0;
}

extern "C" {

TORVALE_API int NLIBCErrGet(void) noexcept {
    return t_last_error;
}

TORVALE_API void NLIBCErrSet(int code) noexcept {
    t_last_error = code;
}

} // extern "C"
