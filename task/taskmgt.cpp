// Task creation: links and files become waiting rows of download_queue. Also the
// progress request, the one signal that a web handler sends along with a listing.
#include <cerrno>
#include <sys/sysinfo.h>

#include "platform/log.h"
#include "torvale/task.h"

namespace {

constexpr char kLogUnit[] = "taskmgt";

// This side's own attachment to the progress segment, kept for the process's life.
volatile int *g_progress_request = nullptr;

} // namespace

extern "C" {

TORVALE_API int DownloadTriggerProgress(void) noexcept {
    if (g_progress_request == nullptr)
        g_progress_request = static_cast<volatile int *>(
            NAVODownloadShmAttach(DOWNLOAD_SHM_PROGRESS_KEY, DOWNLOAD_SHM_PROGRESS_SIZE, 0));
    if (g_progress_request == nullptr) {
        // No segment yet: the daemon is not running, which is no fault of the caller.
        if (errno != ENOENT)
            TV_LOG("%s:%d Failed to attach shared memory. %m");
        return 0;
    }
    // The stamp goes first, so that a daemon that sees the flag also sees a fresh time.
    struct sysinfo info {};
    if (sysinfo(&info) == 0)
        g_progress_request[1] = static_cast<int>(info.uptime);
    int was = g_progress_request[0];
    g_progress_request[0] = 1;
    return was;
}

} // extern "C"
