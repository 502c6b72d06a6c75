#include <csignal>
#include <cstdlib>
#include <cstring>
#include <string>
#include <sys/wait.h>
#include <unistd.h>

#include "tests/fixture.h"
#include "torvale/database.h"
#include "torvale/task.h"

namespace {

class NextTask : public DbTest {
  protected:
    void SetUp() override {
        DbTest::SetUp();
        set_cursor(nullptr);
    }
    void TearDown() override {
        set_cursor(nullptr);
        DbTest::TearDown();
    }

    static void set_cursor(const char *user) {
        std::free(gszLastUser);
        gszLastUser = user != nullptr ? strdup(user) : nullptr;
    }
    static std::string cursor() { return gszLastUser != nullptr ? gszLastUser : "<null>"; }

    void user(const std::string &name, bool disabled = false) {
        exec("INSERT INTO user_setting (username, user_disabled) VALUES ($q$" + name + "$q$, " +
             (disabled ? "true" : "false") + ")");
    }
    // Adds a task with the given id and returns it.
    int task(int id, const std::string &owner, int status = TASK_STATUS_WAITING, int pid = -1,
             const std::string &url = "http://example.com/file") {
        exec("INSERT INTO download_queue (task_id, username, status, pid, url) VALUES (" +
             std::to_string(id) + ", $q$" + owner + "$q$, " + std::to_string(status) + ", " +
             std::to_string(pid) + ", '" + url + "')");
        return id;
    }
};

// A child process that lives until the object goes.
class Worker {
  public:
    Worker() : pid_(fork()) {
        if (pid_ == 0)
            for (;;)
                pause();
    }
    ~Worker() {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
    Worker(const Worker &) = delete;
    Worker &operator=(const Worker &) = delete;
    int pid() const { return pid_; }

  private:
    pid_t pid_;
};

// The pid of a process that has ended and been reaped.
int gone_pid() {
    pid_t pid = fork();
    if (pid == 0)
        _exit(0);
    waitpid(pid, nullptr, 0);
    return pid;
}

class RunningCount : public NextTask {
  protected:
    void TearDown() override {
        exec("DROP TRIGGER IF EXISTS test_takeover ON download_queue");
        exec("DROP FUNCTION IF EXISTS test_takeover()");
        NextTask::TearDown();
    }
    std::string statuses() {
        return value("SELECT string_agg(task_id || ':' || status, ' ' ORDER BY task_id) FROM "
                     "download_queue");
    }
};

} // namespace

TEST_F(NextTask, OldestFirstTakesOnlyStartableTasksOfEnabledUsers) {
    user("a");
    user("b");
    user("off", true);
    task(1, "a", TASK_STATUS_WAITING, 4242); // a worker holds it already
    task(2, "a", TASK_STATUS_PAUSED);
    task(3, "off");
    task(4, "nobody"); // no settings row
    task(7, "b");
    task(9, "A"); // the same user as "a", in other letters
    set_cursor("zed");

    EXPECT_EQ(DownloadTaskGetNext(0, 0), 7);
    EXPECT_EQ(cursor(), "zed"); // only the rotation moves it
    exec("UPDATE download_queue SET pid=99 WHERE task_id=7");
    EXPECT_EQ(DownloadTaskGetNext(0, 0), 9);
    exec("UPDATE user_setting SET user_disabled=true WHERE username='a'");
    EXPECT_EQ(DownloadTaskGetNext(0, 0), 0);
    EXPECT_TRUE(logs().empty());
}

TEST_F(NextTask, RotationTakesUsersInTurnAndWraps) {
    for (const char *name : {"a", "b", "c"})
        user(name);
    task(1, "a");
    task(2, "a");
    task(3, "b");
    task(4, "c");
    std::string seen;
    for (int i = 0; i < 4; ++i) {
        int id = DownloadTaskGetNext(1, 0);
        seen += std::to_string(id) + cursor() + " ";
    }
    EXPECT_EQ(seen, "1a 3b 4c 1a ");
}

TEST_F(NextTask, RotationFollowsLowerCaseNamesWhateverTheStoredCase) {
    // Stored as written: "Zed" sorts before "bob" byte-wise, yet must come after it.
    for (const char *name : {"alice", "Bob", "Zed"})
        user(name);
    task(1, "Zed");
    task(2, "bob");
    task(3, "alice");
    task(4, "BOB");
    std::string seen;
    for (int i = 0; i < 4; ++i)
        seen += std::to_string(DownloadTaskGetNext(1, 0)) + " ";
    EXPECT_EQ(seen, "3 2 1 3 ");
}

TEST_F(NextTask, RotationFallsBackToTheCursorsOwnUser) {
    user("o'neil");
    user("x", true);
    task(5, "x");
    task(6, "O'Neil");
    task(8, "o'neil");
    set_cursor("O'NEIL");
    EXPECT_EQ(DownloadTaskGetNext(1, 0), 6);
    EXPECT_EQ(cursor(), "O'Neil");
    EXPECT_TRUE(logs().empty());
}

TEST_F(NextTask, NothingStartableGivesZeroAndClearsTheCursor) {
    user("a");
    task(1, "a", TASK_STATUS_DOWNLOADING, 10);
    task(2, "ghost");
    set_cursor("a");
    EXPECT_EQ(DownloadTaskGetNext(1, 0), 0);
    EXPECT_EQ(cursor(), "<null>");
    EXPECT_EQ(DownloadTaskGetNext(1, 0), 0);
    EXPECT_TRUE(logs().empty());
}

TEST_F(NextTask, FtpLimitHoldsBackServersWithEnoughDownloads) {
    user("u");
    task(1, "u", TASK_STATUS_DOWNLOADING, 11, "ftp://Host.example:21/a");
    task(2, "u", TASK_STATUS_DOWNLOADING, 12, "FTP://host.EXAMPLE:21/dir/b");
    task(3, "u", TASK_STATUS_DOWNLOAD_AUX, 13, "ftp://other.example/c"); // not counted
    task(4, "u", TASK_STATUS_DOWNLOADING, 14, "ftp://other.example/d");
    task(5, "u", TASK_STATUS_DOWNLOADING, 15, "ftp://hostonly"); // no path: no server key
    task(6, "u", TASK_STATUS_DOWNLOADING, 16, "ftp://hostonly");
    task(20, "u", TASK_STATUS_WAITING, -1, "ftp://HOST.example:21/x");
    task(21, "u", TASK_STATUS_WAITING, -1, "ftp://other.example/y");

    EXPECT_EQ(DownloadTaskGetNext(0, 2), 21);
    EXPECT_EQ(DownloadTaskGetNext(1, 2), 21);
    EXPECT_EQ(DownloadTaskGetNext(0, 3), 20);
    EXPECT_EQ(DownloadTaskGetNext(0, 0), 20);
    exec("UPDATE download_queue SET status=5 WHERE task_id=2");
    EXPECT_EQ(DownloadTaskGetNext(0, 2), 20);
    EXPECT_TRUE(logs().empty());
}

TEST_F(NextTask, FtpServerKeysAreTakenLiterally) {
    user("u");
    // '_' and '%' in the account part would match other servers in a LIKE pattern.
    task(1, "u", TASK_STATUS_DOWNLOADING, 11, "ftp://my_user:p%40ss@h/a");
    task(2, "u", TASK_STATUS_DOWNLOADING, 12, "ftp://my_user:p%40ss@h/b");
    task(3, "u", TASK_STATUS_DOWNLOADING, 13, "ftp:///a"); // no host
    task(4, "u", TASK_STATUS_DOWNLOADING, 14, "ftp:///b");
    task(10, "u", TASK_STATUS_WAITING, -1, "ftp://myXuser:p%40ss@h/c");
    task(11, "u", TASK_STATUS_WAITING, -1, "ftp://my_user:pX40ss@h/c");
    task(12, "u", TASK_STATUS_WAITING, -1, "ftp://my_user:p%40ss@h/c");
    EXPECT_EQ(DownloadTaskGetNext(0, 2), 10);
    exec("UPDATE download_queue SET pid=1 WHERE task_id=10");
    EXPECT_EQ(DownloadTaskGetNext(0, 2), 11);
    exec("UPDATE download_queue SET pid=1 WHERE task_id=11");
    EXPECT_EQ(DownloadTaskGetNext(0, 2), 0);
}

TEST_F(NextTask, FailingFtpCountOnlyDropsTheLimit) {
    user("u");
    task(1, "u", TASK_STATUS_DOWNLOADING, 11, "ftp://h/a");
    task(2, "u", TASK_STATUS_DOWNLOADING, 12, "ftp://h/b");
    task(3, "u", TASK_STATUS_WAITING, -1, "ftp://h/c");
    exec("ALTER TABLE download_queue RENAME COLUMN url TO link");
    int next = DownloadTaskGetNext(0, 1);
    exec("ALTER TABLE download_queue RENAME COLUMN link TO url");
    EXPECT_EQ(next, 3);
    ASSERT_EQ(logs().size(), 1u);
    EXPECT_EQ(logs()[0].rfind("taskmgt (#) Failed to exec [SELECT url FROM download_queue WHERE "
                              "url ILIKE 'ftp://%' AND status=2] (ERROR:",
                              0),
              0u)
        << logs()[0];
}

TEST_F(NextTask, FailingSelectionGivesMinusOneAndKeepsTheCursor) {
    user("u");
    task(1, "u", TASK_STATUS_DOWNLOADING, 11, "ftp://h:21/a");
    task(2, "u", TASK_STATUS_WAITING, -1, "ftp://h:21/b");
    set_cursor("k");
    exec("ALTER TABLE user_setting RENAME COLUMN user_disabled TO off");
    int oldest = DownloadTaskGetNext(0, 1);
    int rotating = DownloadTaskGetNext(1, 0);
    exec("ALTER TABLE user_setting RENAME COLUMN off TO user_disabled");
    EXPECT_EQ(oldest, -1);
    EXPECT_EQ(rotating, -1);
    EXPECT_EQ(cursor(), "k");
    ASSERT_EQ(logs().size(), 2u);
    EXPECT_EQ(logs()[0].rfind("taskmgt (#) Failed to exec [SELECT task_id, "
                              "user_setting.user_disabled FROM download_queue, user_setting WHERE "
                              "lower(user_setting.username)=lower(download_queue.username) and "
                              "user_disabled!='t' and status=1 and pid=-1 AND (  url NOT ILIKE "
                              "'ftp://h:21%' AND  TRUE ) ORDER BY task_id] (",
                              0),
              0u)
        << logs()[0];
    EXPECT_NE(logs()[1].find("lower(download_queue.username) > lower('k') and status=1 and "
                             "pid=-1  ORDER BY"),
              std::string::npos)
        << logs()[1];
}

TEST_F(RunningCount, CountsLiveWorkersAndFailsTasksWithoutOne) {
    Worker live;
    int dead = gone_pid();
    task(1, "u", TASK_STATUS_DOWNLOADING, live.pid());
    task(2, "u", TASK_STATUS_DOWNLOAD_AUX, -1);
    task(3, "u", TASK_STATUS_DOWNLOADING, 0);
    task(4, "u", TASK_STATUS_DOWNLOADING, dead);
    task(5, "u", TASK_STATUS_SEEDING, live.pid());
    task(6, "u", TASK_STATUS_SEED_AUX, live.pid());
    task(7, "u", TASK_STATUS_WAITING, -1);

    EXPECT_EQ(DownloadTaskDownloadingCount(), 1);
    EXPECT_EQ(statuses(), "1:2 2:101 3:101 4:101 5:8 6:7 7:1");
    EXPECT_EQ(logs(), (std::vector<std::string>{
                          "taskmgt (#) The status task [2] is downloading but pid is -1",
                          "taskmgt (#) The status task [3] is downloading but pid is 0",
                          "taskmgt (#) The process [" + std::to_string(dead) +
                              "] of downloading task(4) is gone. The status now is:2",
                          "taskmgt (#) What happened?",
                      }));
    EXPECT_EQ(DownloadTaskSeedingCount(), 2);
    EXPECT_EQ(DownloadTaskDownloadingCount(), 1);
}

TEST_F(RunningCount, GoneWorkerOfAFinishedOrTakenOverTaskIsNormal) {
    Worker successor;
    int dead = gone_pid();
    task(1, "u", TASK_STATUS_FINISHED, dead);
    EXPECT_EQ(DownloadTaskCountByStatus("task_id=1"), 0);
    EXPECT_EQ(statuses(), "1:5");
    EXPECT_EQ(logs(), (std::vector<std::string>{
                          "taskmgt (#) The process [" + std::to_string(dead) +
                              "] of downloading task(1) is gone. The status now is:5",
                          "taskmgt (#) The status is changed to finished. So it's normal.",
                      }));

    // While task 2 is repaired, the daemon hands task 3 from its first worker to another.
    clear_logs();
    task(2, "u", TASK_STATUS_SEEDING, -1);
    task(3, "u", TASK_STATUS_SEED_AUX, dead);
    exec("CREATE FUNCTION test_takeover() RETURNS trigger LANGUAGE plpgsql AS $$ BEGIN "
         "UPDATE download_queue SET pid=" +
         std::to_string(successor.pid()) + " WHERE task_id=3; RETURN NULL; END $$");
    exec("CREATE TRIGGER test_takeover AFTER UPDATE OF status ON download_queue FOR EACH ROW "
         "WHEN (NEW.task_id = 2) EXECUTE FUNCTION test_takeover()");
    EXPECT_EQ(DownloadTaskSeedingCount(), 0);
    EXPECT_EQ(statuses(), "1:5 2:101 3:7");
    EXPECT_EQ(logs().back(),
              "taskmgt (#) The pid is changed. It's wget->rtorrent. So that's normal.");
    EXPECT_EQ(DownloadTaskSeedingCount(), 1);
}

TEST_F(RunningCount, ConditionIsCheckedAndNeverCut) {
    Worker live;
    task(1, "u", TASK_STATUS_DOWNLOADING, live.pid(),
         "http://example.com/a-rather-long-link-that-goes-on-and-on/file.iso");
    // Longer than any fixed statement buffer would keep.
    EXPECT_EQ(DownloadTaskCountByStatus("status=2 and url='http://example.com/"
                                        "a-rather-long-link-that-goes-on-and-on/file.iso'"),
              1);
    EXPECT_EQ(DownloadTaskCountByStatus("status=2; DELETE FROM download_queue"), -1);
    EXPECT_EQ(DownloadTaskCountByStatus(nullptr), -1);
    EXPECT_EQ(statuses(), "1:2");
    EXPECT_EQ(logs(), (std::vector<std::string>{"taskmgt (#) Failed to escape condition.",
                                                "taskmgt (#) Bad parameters."}));
}

TEST_F(RunningCount, WorkersOfOtherAccountsCountAsAlive) {
    if (geteuid() != 0)
        GTEST_SKIP() << "needs root to count as another account";
    task(1, "u", TASK_STATUS_DOWNLOADING, getpid()); // a root process
    pid_t child = fork();
    if (child == 0) {
        DownloadDBConnect(); // connect first: the session outlives the change of account
        _exit(setuid(65534) == 0 ? DownloadTaskDownloadingCount() : 99);
    }
    int status = 0;
    waitpid(child, &status, 0);
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 1);
    EXPECT_EQ(statuses(), "1:2");
}
