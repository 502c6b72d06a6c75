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
    // Every test starts without a cursor; the next test frees one a test leaves.
    void SetUp() override {
        DbTest::SetUp();
        set_cursor(nullptr);
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
    void task(int id, const std::string &owner, int status = TASK_STATUS_WAITING, int pid = -1,
              const std::string &url = "http://example.com/file") {
        exec("INSERT INTO download_queue (task_id, username, status, pid, url) VALUES (" +
             std::to_string(id) + ", $q$" + owner + "$q$, " + std::to_string(status) + ", " +
             std::to_string(pid) + ", '" + url + "')");
    }
    std::string statuses() {
        return value("SELECT string_agg(task_id || ':' || status, ' ' ORDER BY task_id) FROM "
                     "download_queue");
    }
};
using RunningCount = NextTask;

// The pid of a process that has ended and been reaped.
int gone_pid() {
    pid_t pid = fork();
    if (pid == 0)
        _exit(0);
    waitpid(pid, nullptr, 0);
    return pid;
}

} // namespace

TEST_F(NextTask, TakesWaitingTasksOfEnabledUsersOldestFirstOrUsersInTurn) {
    // "O'Neil" sorts before "a" as stored, yet its turn comes after "b".
    for (const char *name : {"a", "b", "o'neil"})
        user(name);
    user("off", true);
    task(1, "a", TASK_STATUS_WAITING, 4242); // a worker holds it already
    task(2, "b", TASK_STATUS_PAUSED);
    task(3, "off");
    task(4, "nobody"); // no settings row
    task(5, "A");      // the same user as "a", in other letters
    task(6, "a");
    task(7, "b");
    task(8, "O'Neil");
    set_cursor("zed");
    EXPECT_EQ(DownloadTaskGetNext(0, 0), 5);
    EXPECT_EQ(cursor(), "zed"); // only the rotation moves it
    std::string seen;
    for (int i = 0; i < 4; ++i) {
        int id = DownloadTaskGetNext(1, 0);
        seen += std::to_string(id) + cursor() + " ";
    }
    EXPECT_EQ(seen, "5A 7b 8O'Neil 5A ");
    exec("UPDATE download_queue SET status=2 WHERE task_id<>6"); // only the cursor's user is left
    EXPECT_EQ(DownloadTaskGetNext(1, 0), 6);
    exec("UPDATE download_queue SET status=2");
    EXPECT_EQ(DownloadTaskGetNext(0, 0), 0);
    EXPECT_EQ(DownloadTaskGetNext(1, 0), 0);
    EXPECT_EQ(cursor(), "<null>");
    EXPECT_TRUE(logs().empty());
}

TEST_F(NextTask, FtpLimitHoldsBackServersWithEnoughDownloads) {
    user("u");
    task(1, "u", TASK_STATUS_DOWNLOADING, 11, "ftp://Host.example:21/a");
    task(2, "u", TASK_STATUS_DOWNLOADING, 12, "FTP://host.EXAMPLE:21/dir/b");
    task(3, "u", TASK_STATUS_DOWNLOAD_AUX, 13, "ftp://other.example/c"); // not counted
    for (int id : {5, 6}) // no host: no server to count
        task(id, "u", TASK_STATUS_DOWNLOADING, id, "ftp:///x");
    // '_' and '%' in an account part must not match other servers' links.
    for (int id : {7, 8})
        task(id, "u", TASK_STATUS_DOWNLOADING, id, "ftp://my_user:p%40ss@h/f");
    task(20, "u", TASK_STATUS_WAITING, -1, "ftp://HOST.example:21/x");
    task(21, "u", TASK_STATUS_WAITING, -1, "ftp://my_user:p%40ss@h/g");
    task(22, "u", TASK_STATUS_WAITING, -1, "ftp://myXuser:pX40ss@h/g");
    task(23, "u", TASK_STATUS_WAITING, -1, "ftp://other.example/y");

    EXPECT_EQ(DownloadTaskGetNext(0, 2), 22);
    EXPECT_EQ(DownloadTaskGetNext(1, 2), 22);
    EXPECT_EQ(DownloadTaskGetNext(0, 3), 20);
    exec("UPDATE download_queue SET status=5 WHERE task_id IN (20, 21, 22)");
    EXPECT_EQ(DownloadTaskGetNext(0, 1), 23);
    EXPECT_TRUE(logs().empty());
}

