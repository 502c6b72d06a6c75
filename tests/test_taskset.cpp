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
    // A waiting task with current_rate 9 and upload_rate 8; returns its id.
    int add_row(int flags = 0) {
        return std::stoi(value("INSERT INTO download_queue(username, pid, filename, status, "
                               "current_size, current_rate, upload_rate, started_time, "
                               "task_flags) VALUES ('ann', -1, 'f', 1, 0, 9, 8, 0, " +
                               std::to_string(flags) + ") RETURNING task_id"));
    }
    std::string column(int id, const std::string &expr) {
        return value("SELECT " + expr + " FROM download_queue WHERE task_id=" + std::to_string(id));
    }
};

} // namespace

TEST_F(TaskSet, FieldsReachTheRowUnknownIdsCountZeroAndBadArgumentsChangeNothing) {
    int id = add_row();
    EXPECT_EQ(DownloadTaskPidStatusSet(id, 4242, TASK_STATUS_DOWNLOADING), 1);
    EXPECT_EQ(DownloadTaskStartedTimeSet(id, 1700000000L), 1);
    EXPECT_EQ(DownloadTaskTotalSizeSet(id, 5000000000LL), 1);
    EXPECT_EQ(DownloadTaskClearDURate(id), 1);
    EXPECT_EQ(DownloadTaskFilenameSet(id, "it's a 'name'"), 1);
    EXPECT_EQ(DownloadTaskDestinationSet(id, "/volume1/o'brien\\dir"), 1);
    EXPECT_EQ(DownloadTaskExtraInfoSet(id, "';DROP TABLE download_queue;--"), 1);
    EXPECT_EQ(DownloadTaskStatusSet(id + 1, 3), 0);
    EXPECT_EQ(DownloadTaskExtraInfoSet(id + 1, "x"), 0);
    // Refused before any statement, but for the unchecked write: a negative id matches none.
    int ids[] = {id};
    EXPECT_EQ(DownloadTaskStatusSet(-1, 3), -1);
    EXPECT_EQ(DownloadTaskStartedTimeSet(id, 0), -1);
    EXPECT_EQ(DownloadTaskDestinationSet(id, nullptr), -1);
    EXPECT_EQ(DownloadTaskFlagsSet(-1, 1), -1);
    EXPECT_EQ(DownloadTaskMultiStatusSet(ids, 0, 3), -1);
    EXPECT_EQ(DownloadTaskClearDURate(-1), 0);
    EXPECT_EQ(column(id, "concat_ws('|', pid, status, started_time, total_size, current_rate, "
                         "upload_rate, filename, destination, extra_info)"),
              "4242|2|1700000000|5000000000|0|0|it's a 'name'|/volume1/o'brien\\dir|"
              "';DROP TABLE download_queue;--");
    EXPECT_EQ(DownloadTaskPidStatusSetNonPersistent(id, -1, TASK_STATUS_ERROR), 1);
    EXPECT_EQ(DownloadTaskPidStatusSetNonPersistent(id + 1, 1, 2), 0);
    EXPECT_EQ(column(id, "pid || ' ' || status"), "-1 101");
    EXPECT_EQ(logs(),
              (std::vector<std::string>{"taskset:# Bad parameters", "taskset:# Bad parameters",
                                        "taskset:# Bad parameter", "taskset (#) Bad parameters.",
                                        "taskset (#) Bad parameters."}));
}

TEST_F(TaskSet, FlagWritesChangeOnlyTheirBitsFromTwoProcessesAtOnceTheTopOneIncluded) {
    // One process sets bits 0-14 and the other clears bits 16-30, a bit per statement,
    // on the same rows at the same time. A read-modify-write would undo the other's bits.
    std::vector<int> ids;
    for (int i = 0; i < 20; ++i)
        ids.push_back(add_row(0x7fff0000));
    int go[2];
    ASSERT_EQ(pipe(go), 0);
    pid_t workers[2];
    for (int w = 0; w < 2; ++w) {
        if ((workers[w] = fork()) == 0) {
            char c;
            close(go[1]);
            bool ok = read(go[0], &c, 1) == 0; // both start when the parent closes its end
            for (int bit = 0; bit < 15 && ok; ++bit)
                for (int id : ids)
                    ok &= (w == 0 ? DownloadTaskFlagsSet(id, 1 << bit)
                                  : DownloadTaskFlagsClear(id, 1 << (bit + 16))) == 1;
            _exit(ok ? 0 : 1);
        }
    }
    close(go[0]);
    close(go[1]);
    for (pid_t pid : workers) {
        int status = 0;
        ASSERT_EQ(waitpid(pid, &status, 0), pid);
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
    }
    EXPECT_EQ(count("SELECT 1 FROM download_queue WHERE task_flags <> 32767"), 0);
    // A mask with the top bit set is negative, and must not run into the operator.
    EXPECT_EQ(DownloadTaskFlagsSet(ids[0], static_cast<int>(0x80000000u)), 1);
    EXPECT_EQ(column(ids[0], "task_flags"), "-2147450881");
    EXPECT_EQ(DownloadTaskFlagsClear(ids[0], -1), 1);
    EXPECT_EQ(column(ids[0], "task_flags"), "0");
}

