// The daemon's two shared-memory segments, made and removed in a test as their owner
// would, and a way to run library calls in a process whose attachments start empty.
#pragma once

#include <cerrno>
#include <fcntl.h>
#include <functional>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/ipc.h>
#include <sys/shm.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

#include "torvale/task.h"

// Holds both keys for the test: the keys are fixed, and test runs from other build trees
// on this machine use them too, so a lock file serialises the holders. Leftovers of a
// crashed run are removed on entry; everything made here is detached and removed on exit,
// whatever the test's outcome.
class DaemonSegments {
  public:
    DaemonSegments()
        : lock_(open("/tmp/torvale-shm-tests.lock", O_CREAT | O_RDWR | O_CLOEXEC, 0666)) {
        flock(lock_, LOCK_EX);
        remove_all();
    }
    ~DaemonSegments() {
        for (void *addr : attached_)
            shmdt(addr);
        remove_all();
        close(lock_); // releases the lock
    }
    // Creates the segment as the daemon does (IPC_CREAT, mode 0666) and attaches it here.
    volatile int *create(int key, size_t size) {
        void *addr = shmat(shmget(key, size, IPC_CREAT | 0666), nullptr, 0);
        if (addr == reinterpret_cast<void *>(-1)) {
            ADD_FAILURE() << "segment " << key << ": " << errno;
            return nullptr;
        }
        attached_.push_back(addr);
        return static_cast<volatile int *>(addr);
    }
    // Removes the segment while this guard stays attached, as a daemon that restarts.
    static void remove(int key) { shmctl(shmget(key, 0, 0), IPC_RMID, nullptr); }

  private:
    static void remove_all() {
        remove(DOWNLOAD_SHM_TRIGGER_KEY);
        remove(DOWNLOAD_SHM_PROGRESS_KEY);
    }
    int lock_;
    std::vector<void *> attached_;
};

// Runs `body` in a forked child, whose cached attachments start empty whatever ran in
// this process before. The child's expectations count: it exits 1 when one failed. It
// must not use the fixture's raw connection, which belongs to the parent.
inline void in_fresh_process(const std::function<void()> &body) {
    std::fflush(nullptr);
    pid_t pid = fork();
    ASSERT_NE(pid, -1);
    if (pid == 0) {
        body();
        std::fflush(nullptr);
        _exit(::testing::Test::HasFailure() ? 1 : 0);
    }
    int status = 0;
    ASSERT_EQ(waitpid(pid, &status, 0), pid);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "the child's checks failed";
}
