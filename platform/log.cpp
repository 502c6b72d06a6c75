#include "platform/log.h"

#include <cstdarg>
#include <cstdio>
#include <new>
#include <syslog.h>

namespace torvale {

namespace {
LogSink g_sink = nullptr;
}

void log_error(const char *fmt, ...) noexcept {
    // Long statements are logged whole: size the line first, fall back to the heap.
    char small[1024];
    va_list ap;
    va_start(ap, fmt);
    va_list copy;
    va_copy(copy, ap);
    int len = std::vsnprintf(small, sizeof small, fmt, ap);
    va_end(ap);
    char *line = small;
    char *heap = nullptr;
    if (len >= static_cast<int>(sizeof small)) {
        heap = new (std::nothrow) char[static_cast<size_t>(len) + 1];
        if (heap != nullptr) {
            std::vsnprintf(heap, static_cast<size_t>(len) + 1, fmt, copy);
            line = heap;
        }
    }
    va_end(copy);
    if (len >= 0) {
        syslog(LOG_ERR, "%s", line);
        if (g_sink != nullptr)
            g_sink(line);
    }
    delete[] heap;
}

void log_set_sink(LogSink sink) noexcept {
    g_sink = sink;
}

} // namespace torvale
