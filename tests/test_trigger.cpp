#include <cerrno>
#include <cstdlib>
#include <sys/sysinfo.h>

#include "tests/fixture.h"
#include "tests/shm_segments.h"
#include "torvale/task.h"

using Trigger = DbTest;

TEST_F(Trigger, SegmentsAreAttachedOnceTheyFitAndKeptWhenTheOwnerRemovesThem) {
    DaemonSegments segments;
    in_fresh_process([&] {
        EXPECT_EQ(NAVODownloadTrigger(), 0);
        EXPECT_EQ(DownloadTriggerProgress(), 0);
        EXPECT_EQ(shmget(DOWNLOAD_SHM_TRIGGER_KEY, 0, 0), -1) << "nothing is created";
        EXPECT_TRUE(logs().empty()) << "a missing segment is no fault";
        // Something else holds the keys with smaller segments: not touched, worth a line.
        volatile int *small_change = segments.create(DOWNLOAD_SHM_TRIGGER_KEY, 2);
        volatile int *small_progress = segments.create(DOWNLOAD_SHM_PROGRESS_KEY, 4);
        EXPECT_EQ(NAVODownloadTrigger(), 0);
        EXPECT_EQ(DownloadTriggerProgress(), 0);
        EXPECT_EQ(small_change[0] & 0xffff, 0);
        EXPECT_EQ(small_progress[0], 0);
        EXPECT_EQ(logs(), (std::vector<std::string>{
                              "taskmgt:# Failed to attach shared memory. Invalid argument"}));
        // The daemon starts: no failed attach was cached, so the next call finds them.
        DaemonSegments::remove(DOWNLOAD_SHM_TRIGGER_KEY);
        DaemonSegments::remove(DOWNLOAD_SHM_PROGRESS_KEY);
        volatile int *change = segments.create(DOWNLOAD_SHM_TRIGGER_KEY, 4);
        volatile int *progress = segments.create(DOWNLOAD_SHM_PROGRESS_KEY, 8);
        progress[1] = -7;
        EXPECT_EQ(NAVODownloadTrigger(), 0);
        EXPECT_EQ(change[0], 1);
        EXPECT_EQ(DownloadTriggerProgress(), 0);
        struct sysinfo info {};
        sysinfo(&info);
        EXPECT_LE(std::labs(progress[1] - info.uptime), 1) << progress[1];
        EXPECT_EQ(DownloadTriggerProgress(), 1);
        // Gone by key but still mapped: later calls go on writing the old memory, so they
        // do not look the segments up again.
        DaemonSegments::remove(DOWNLOAD_SHM_TRIGGER_KEY);
        DaemonSegments::remove(DOWNLOAD_SHM_PROGRESS_KEY);
        change[0] = progress[0] = 0; // the owner resets the flags
        EXPECT_EQ(NAVODownloadTrigger(), 0);
        EXPECT_EQ(DownloadTriggerProgress(), 0);
        EXPECT_EQ(change[0] + progress[0], 2);
        EXPECT_EQ(logs().size(), 1u);
    });
}

TEST_F(Trigger, OwnerCreatesAttachesDetachesAndRemoves) {
    DaemonSegments segments;
    auto *made = static_cast<int *>(NAVODownloadShmAttach(DOWNLOAD_SHM_PROGRESS_KEY, 8, 1));
    ASSERT_NE(made, nullptr);
    shmid_ds stat{};
    ASSERT_EQ(shmctl(shmget(DOWNLOAD_SHM_PROGRESS_KEY, 0, 0), IPC_STAT, &stat), 0);
    EXPECT_EQ(stat.shm_perm.mode & 0777, 0666u);
    // Creating again, for as many bytes or fewer, attaches the same segment.
    auto *again = static_cast<int *>(NAVODownloadShmAttach(DOWNLOAD_SHM_PROGRESS_KEY, 4, 1));
    ASSERT_NE(again, nullptr);
    made[1] = 42;
    EXPECT_EQ(again[1], 42);
    EXPECT_EQ(NAVODownloadShmAttach(DOWNLOAD_SHM_PROGRESS_KEY, 16, 0), nullptr);

    EXPECT_EQ(NAVODownloadShmDetach(again) + NAVODownloadShmDetach(made), 0);
    EXPECT_EQ(NAVODownloadShmDetach(made), -1);
    EXPECT_EQ(NAVODownloadShmRemove(DOWNLOAD_SHM_PROGRESS_KEY, 8), 0);
    EXPECT_EQ(NAVODownloadShmRemove(DOWNLOAD_SHM_PROGRESS_KEY, 8), -1);
    EXPECT_EQ(
        logs(),
        (std::vector<std::string>{
            "trigger (#) Failed to detach shared memory.",
            "trigger (#) Get shared memory fail. Might not exist.(No such file or directory)"}));
}