TEST_F(TaskSet, MultiStatusSetsTheListedTasksInOneStatement) {
    int a = add_row(), b = add_row(), c = add_row();
    int ids[] = {c, a, b + 50};
    EXPECT_EQ(DownloadTaskMultiStatusSet(ids, 3, TASK_STATUS_PAUSED), 2);
    EXPECT_EQ(value("SELECT string_agg(status::text, ',' ORDER BY task_id) FROM download_queue"),
              "3,1,3");
    // The statements as they went out, read off their failure messages.
    exec("ALTER TABLE download_queue RENAME COLUMN status TO state");
    int three[] = {3, 5, 9};
    EXPECT_EQ(DownloadTaskMultiStatusSet(three, 3, 3), -1);
    EXPECT_EQ(DownloadTaskPidStatusSet(a, 9, 2), -1);
    exec("ALTER TABLE download_queue RENAME COLUMN state TO status");
    EXPECT_TRUE(logged("taskset (#) Failed to exec [UPDATE download_queue SET status=3 WHERE "
                       "task_id in (3,5,9)]."));
    EXPECT_TRUE(logged("taskset:# Failed to exec [UPDATE download_queue SET pid=9, status=2 "
                       "WHERE task_id=" +
                       std::to_string(a) + "]"));
}

TEST_F(TaskSet, ProgressIsWrittenOnlyWhileRequestedOrWhenForced) {
    int unasked = add_row(), asked = add_row(), forced = add_row();
    DownloadProgressInfo info{6000000000LL, 1, 2, 3, 4, 5, 6, 7, 7000000000LL, 8, 9, 10};
    DaemonSegments segments;
    in_fresh_process([&] {
        // No daemon, so nobody can have asked: nothing is written, nothing even checked.
        EXPECT_EQ(DownloadTaskProgressSet(-5, 1, 1, 1, 1, 1, 1, 1, 0), 1);
        EXPECT_EQ(DownloadTaskProgressSet2(unasked, nullptr, 0), 1);
        EXPECT_EQ(logs(), std::vector<std::string>(2, "taskset:# Failed to attach shared memory."));
    });
    volatile int *progress = segments.create(DOWNLOAD_SHM_PROGRESS_KEY, 8);
    in_fresh_process([&] {
        EXPECT_EQ(DownloadTaskProgressSet2(unasked, &info, 0), 1) << "the flag is clear";
        progress[0] = 1;
        EXPECT_EQ(DownloadTaskProgressSet(forced + 1, 1, 1, 1, 1, 1, 1, 1, 0), 0);
        EXPECT_EQ(DownloadTaskProgressSet2(asked, nullptr, 0), -1);
        EXPECT_EQ(DownloadTaskProgressSet2(asked, &info, 0), 1);
        progress[0] = 0;
        EXPECT_EQ(DownloadTaskProgressSet(forced, 11, 12, 13, 14, 15, 16, 17, 1), 1);
        EXPECT_EQ(DownloadTaskProgressSet(-1, 11, 12, 13, 14, 15, 16, 17, 1), -1);
        EXPECT_EQ(logs(), std::vector<std::string>(2, "taskset (#) Bad parameters."));
    });
    const std::string all = "concat_ws(' ', current_size, current_rate, upload_rate, "
                            "total_peers, connected_peers, total_pieces, downloaded_pieces, "
                            "available_pieces, total_upload, seeding_elapsed, seeders, leechers)";
    EXPECT_EQ(column(unasked, all), "0 9 8 0 0"); // seeders and leechers default to 0
    EXPECT_EQ(column(asked, all), "6000000000 1 2 3 4 5 6 7 7000000000 8 9 10");
    EXPECT_EQ(column(forced, all), "11 12 8 13 14 15 16 17 0 0");
    EXPECT_EQ(progress[0], 0) << "writing progress never touches the flag";
}
