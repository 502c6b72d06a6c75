#include <string>

#include "tests/fixture.h"
#include "torvale/task.h"

namespace {

class TaskControl : public DbTest {
  protected:
    void task(int id, const std::string &owner, int status) {
        exec("INSERT INTO download_queue (task_id, username, status, pid) VALUES (" +
             std::to_string(id) + ", $q$" + owner + "$q$, " + std::to_string(status) + ", -1)");
    }
    // "id:status" of every row, in id order.
    std::string rows() {
        return value("SELECT coalesce(string_agg(task_id || ':' || status, ' ' ORDER BY "
                     "task_id), '') FROM download_queue");
    }
};

} // namespace

TEST_F(TaskControl, DeletesCountRowsAndRefuseBadArguments) {
    task(0, "a", TASK_STATUS_WAITING);
    task(4, "a", TASK_STATUS_DOWNLOADING);
    task(9, "b", TASK_STATUS_FINISHED);
    task(10, "b", TASK_STATUS_PAUSED);
    const int ids[] = {4, 9, 12};
    EXPECT_EQ(DownloadTaskMultiDelete(ids, 3), 2);
    EXPECT_EQ(DownloadTaskMultiDelete(ids, 3), 0);
    EXPECT_EQ(DownloadTaskDelete(0), 0);
    EXPECT_EQ(DownloadTaskDelete(77), 0);
    EXPECT_EQ(rows(), "10:3");
    EXPECT_TRUE(logs().empty());

    EXPECT_EQ(DownloadTaskMultiDelete(ids, 0), -1);
    EXPECT_EQ(DownloadTaskMultiDelete(nullptr, 1), -1);
    EXPECT_EQ(DownloadTaskDelete(-1), -1);
    EXPECT_EQ(rows(), "10:3");
    EXPECT_EQ(logs(), std::vector<std::string>(3, "taskmgt (#) Bad parameters."));
}

TEST_F(TaskControl, FailuresLogTheirStatements) {
    exec("ALTER TABLE download_queue RENAME COLUMN task_id TO id");
    exec("ALTER TABLE download_queue RENAME COLUMN status TO state");
    const int ids[] = {4, 9, 12};
    const DownloadTaskSetting setting = {150, 3600};
    int rc[] = {DownloadTaskMultiDelete(ids, 3),
                DownloadTaskDelete(5),
                DownloadTaskClear("a"),
                DownloadTaskResumeAll(nullptr),
                DownloadTaskPauseAll("it's"),
                DownloadTaskPause(1),
                DownloadTaskMultiPause(ids, 3),
                DownloadTaskContinue(1),
                DownloadTaskMultiContinue(ids, 1),
                DownloadTaskSettingSet(7, &setting)};
    exec("ALTER TABLE download_queue RENAME COLUMN id TO task_id");
    exec("ALTER TABLE download_queue RENAME COLUMN state TO status");
    for (int r : rc)
        EXPECT_EQ(r, -1);
    std::vector<std::string> ours;
    for (const std::string &line : logs())
        if (line.rfind("taskmgt", 0) == 0)
            ours.push_back(line);
    EXPECT_EQ(
        ours,
        (std::vector<std::string>{
            "taskmgt (#) Failed to exec [DELETE FROM download_queue WHERE task_id in (4,9,12)].",
            "taskmgt (#) Failed to exec [DELETE FROM download_queue WHERE task_id=5].",
            "taskmgt (#) Failed to exec [DELETE FROM download_queue WHERE status=5 and "
            "lower(username)=lower('a')].",
            "taskmgt:# Failed to exec [UPDATE download_queue SET status=1  WHERE status=3 OR "
            "status>=101]",
            "taskmgt:# Failed to exec [UPDATE download_queue SET status=3  WHERE status IN (1, 2, "
            "6, 7, 8) AND lower(username)=lower('it''s')]",
            "taskmgt (#) Failed to run DownloadTaskPause().",
            "taskmgt (#) Failed to run DownloadTaskMulitPause().",
            "taskmgt (#) Failed to run DownloadTaskContinue().",
            "taskmgt (#) Failed to run DownloadTaskMulitContinue().",
            "taskmgt (#) Failed to exec [UPDATE download_queue SET seeding_ratio=150, "
            "seeding_interval=3600 WHERE task_id=7].",
        }));
}

TEST_F(TaskControl, ResumeAllRestartsPausedAndFailedTasks) {
    task(1, "a", TASK_STATUS_PAUSED);
    task(2, "a", TASK_STATUS_ERROR);
    task(3, "a", 150);
    task(4, "a", TASK_STATUS_FINISHED);
    task(5, "a", TASK_STATUS_DOWNLOADING);
    task(6, "B", TASK_STATUS_PAUSED);
    EXPECT_EQ(DownloadTaskResumeAll("A"), 0);
    EXPECT_EQ(rows(), "1:1 2:1 3:1 4:5 5:2 6:3");
    EXPECT_EQ(DownloadTaskResumeAll(nullptr), 0);
    EXPECT_EQ(rows(), "1:1 2:1 3:1 4:5 5:2 6:1");
}

