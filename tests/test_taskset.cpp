#include <string>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

#include "tests/fixture.h"
#include "tests/shm_segments.h"
#include "torvale/task.h"

namespace {

class TaskSet : public DbTest {
  protected:
    // A waiting task as creation leaves it; returns its id.
    int add_row(int flags = 0) {
        return std::stoi(value(
            "INSERT INTO download_queue(username, pid, url, filename, created_time, started_time, "
            "status, total_size, current_size, current_rate, total_peers, connected_peers, "
            "total_pieces, downloaded_pieces, available_pieces, upload_rate, total_upload, "
            "seeding_ratio, seeding_interval, seeding_elapsed, task_flags, destination) VALUES "
            "('ann', -1, 'http://h/f', 'f', 1, 0, 1, 0, 0, 9, 0, 0, 0, 0, 0, 8, 0, 0, 0, 0, " +
            std::to_string(flags) + ", '/d') RETURNING task_id"));
    }
    std::string column(int id, const std::string &expr) {
        return value("SELECT " + expr + " FROM download_queue WHERE task_id=" + std::to_string(id));
    }
    // Renames a column until the test ends, so that statements naming it fail.
    void rename_column(const std::string &from, const std::string &to) {
        exec("ALTER TABLE download_queue RENAME COLUMN " + from + " TO " + to);
        renamed_.emplace_back(from, to);
    }
    void TearDown() override {
        for (const auto &[from, to] : renamed_)
            exec("ALTER TABLE download_queue RENAME COLUMN " + to + " TO " + from);
        DbTest::TearDown();
    }

  private:
    std::vector<std::pair<std::string, std::string>> renamed_;
};

} // namespace

TEST_F(TaskSet, NumberFieldsReachTheRowAndUnknownIdsCountZero) {
    int id = add_row();
    EXPECT_EQ(DownloadTaskPidStatusSet(id, 4242, TASK_STATUS_DOWNLOADING), 1);
    EXPECT_EQ(column(id, "pid || ' ' || status"), "4242 2");
    EXPECT_EQ(DownloadTaskPidSet(id, 77), 1);
    EXPECT_EQ(DownloadTaskStatusSet(id, TASK_STATUS_SEEDING), 1);
    EXPECT_EQ(DownloadTaskSeedElapsedSet(id, 3600), 1);
    EXPECT_EQ(DownloadTaskStartedTimeSet(id, 1700000000L), 1);
    EXPECT_EQ(DownloadTaskTotalSizeSet(id, 5000000000LL), 1);
    EXPECT_EQ(DownloadTaskClearDURate(id), 1);
    EXPECT_EQ(column(id, "pid || ' ' || status || ' ' || seeding_elapsed || ' ' || started_time || "
                         "' ' || total_size || ' ' || current_rate || ' ' || upload_rate"),
              "77 8 3600 1700000000 5000000000 0 0");
    EXPECT_EQ(DownloadTaskPidStatusSetNonPersistent(id, -1, TASK_STATUS_ERROR), 1);
    EXPECT_EQ(column(id, "pid || ' ' || status"), "-1 101");

    int unknown = id + 1;
    EXPECT_EQ(DownloadTaskStatusSet(unknown, 3), 0);
    EXPECT_EQ(DownloadTaskPidStatusSetNonPersistent(unknown, 1, 2), 0);
    EXPECT_EQ(DownloadTaskFilenameSet(unknown, "x"), 0);
    EXPECT_EQ(DownloadTaskTotalSizeSet(unknown, 1), 0);
    EXPECT_EQ(DownloadTaskExtraInfoSet(unknown, "x"), 0);
    EXPECT_TRUE(logs().empty()) << logs()[0];
}

