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
    DaemonSegments() {
        lock_ = open("/tmp/torvale-shm-tests.lock", O_CREAT | O_RDWR | O_CLOEXEC, 0666);
        if (lock_ != -1)
            flock(lock_, LOCK_EX);
        remove_all();
    }
    ~DaemonSegments() {
        for (void *addr : attached_)
            shmdt(addr);
        remove_all();
        if (lock_ != -1)
            close(lock_); // releases the lock
    }
    DaemonSegments(const DaemonSegments &) = delete;
    DaemonSegments &operator=(const DaemonSegments &) = delete;

    // Creates the segment as the daemon does (IPC_CREAT, mode 0666) and attaches it here.
    volatile int *create(int key, size_t size) {
        int id = shmget(key, size, IPC_CREAT | 0666);
        EXPECT_NE(id, -1) << "shmget(" << key << ", " << size << "): " << errno;
        return attach(id);
    }
    volatile int *create_trigger() {
        return create(DOWNLOAD_SHM_TRIGGER_KEY, DOWNLOAD_SHM_TRIGGER_SIZE);
    }
    volatile int *create_progress() {
        return create(DOWNLOAD_SHM_PROGRESS_KEY, DOWNLOAD_SHM_PROGRESS_SIZE);
    }

    // Removes the segment while this guard stays attached, as a daemon that restarts.
    static void remove(int key) {
        int id = shmget(key, 0, 0);
        if (id != -1)
            shmctl(id, IPC_RMID, nullptr);
    }
    static bool exists(int key) { return shmget(key, 0, 0) != -1; }

  private:
    volatile int *attach(int id) {
        void *addr = id != -1 ? shmat(id, nullptr, 0) : reinterpret_cast<void *>(-1);
        if (addr == reinterpret_cast<void *>(-1))
            return nullptr;
        attached_.push_back(addr);
        return static_cast<volatile int *>(addr);
    }
    static void remove_all() {
        remove(DOWNLOAD_SHM_TRIGGER_KEY);
        remove(DOWNLOAD_SHM_PROGRESS_KEY);
    }

    int lock_ = -1;
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
