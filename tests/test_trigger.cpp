#include <cerrno>
#include <cstdlib>
#include <sys/sysinfo.h>

#include "tests/fixture.h"
#include "tests/shm_segments.h"
#include "torvale/task.h"

namespace {

long uptime_now() {
    struct sysinfo info {};
    sysinfo(&info);
    return info.uptime;
}

} // namespace

using Trigger = DbTest;

TEST_F(Trigger, MissingSegmentsAreSilentAndAttachedOnceTheyAppear) {
    DaemonSegments segments;
    in_fresh_process([&] {
        EXPECT_EQ(NAVODownloadTrigger(), 0);
        EXPECT_EQ(DownloadTriggerProgress(), 0);
        EXPECT_TRUE(logs().empty()) << logs()[0];
        EXPECT_FALSE(DaemonSegments::exists(DOWNLOAD_SHM_TRIGGER_KEY)) << "nothing is created";
        EXPECT_FALSE(DaemonSegments::exists(DOWNLOAD_SHM_PROGRESS_KEY));

        // The daemon starts: the failed attach was not cached, so the next call finds them.
        volatile int *change = segments.create_trigger();
        volatile int *progress = segments.create_progress();
        EXPECT_EQ(NAVODownloadTrigger(), 0);
        EXPECT_EQ(change[0], 1);
        EXPECT_EQ(DownloadTriggerProgress(), 0);
        EXPECT_EQ(progress[0], 1);
        EXPECT_TRUE(logs().empty());
    });
}

TEST_F(Trigger, ProgressRequestReturnsThePreviousFlagAndStampsTheUptime) {
    DaemonSegments segments;
    volatile int *progress = segments.create_progress();
    progress[1] = -7;
    in_fresh_process([&] {
        EXPECT_EQ(DownloadTriggerProgress(), 0);
        EXPECT_EQ(progress[0], 1);
        long stamped = progress[1];
        EXPECT_LE(std::labs(stamped - uptime_now()), 1) << stamped;
        EXPECT_EQ(DownloadTriggerProgress(), 1);
        EXPECT_EQ(progress[0], 1);

        // The owner resets the flag; setting it again reports 0 once more.
        progress[0] = 0;
        EXPECT_EQ(DownloadTriggerProgress(), 0);
        EXPECT_EQ(progress[0], 1);
    });
}

TEST_F(Trigger, SegmentsSmallerThanTheirLayoutAreNotTouched) {
    DaemonSegments segments;
    volatile int *change = segments.create(DOWNLOAD_SHM_TRIGGER_KEY, 2);
    volatile int *progress = segments.create(DOWNLOAD_SHM_PROGRESS_KEY, 4);
    in_fresh_process([&] {
        EXPECT_EQ(NAVODownloadTrigger(), 0);
        EXPECT_EQ(DownloadTriggerProgress(), 0);
        EXPECT_EQ(change[0] & 0xffff, 0);
        EXPECT_EQ(progress[0], 0);
        // Unlike a missing segment, this is worth a line: something else holds the key.
        EXPECT_EQ(logs(), (std::vector<std::string>{
                              "taskmgt:# Failed to attach shared memory. Invalid argument"}));
    });
}

TEST_F(Trigger, AttachmentsAreKeptWhenTheOwnerRemovesTheSegments) {
    DaemonSegments segments;
    volatile int *change = segments.create_trigger();
    volatile int *progress = segments.create_progress();
    in_fresh_process([&] {
        NAVODownloadTrigger();
        DownloadTriggerProgress();
        // Gone by key, still mapped here and in the library: later calls go on writing
        // the old memory, which shows that they do not look the segments up again.
        DaemonSegments::remove(DOWNLOAD_SHM_TRIGGER_KEY);
        DaemonSegments::remove(DOWNLOAD_SHM_PROGRESS_KEY);
        change[0] = 0;
        progress[0] = 0;
        EXPECT_EQ(NAVODownloadTrigger(), 0);
        EXPECT_EQ(change[0], 1);
        EXPECT_EQ(DownloadTriggerProgress(), 0);
        EXPECT_EQ(progress[0], 1);
        EXPECT_TRUE(logs().empty());
    });
}

TEST_F(Trigger, OwnerCreatesAttachesDetachesAndRemoves) {
    DaemonSegments segments;
    auto *created = static_cast<volatile int *>(
        NAVODownloadShmAttach(DOWNLOAD_SHM_PROGRESS_KEY, DOWNLOAD_SHM_PROGRESS_SIZE, 1));
    ASSERT_NE(created, nullptr);
    shmid_ds stat{};
    ASSERT_EQ(shmctl(shmget(DOWNLOAD_SHM_PROGRESS_KEY, 0, 0), IPC_STAT, &stat), 0);
    EXPECT_EQ(stat.shm_perm.mode & 0777, 0666u);
    EXPECT_EQ(stat.shm_segsz, 8u);

    // Creating again, or for fewer bytes, attaches the same segment.
    auto *again =
        static_cast<volatile int *>(NAVODownloadShmAttach(DOWNLOAD_SHM_PROGRESS_KEY, 4, 1));
    ASSERT_NE(again, nullptr);
    created[1] = 42;
    EXPECT_EQ(again[1], 42);
    errno = 0;
    EXPECT_EQ(NAVODownloadShmAttach(DOWNLOAD_SHM_PROGRESS_KEY, 16, 0), nullptr);
    EXPECT_EQ(errno, EINVAL);
    EXPECT_EQ(NAVODownloadShmAttach(DOWNLOAD_SHM_TRIGGER_KEY, 4, 0), nullptr);
    EXPECT_EQ(errno, ENOENT);

    EXPECT_EQ(NAVODownloadShmDetach(const_cast<int *>(again)), 0);
    EXPECT_EQ(NAVODownloadShmDetach(const_cast<int *>(created)), 0);
    EXPECT_EQ(NAVODownloadShmDetach(const_cast<int *>(created)), -1);
    EXPECT_EQ(NAVODownloadShmRemove(DOWNLOAD_SHM_PROGRESS_KEY, 8), 0);
    EXPECT_FALSE(DaemonSegments::exists(DOWNLOAD_SHM_PROGRESS_KEY));
    EXPECT_EQ(NAVODownloadShmRemove(DOWNLOAD_SHM_PROGRESS_KEY, 8), -1);
    EXPECT_EQ(
        logs(),
        (std::vector<std::string>{
            "trigger (#) Failed to detach shared memory.",
            "trigger (#) Get shared memory fail. Might not exist.(No such file or directory)"}));
}

TEST(ModuleMagic, IsTheBlockOfAnEightThreeServer) {
    const DownloadModuleMagic *magic = Pg_magic_func();
    ASSERT_NE(magic, nullptr);
    const int *words = &magic->len;
    EXPECT_EQ(std::vector<int>(words, words + 5), (std::vector<int>{20, 803, 100, 32, 64}));
}