TEST_F(TaskSet, BadArgumentsAreRefusedBeforeAnyStatement) {
    int id = add_row();
    EXPECT_EQ(DownloadTaskStatusSet(-1, 3), -1);
    EXPECT_EQ(DownloadTaskPidStatusSetNonPersistent(-1, 1, 3), -1);
    EXPECT_EQ(DownloadTaskStartedTimeSet(id, 0), -1);
    EXPECT_EQ(DownloadTaskStartedTimeSet(-1, 5), -1);
    EXPECT_EQ(DownloadTaskFilenameSet(id, nullptr), -1);
    EXPECT_EQ(DownloadTaskDestinationSet(-2, "/x"), -1);
    EXPECT_EQ(DownloadTaskTotalSizeSet(-1, 1), -1);
    EXPECT_EQ(DownloadTaskFlagsSet(-1, 1), -1);
    EXPECT_EQ(DownloadTaskExtraInfoSet(id, nullptr), -1);
    EXPECT_EQ(DownloadTaskMultiStatusSet(nullptr, 1, 3), -1);
    int ids[] = {id};
    EXPECT_EQ(DownloadTaskMultiStatusSet(ids, 0, 3), -1);
    // The one write without a check: a negative id simply matches nothing.
    EXPECT_EQ(DownloadTaskClearDURate(-1), 0);
    EXPECT_EQ(column(id, "pid || ' ' || status || ' ' || started_time || ' ' || filename"),
              "-1 1 0 f");
    EXPECT_EQ(logs(), (std::vector<std::string>{
                          "taskset:# Bad parameters", "taskset:# Bad parameters",
                          "taskset:# Bad parameters", "taskset:# Bad parameters",
                          "taskset:# Bad parameters", "taskset:# Bad parameter",
                          "taskset (#) Bad parameters.", "taskset (#) Bad parameters.",
                          "taskset (#) Bad parameters.", "taskset (#) Bad parameters.",
                          "taskset (#) Bad parameters."}));
}

TEST_F(TaskSet, TextsAreStoredExactlyAsGiven) {
    int id = add_row();
    EXPECT_EQ(DownloadTaskFilenameSet(id, "it's a 'name'"), 1);
    EXPECT_EQ(DownloadTaskDestinationSet(id, "/volume1/o'brien\\dir"), 1);
    EXPECT_EQ(DownloadTaskExtraInfoSet(id, "';DROP TABLE download_queue;--"), 1);
    EXPECT_EQ(column(id, "filename"), "it's a 'name'");
    EXPECT_EQ(column(id, "destination"), "/volume1/o'brien\\dir");
    EXPECT_EQ(column(id, "extra_info"), "';DROP TABLE download_queue;--");
    EXPECT_EQ(DownloadTaskFilenameSet(id, ""), 1);
    EXPECT_EQ(column(id, "filename IS NOT NULL AND filename = ''"), "t");
}

TEST_F(TaskSet, FlagsChangeOnlyTheGivenBits) {
    int id = add_row(0x04);
    EXPECT_EQ(DownloadTaskFlagsSet(id, 0), 1);
    EXPECT_EQ(column(id, "task_flags"), "4");
    EXPECT_EQ(DownloadTaskFlagsSet(id, 0x12), 1);
    EXPECT_EQ(column(id, "task_flags"), "22");
    EXPECT_EQ(DownloadTaskFlagsClear(id, 0x06), 1);
    EXPECT_EQ(column(id, "task_flags"), "16");
    EXPECT_EQ(DownloadTaskFlagsSet(id, static_cast<int>(0x80000000u)), 1);
    EXPECT_EQ(column(id, "task_flags"), "-2147483632");
    EXPECT_EQ(DownloadTaskFlagsClear(id, -1), 1);
    EXPECT_EQ(column(id, "task_flags"), "0");
}

TEST_F(TaskSet, FlagWritesFromTwoProcessesLoseNoBit) {
    // One process sets bits 0-14 and the other clears bits 16-30, one bit and one
    // statement at a time, on the same rows at the same moment. A read-modify-write
    // would let either undo the other's bit.
    constexpr int kRows = 20;
    std::vector<int> ids;
    for (int i = 0; i < kRows; ++i)
        ids.push_back(add_row(0x7fff0000));
    int go[2];
    ASSERT_EQ(pipe(go), 0);
    auto worker = [&](bool setter) {
        pid_t pid = fork();
        if (pid != 0)
            return pid;
        char c;
        close(go[1]);
        int ok = read(go[0], &c, 1) == 0; // waits for the parent to close its end
        for (int bit = 0; bit < 15 && ok; ++bit)
            for (int id : ids)
                ok = setter ? DownloadTaskFlagsSet(id, 1 << bit) == 1
                            : DownloadTaskFlagsClear(id, 1 << (bit + 16)) == 1;
        _exit(ok ? 0 : 1);
    };
    pid_t setter = worker(true);
    pid_t clearer = worker(false);
    ASSERT_GT(setter, 0);
    ASSERT_GT(clearer, 0);
    close(go[0]);
    close(go[1]);
    int status = 0;
    ASSERT_EQ(waitpid(setter, &status, 0), setter);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    ASSERT_EQ(waitpid(clearer, &status, 0), clearer);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    EXPECT_EQ(count("SELECT 1 FROM download_queue WHERE task_flags <> 32767"), 0);
}