TEST_F(NextTask, FailuresEndTheCallButAFailingFtpCountOnlyDropsTheLimit) {
    user("u");
    task(1, "u", TASK_STATUS_DOWNLOADING, 11, "ftp://h:21/a");
    task(2, "u", TASK_STATUS_WAITING, -1, "ftp://h:21/b");
    set_cursor("k");
    exec("ALTER TABLE download_queue RENAME COLUMN url TO link");
    EXPECT_EQ(DownloadTaskGetNext(0, 1), 2);
    exec("ALTER TABLE download_queue RENAME COLUMN link TO url");
    exec("ALTER TABLE user_setting RENAME COLUMN user_disabled TO off");
    EXPECT_EQ(DownloadTaskGetNext(0, 1), -1);
    EXPECT_EQ(DownloadTaskGetNext(1, 0), -1);
    exec("ALTER TABLE user_setting RENAME COLUMN off TO user_disabled");
    EXPECT_EQ(cursor(), "k");
    ASSERT_EQ(logs().size(), 3u);
    const std::string prefixes[] = {
        "taskmgt (#) Failed to exec [SELECT url FROM download_queue WHERE url ILIKE 'ftp://%' "
        "AND status=2] (ERROR:",
        "taskmgt (#) Failed to exec [SELECT task_id, user_setting.user_disabled FROM "
        "download_queue, user_setting WHERE "
        "lower(user_setting.username)=lower(download_queue.username) and user_disabled!='t' and "
        "status=1 and pid=-1 AND (  url NOT ILIKE 'ftp://h:21%' AND  TRUE ) ORDER BY task_id] (",
    };
    for (int i = 0; i < 2; ++i) // the rotating failure logs through the same call as the oldest
        EXPECT_EQ(logs()[i].rfind(prefixes[i], 0), 0u) << logs()[i];
}

TEST_F(RunningCount, CountsLiveWorkersAndFailsTasksWithoutOne) {
    const int live = getpid();
    const int dead = gone_pid();
    const std::string url = "http://example.com/a-rather-long-link-that-goes-on-and-on/file.iso";
    task(1, "u", TASK_STATUS_DOWNLOADING, live, url);
    task(2, "u", TASK_STATUS_DOWNLOAD_AUX, -1);
    task(3, "u", TASK_STATUS_DOWNLOADING, 0);
    task(4, "u", TASK_STATUS_DOWNLOADING, dead);
    task(5, "u", TASK_STATUS_SEEDING, live);
    task(6, "u", TASK_STATUS_SEED_AUX, live);
    task(7, "u", TASK_STATUS_WAITING, -1);

    // The condition is checked against the condition language and never cut.
    EXPECT_EQ(DownloadTaskCountByStatus(("status=2 and url='" + url + "'").c_str()), 1);
    EXPECT_EQ(DownloadTaskCountByStatus("status=2; DELETE FROM download_queue"), -1);
    EXPECT_EQ(DownloadTaskCountByStatus(nullptr), -1);
    EXPECT_EQ(DownloadTaskDownloadingCount(), 1);
    EXPECT_EQ(statuses(), "1:2 2:101 3:101 4:101 5:8 6:7 7:1");
    EXPECT_EQ(logs(), (std::vector<std::string>{
                          "taskmgt (#) Failed to escape condition.",
                          "taskmgt (#) Bad parameters.",
                          "taskmgt (#) The status task [2] is downloading but pid is -1",
                          "taskmgt (#) The status task [3] is downloading but pid is 0",
                          "taskmgt (#) The process [" + std::to_string(dead) +
                              "] of downloading task(4) is gone. The status now is:2",
                          "taskmgt (#) What happened?",
                      }));
    EXPECT_EQ(DownloadTaskSeedingCount(), 2);
}

TEST_F(RunningCount, GoneWorkerOfAFinishedOrTakenOverTaskIsNormal) {
    const int dead = gone_pid();
    task(1, "u", TASK_STATUS_FINISHED, dead);
    // While task 2 is repaired, another worker (this process) takes over task 3.
    task(2, "u", TASK_STATUS_SEEDING, -1);
    task(3, "u", TASK_STATUS_SEED_AUX, dead);
    exec("CREATE FUNCTION test_takeover() RETURNS trigger LANGUAGE plpgsql AS $$ BEGIN "
         "UPDATE download_queue SET pid=" +
         std::to_string(getpid()) + " WHERE task_id=3; RETURN NULL; END $$");
    exec("CREATE TRIGGER test_takeover AFTER UPDATE OF status ON download_queue FOR EACH ROW "
         "WHEN (NEW.task_id = 2) EXECUTE FUNCTION test_takeover()");
    EXPECT_EQ(DownloadTaskCountByStatus("status=5 or status=8 or status=7"), 0);
    exec("DROP FUNCTION test_takeover() CASCADE");
    EXPECT_EQ(statuses(), "1:5 2:101 3:7");
    EXPECT_TRUE(logged("taskmgt (#) The status is changed to finished. So it's normal."));
    EXPECT_TRUE(logged("taskmgt (#) The pid is changed. It's wget->rtorrent. So that's normal."));
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
    EXPECT_EQ(WEXITSTATUS(status), 1); // counted, not failed
}
