// The change trigger: the daemon's shared-memory segments, and the module magic block.
#include <cerrno>
#include <cstring>
#include <sys/ipc.h>
#include <sys/shm.h>

#include "platform/log.h"
#include "torvale/task.h"

namespace {

constexpr char kLogUnit[] = "trigger";

constexpr int kShmMode = 0666;

// Attached on first use and kept for the life of the process, so that pulling the
// trigger costs one store. A failed attach leaves it null: the next call tries again.
volatile int *g_trigger = nullptr;

// What a PostgreSQL 8.3 server checks before it loads a module.
constexpr DownloadModuleMagic kModuleMagic = {sizeof(DownloadModuleMagic), 803, 100, 32, 64};
static_assert(sizeof(DownloadModuleMagic) == 20, "the magic block is five 32-bit words");

} // namespace

extern "C" {

TORVALE_API void *NAVODownloadShmAttach(int key, size_t size, int create) noexcept {
    int id = shmget(key, size, create != 0 ? IPC_CREAT | kShmMode : kShmMode);
    if (id == -1)
        return nullptr;
    void *addr = shmat(id, nullptr, 0);
    return addr != reinterpret_cast<void *>(-1) ? addr : nullptr;
}

TORVALE_API int NAVODownloadShmDetach(void *addr) noexcept {
    if (shmdt(addr) == -1) {
        TV_LOG("%s (%d) Failed to detach shared memory.");
        return -1;
    }
    return 0;
}

TORVALE_API int NAVODownloadShmRemove(int key, size_t size) noexcept {
    int id = shmget(key, size, kShmMode);
    if (id == -1) {
        TV_LOG("%s (%d) Get shared memory fail. Might not exist.(%s)", std::strerror(errno));
        return -1;
    }
    if (shmctl(id, IPC_RMID, nullptr) == -1) {
        TV_LOG("%s (%d) Failed to remove shared memory.(%s)", std::strerror(errno));
        return -1;
    }
    return 0;
}

TORVALE_API int NAVODownloadTrigger(void) noexcept {
    if (g_trigger == nullptr)
        g_trigger = static_cast<volatile int *>(
            NAVODownloadShmAttach(DOWNLOAD_SHM_TRIGGER_KEY, DOWNLOAD_SHM_TRIGGER_SIZE, 0));
    // No segment means no daemon to wake: not worth a line in the log.
    if (g_trigger != nullptr)
        g_trigger[0] = 1;
    return 0;
}

TORVALE_API const DownloadModuleMagic *Pg_magic_func(void) noexcept {
    return &kModuleMagic;
}

} // extern "C"