TEST_F(TaskSet, MultiStatusSetsTheListedTasksInOneStatement) {
    int a = add_row(), b = add_row(), c = add_row();
    int ids[] = {c, a, c + 50};
    EXPECT_EQ(DownloadTaskMultiStatusSet(ids, 3, TASK_STATUS_PAUSED), 2);
    EXPECT_EQ(value("SELECT string_agg(status::text, ',' ORDER BY task_id) FROM download_queue"),
              "3,1,3");
    (void)b;

    // The statements as they went out, read off their failure messages.
    rename_column("status", "state");
    int three[] = {3, 5, 9};
    int one[] = {7};
    EXPECT_EQ(DownloadTaskMultiStatusSet(three, 3, 3), -1);
    EXPECT_EQ(DownloadTaskMultiStatusSet(one, 1, 5), -1);
    EXPECT_EQ(DownloadTaskStatusSet(a, 4), -1);
    EXPECT_EQ(DownloadTaskPidStatusSetNonPersistent(a, 9, 2), -1);
    std::vector<std::string> ours;
    for (const auto &line : logs())
        if (line.rfind("taskset", 0) == 0)
            ours.push_back(line);
    std::string at_a = "WHERE task_id=" + std::to_string(a) + "]";
    EXPECT_EQ(ours,
              (std::vector<std::string>{
                  "taskset (#) Failed to exec [UPDATE download_queue SET status=3 WHERE "
                  "task_id in (3,5,9)].",
                  "taskset (#) Failed to exec [UPDATE download_queue SET status=5 WHERE "
                  "task_id in (7)].",
                  "taskset:# Failed to exec [UPDATE download_queue SET status=4 " + at_a,
                  "taskset:# Failed to exec [UPDATE download_queue SET pid=9, status=2 " + at_a}));
    EXPECT_EQ(logs().size(), 8u) << "the database layer logs each failure with its error too";
}

TEST_F(TaskSet, ProgressIsWrittenOnlyWhileRequestedOrWhenForced) {
    int id = add_row();
    DownloadProgressInfo info{6000000000LL, 1, 2, 3, 4, 5, 6, 7, 7000000000LL, 8, 9, 10};
    const std::string all =
        "current_size||' '||current_rate||' '||upload_rate||' '||total_peers||' '||"
        "connected_peers||' '||total_pieces||' '||downloaded_pieces||' '||available_pieces||' '||"
        "total_upload||' '||seeding_elapsed||' '||seeders||' '||leechers";
    const std::string untouched = "0 9 8 0 0 0 0 0 0 0 0 0";

    DaemonSegments segments;
    in_fresh_process([&] {
        // No daemon, so nobody can have asked: nothing is written, nothing even checked.
        EXPECT_EQ(DownloadTaskProgressSet(id, 1, 1, 1, 1, 1, 1, 1, 0), 1);
        EXPECT_EQ(DownloadTaskProgressSet(-5, 1, 1, 1, 1, 1, 1, 1, 0), 1);
        EXPECT_EQ(DownloadTaskProgressSet2(id, nullptr, 0), 1);
        EXPECT_EQ(logs(), std::vector<std::string>(3, "taskset:# Failed to attach shared memory."));
    });
    EXPECT_EQ(column(id, all), untouched);

    volatile int *progress = segments.create_progress();
    in_fresh_process([&] {
        EXPECT_EQ(DownloadTaskProgressSet(id, 1, 1, 1, 1, 1, 1, 1, 0), 1);
        EXPECT_EQ(DownloadTaskProgressSet2(id, &info, 0), 1);
        EXPECT_TRUE(logs().empty());
    });
    EXPECT_EQ(column(id, all), untouched) << "the flag is clear";

    progress[0] = 1;
    in_fresh_process([&] {
        EXPECT_EQ(DownloadTaskProgressSet(id + 1, 1, 1, 1, 1, 1, 1, 1, 0), 0);
        EXPECT_EQ(DownloadTaskProgressSet2(id, nullptr, 0), -1);
        EXPECT_EQ(DownloadTaskProgressSet2(id, &info, 0), 1);
    });
    EXPECT_EQ(column(id, all), "6000000000 1 2 3 4 5 6 7 7000000000 8 9 10");

    progress[0] = 0;
    in_fresh_process([&] {
        EXPECT_EQ(DownloadTaskProgressSet(id, 11, 12, 13, 14, 15, 16, 17, 1), 1);
        EXPECT_EQ(DownloadTaskProgressSet(-1, 11, 12, 13, 14, 15, 16, 17, 1), -1);
        EXPECT_EQ(logs(), (std::vector<std::string>{"taskset (#) Bad parameters."}));
    });
    EXPECT_EQ(column(id, all), "11 12 2 13 14 15 16 17 7000000000 8 9 10");
    EXPECT_EQ(progress[0], 0) << "writing progress never touches the flag";
}