TEST_F(TaskControl, PauseAllPausesActiveTasksAcrossLetterCase) {
    const int statuses[] = {1, 2, 5, 6, 7, 8, 101, 3};
    for (int i = 0; i < 8; ++i)
        task(i + 1, "Alice", statuses[i]);
    task(20, "bob", TASK_STATUS_DOWNLOADING);
    EXPECT_EQ(DownloadTaskPauseAll("aLICE"), 0);
    EXPECT_EQ(rows(), "1:3 2:3 3:5 4:3 5:3 6:3 7:101 8:3 20:2");
    EXPECT_EQ(DownloadTaskPauseAll(nullptr), 0);
    EXPECT_EQ(rows(), "1:3 2:3 3:5 4:3 5:3 6:3 7:101 8:3 20:3");
}

TEST_F(TaskControl, ClearAndDeleteAllKeepToTheirUser) {
    task(1, "a", TASK_STATUS_FINISHED);
    task(2, "a", TASK_STATUS_WAITING);
    task(3, "O'Hara", TASK_STATUS_FINISHED);
    task(4, "o'hara", TASK_STATUS_PAUSED);
    task(5, "", TASK_STATUS_WAITING);
    task(6, "c", TASK_STATUS_FINISHED);
    EXPECT_EQ(DownloadTaskClear(""), 0);
    EXPECT_EQ(rows(), "1:5 2:1 3:5 4:3 5:1 6:5");
    EXPECT_EQ(DownloadTaskClear("o'HARA"), 0);
    EXPECT_EQ(rows(), "1:5 2:1 4:3 5:1 6:5");
    EXPECT_EQ(DownloadTaskClear(nullptr), 0);
    EXPECT_EQ(rows(), "2:1 4:3 5:1");
    EXPECT_EQ(DownloadTaskDeleteAll("O'HARA"), 0);
    EXPECT_EQ(rows(), "2:1 5:1");
    EXPECT_EQ(DownloadTaskDeleteAll(nullptr), 0);
    EXPECT_EQ(rows(), "");
    EXPECT_TRUE(logs().empty());
}

TEST_F(TaskControl, PauseContinueAndSeedingSettingsChangeOnlyTheirTasks) {
    task(1, "a", TASK_STATUS_DOWNLOADING);
    task(2, "a", TASK_STATUS_SEEDING);
    task(3, "a", TASK_STATUS_WAITING);
    task(4, "b", TASK_STATUS_ERROR);
    const int ids[] = {2, 3, 99};
    EXPECT_EQ(DownloadTaskPause(1), 0);
    EXPECT_EQ(DownloadTaskMultiPause(ids, 2), 0);
    EXPECT_EQ(rows(), "1:3 2:3 3:3 4:101");
    EXPECT_EQ(DownloadTaskContinue(4), 0);
    EXPECT_EQ(DownloadTaskMultiContinue(ids, 3), 0);
    EXPECT_EQ(DownloadTaskPause(99), 0);
    EXPECT_EQ(rows(), "1:3 2:1 3:1 4:1");

    DownloadTaskSetting setting = {250, 7200};
    EXPECT_EQ(DownloadTaskSettingSet(3, &setting), 1);
    EXPECT_EQ(DownloadTaskSettingSet(99, &setting), 0);
    EXPECT_EQ(value("SELECT string_agg(task_id || ':' || coalesce(seeding_ratio, 0) || '/' || "
                    "coalesce(seeding_interval, 0), ' ' ORDER BY task_id) FROM download_queue"),
              "1:0/0 2:0/0 3:250/7200 4:0/0");
    EXPECT_TRUE(logs().empty());

    EXPECT_EQ(DownloadTaskPause(-1), -1);
    EXPECT_EQ(DownloadTaskContinue(-1), -1);
    EXPECT_EQ(DownloadTaskMultiPause(ids, 0), -1);
    EXPECT_EQ(DownloadTaskMultiContinue(nullptr, 2), -1);
    EXPECT_EQ(DownloadTaskSettingSet(3, nullptr), -1);
    EXPECT_EQ(DownloadTaskSettingSet(-1, &setting), -1);
    EXPECT_EQ(rows(), "1:3 2:1 3:1 4:1");
    EXPECT_EQ(logs(), std::vector<std::string>(6, "taskmgt (#) Bad parameters."));
}
