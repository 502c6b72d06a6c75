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

TEST_F(TaskControl, SingleAndListCommandsCountWhatExisted) {
    task(0, "a", TASK_STATUS_WAITING);
    task(4, "a", TASK_STATUS_DOWNLOADING);
    task(9, "b", TASK_STATUS_FINISHED);
    task(10, "b", TASK_STATUS_SEEDING);
    task(11, "b", TASK_STATUS_ERROR);
    const int ids[] = {4, 9, 12};
    EXPECT_EQ(DownloadTaskMultiDelete(ids, 3), 2);
    EXPECT_EQ(DownloadTaskDelete(0), 0);
    // The single and the list forms act on separate tasks, the list only on `count` ids.
    const int more[] = {11, 99, 10};
    EXPECT_EQ(DownloadTaskPause(10), 0);
    EXPECT_EQ(DownloadTaskMultiPause(more, 2), 0);
    EXPECT_EQ(rows(), "10:3 11:3");
    EXPECT_EQ(DownloadTaskContinue(11), 0);
    EXPECT_EQ(DownloadTaskMultiContinue(more + 1, 2), 0);
    EXPECT_EQ(rows(), "10:1 11:1");

    DownloadTaskSetting setting = {250, 7200};
    EXPECT_EQ(DownloadTaskSettingSet(11, &setting), 1);
    EXPECT_EQ(DownloadTaskSettingSet(99, &setting), 0);
    EXPECT_EQ(value("SELECT string_agg(task_id || ':' || coalesce(seeding_ratio, 0) || '/' || "
                    "coalesce(seeding_interval, 0), ' ' ORDER BY task_id) FROM download_queue"),
              "10:0/0 11:250/7200");
}

TEST_F(TaskControl, BadArgumentsAreRefusedAndFailingStatementsLogged) {
    exec("ALTER TABLE download_queue RENAME TO queue_gone");
    const int ids[] = {4, 9, 12};
    const DownloadTaskSetting setting = {150, 3600};
    const int rc[] = {// refused before any statement
                      DownloadTaskMultiDelete(ids, 0), DownloadTaskMultiDelete(nullptr, 1),
                      DownloadTaskDelete(-1), DownloadTaskPause(-1), DownloadTaskContinue(-1),
                      DownloadTaskMultiPause(ids, -1), DownloadTaskMultiContinue(nullptr, 1),
                      DownloadTaskSettingSet(1, nullptr), DownloadTaskSettingSet(-1, &setting),
                      // failing statements
                      DownloadTaskMultiDelete(ids, 3), DownloadTaskClear("a"),
                      DownloadTaskPauseAll("it's"), DownloadTaskPause(1),
                      DownloadTaskMultiPause(ids, 3), DownloadTaskContinue(1),
                      DownloadTaskMultiContinue(ids, 1), DownloadTaskSettingSet(7, &setting)};
    exec("ALTER TABLE queue_gone RENAME TO download_queue");
    for (int r : rc)
        EXPECT_EQ(r, -1);
    std::vector<std::string> expected(9, "taskmgt (#) Bad parameters.");
    expected.insert(
        expected.end(),
        {
            "taskmgt (#) Failed to exec [DELETE FROM download_queue WHERE task_id in (4,9,12)].",
            "taskmgt (#) Failed to exec [DELETE FROM download_queue WHERE status=5 and "
            "lower(username)=lower('a')].",
            "taskmgt:# Failed to exec [UPDATE download_queue SET status=3  WHERE status IN (1, 2, "
            "6, 7, 8) AND lower(username)=lower('it''s')]",
            "taskmgt (#) Failed to run DownloadTaskPause().",
            "taskmgt (#) Failed to run DownloadTaskMulitPause().",
            "taskmgt (#) Failed to run DownloadTaskContinue().",
            "taskmgt (#) Failed to run DownloadTaskMulitContinue().",
            "taskmgt (#) Failed to exec [UPDATE download_queue SET seeding_ratio=150, "
            "seeding_interval=3600 WHERE task_id=7].",
        });
    std::vector<std::string> ours;
    for (const std::string &line : logs())
        if (line.rfind("taskmgt", 0) == 0)
            ours.push_back(line);
    EXPECT_EQ(ours, expected);
}

TEST_F(TaskControl, BulkCommandsKeepToTheirStatusesAndUser) {
    const int statuses[] = {1, 2, 3, 5, 6, 7, 8, 101, 150};
    for (int i = 0; i < 9; ++i)
        task(i + 1, "O'Hara", statuses[i]);
    task(20, "bob", TASK_STATUS_PAUSED);
    task(21, "bob", TASK_STATUS_ERROR);
    task(22, "", TASK_STATUS_FINISHED);
    task(23, "c", TASK_STATUS_FINISHED);
    EXPECT_EQ(DownloadTaskResumeAll("o'HARA"), 0);
    EXPECT_EQ(rows(), "1:1 2:2 3:1 4:5 5:6 6:7 7:8 8:1 9:1 20:3 21:101 22:5 23:5");
    EXPECT_EQ(DownloadTaskPauseAll("O'HARA"), 0);
    EXPECT_EQ(rows(), "1:3 2:3 3:3 4:5 5:3 6:3 7:3 8:3 9:3 20:3 21:101 22:5 23:5");
    EXPECT_EQ(DownloadTaskResumeAll(nullptr), 0);
    EXPECT_EQ(rows(), "1:1 2:1 3:1 4:5 5:1 6:1 7:1 8:1 9:1 20:1 21:1 22:5 23:5");
    EXPECT_EQ(DownloadTaskPauseAll(nullptr), 0);
    EXPECT_EQ(rows(), "1:3 2:3 3:3 4:5 5:3 6:3 7:3 8:3 9:3 20:3 21:3 22:5 23:5");
    EXPECT_EQ(DownloadTaskClear(""), 0); // the user named "", not everybody
    EXPECT_EQ(DownloadTaskClear("o'hara"), 0);
    EXPECT_EQ(rows(), "1:3 2:3 3:3 5:3 6:3 7:3 8:3 9:3 20:3 21:3 23:5");
    EXPECT_EQ(DownloadTaskClear(nullptr), 0);
    EXPECT_EQ(DownloadTaskDeleteAll("O'HARA"), 0);
    EXPECT_EQ(rows(), "20:3 21:3");
    EXPECT_EQ(DownloadTaskDeleteAll(nullptr), 0);
    EXPECT_EQ(rows(), "");
}
