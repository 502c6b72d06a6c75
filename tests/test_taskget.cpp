#include <string>
#include <vector>

#include "record/taskset_read.h"
#include "tests/fixture.h"
#include "tests/test_platform_support.h"
#include "torvale/task.h"

namespace {
using S = std::vector<std::string>;
using V = std::vector<long long>;

// "return value:buffer" of a text read into `size` bytes of '#' (and one more to end it).
template <typename Read> std::string text(Read read, int task_id, int size) {
    std::string buf(static_cast<size_t>(size), '#');
    int rc = read(task_id, buf.data(), size);
    return std::to_string(rc) + ":" + buf.c_str();
}
} // namespace

class TaskRead : public DbTest {
  protected:
    void SetUp() override {
        DbTest::SetUp();
        exec("INSERT INTO download_queue(task_id, username, pid, url, filename, status, "
             "total_upload, seeding_ratio, seeding_interval, seeding_elapsed, task_flags, "
             "destination, extra_info) VALUES "
             "(1, 'Alice', -1, 'http://h/x', 'a-rather-long-name.iso', 1, 6442450944, 150, "
             "3600, 77, 36, 'downloads/iso', 'tracker=añ日'), "
             "(2, 'bob', 3131, 'http://h/y', NULL, 2, NULL, NULL, NULL, NULL, 0, NULL, NULL)");
    }
};

TEST_F(TaskRead, ReadsGiveTheFieldOrTheirOwnFailureValue) {
    // Texts are cut to size-1 bytes; a NULL text reads as "", a NULL number as 0.
    EXPECT_EQ(text(DownloadTaskFilenameGet, 1, 8), "0:a-rathe");
    EXPECT_EQ(text(DownloadTaskUserGet, 1, 6), "0:Alice");
    EXPECT_EQ(text(DownloadTaskDestinationGet, 1, 6), "0:downl");
    EXPECT_EQ(text(DownloadTaskDestinationGet, 2, 6), "0:");
    EXPECT_EQ(
        (V{DownloadTaskPidGet(1), DownloadTaskPidGet(2), DownloadTaskStatusGet(2),
           DownloadTaskSeedElapsedGet(1), static_cast<long long>(DownloadTaskTotalUploadGet(1)),
           DownloadTaskSeedElapsedGet(2), DownloadTaskFlagsGet(1)}),
        (V{-1, 3131, 2, 77, 6442450944, 0, 36}));
    DownloadTaskSetting setting{-5, -5};
    EXPECT_EQ(DownloadTaskSettingGet(1, &setting), 0);
    EXPECT_EQ((V{setting.seeding_ratio, setting.seeding_interval}), (V{150, 3600}));

    // Failures leave the buffer and the record as they were.
    EXPECT_EQ(text(DownloadTaskFilenameGet, 99, 4), "-1:####");
    EXPECT_EQ(text(DownloadTaskUserGet, 1, 0), "-1:");
    EXPECT_EQ(DownloadTaskDestinationGet(1, nullptr, 10), -1);
    char buf[4];
    EXPECT_EQ(DownloadTaskFieldGet(1, nullptr, buf, sizeof buf), -1);
    EXPECT_EQ((V{DownloadTaskPidGet(99), DownloadTaskStatusGet(99), DownloadTaskSeedElapsedGet(-4),
                 static_cast<long long>(DownloadTaskTotalUploadGet(42)), DownloadTaskFlagsGet(9),
                 DownloadTaskFlagsGet(-9)}),
              (V{-2, -1, 0, 0, -1, -1}));
    setting = {7, 8};
    EXPECT_EQ(DownloadTaskSettingGet(9, &setting), -1);
    EXPECT_EQ(DownloadTaskSettingGet(-1, &setting), -1);
    EXPECT_EQ((V{setting.seeding_ratio, setting.seeding_interval}), (V{7, 8}));
    EXPECT_EQ(DownloadTaskSettingGet(1, nullptr), -1);
    const std::string no_row = "taskset (#) There is no such task id 9 in the database...why~~~";
    EXPECT_EQ(logs(),
              (S{"taskget (#) Failed to get the queue infor.", "taskset:# Bad parameter",
                 "taskset:# Failed to get [username] value of task [1]", "taskset:# Bad parameter",
                 "taskset:# Failed to get [destination] value of task [1]",
                 "taskset:# Bad parameter", "taskget (#) Failed to get the queue infor.",
                 "taskget (#) Failed to get the queue infor.", "taskset:# Bad parameter",
                 "taskset:# Failed to get [seeding_elapsed] value of task [-4]",
                 "taskset:# No such task id [42] in database",
                 "taskset:# Failed to get [total_upload] value of task [42]", no_row,
                 "taskset (#) Bad parameters.", no_row, "taskset (#) Bad parameters.",
                 "taskset (#) Bad parameters."}));
}

TEST_F(TaskRead, ExtraInfoGivesItsLengthInBytesThenTheText) {
    // Bytes, not characters, so that the length sizes the buffer of the second call; a
    // cut copy still returns the full length.
    EXPECT_EQ(DownloadTaskExtraInfoGet(1, nullptr, 0), 14);
    EXPECT_EQ(text(DownloadTaskExtraInfoGet, 1, 15), "14:tracker=añ日");
    EXPECT_EQ(text(DownloadTaskExtraInfoGet, 1, 8), "14:tracker");
    // NULL reads as the empty text in both modes.
    EXPECT_EQ(DownloadTaskExtraInfoGet(2, nullptr, 0), 0);
    EXPECT_EQ(text(DownloadTaskExtraInfoGet, 2, 8), "0:");

    EXPECT_EQ(text(DownloadTaskExtraInfoGet, 1, 0), "0:");
    EXPECT_EQ(DownloadTaskExtraInfoGet(-1, nullptr, 0), 0);
    EXPECT_EQ(DownloadTaskExtraInfoGet(5, nullptr, 0), 0);
    EXPECT_EQ(logs(), (S{"taskset (#) Bad parameters.", "taskset (#) Bad parameters.",
                         "taskset (#) There is no such task id 5 in the database...why~~~"}));
}

TEST_F(TaskRead, FailingStatementsAreLoggedInTheFormOfTheirUnit) {
    exec("ALTER TABLE download_queue RENAME COLUMN task_id TO id_gone");
    exec("ALTER TABLE download_queue RENAME COLUMN username TO owner");
    char buf[16];
    EXPECT_EQ((V{DownloadTaskFlagsGet(1), DownloadTaskDestinationGet(1, buf, sizeof buf),
                 DownloadTaskStatusGet(1), DownloadTaskCount("x"), DownloadLastTaskIDGet(nullptr)}),
              V(5, -1));
    exec("ALTER TABLE download_queue RENAME COLUMN id_gone TO task_id");
    exec("ALTER TABLE download_queue RENAME COLUMN owner TO username");
    const S starts{
        "taskset (#) Failed to exec [SELECT task_flags FROM download_queue where task_id=1] "
        "(ERROR:",
        "taskset:# Failed to exec [SELECT destination FROM download_queue where task_id=1] "
        "(ERROR:",
        "taskset:# Failed to get [destination] value of task [1]",
        "queue (#) Failed to exec [SELECT task_id,",
        "taskget (#) Failed to open queue handler.",
        "taskget (#) Failed to exec [SELECT count(*) FROM download_queue WHERE "
        "lower(username)=lower('x')] (ERROR:",
        "taskget (#) Failed to query database. (ERROR:  column \"task_id\" does not exist"};
    ASSERT_EQ(logs().size(), starts.size());
    for (size_t i = 0; i < starts.size(); ++i)
        EXPECT_EQ(logs()[i].rfind(starts[i], 0), 0u) << logs()[i];
}

using TaskTotals = DbTest;

TEST_F(TaskTotals, CountAndLastIdOverAllOrOneUser) {
    EXPECT_EQ(DownloadLastTaskIDGet(nullptr), 0); // max over nothing is NULL
    exec("INSERT INTO download_queue(task_id, username) VALUES (3, 'Alice'), (8, 'bob'), "
         "(5, 'ALICE'), (11, 'o''brien')");
    EXPECT_EQ(
        (V{DownloadTaskCount(nullptr), DownloadTaskCount("alice"), DownloadTaskCount("O'Brien"),
           DownloadLastTaskIDGet(nullptr), DownloadLastTaskIDGet("aLiCe")}),
        (V{4, 2, 1, 11, 5}));
    // However long the name, the statement is sent whole.
    std::string hostile = std::string(1500, '\'') + "') OR TRUE OR lower('";
    EXPECT_EQ(DownloadTaskCount(hostile.c_str()), 0);
    EXPECT_TRUE(logs().empty());
}

class TaskRate : public DbTest {
  protected:
    HostGroup admins_{"administrators"};
    HostUser admin_;
    HostUser plain_;

    void SetUp() override {
        DbTest::SetUp();
        admins_.add(admin_);
        // Rates in powers of two, so each sum says which tasks it took; the plain user's
        // tasks are stored under its name in two letter cases. Active: 2, 7 and 8.
        const std::string p = "'" + plain_.name() + "'", a = "'" + admin_.name() + "'";
        exec("INSERT INTO download_queue(username, status, current_rate, upload_rate) "
             "SELECT u, s, r, 2 * r FROM (VALUES (" +
             p + ", 2, 1), (upper(" + p + "), 7, 4), (" + p + ", 8, 16), (" + a + ", 2, 64), (" +
             p + ", 1, 256), (" + p + ", 3, 512), (" + a + ", 4, 1024), (upper(" + p +
             "), 5, 2048), (" + p + ", 6, 4096), (" + a + ", 101, 8192)) AS v(u, s, r)");
    }
    // "download upload" as DownloadTotalRateGet gives them for `user`.
    static std::string rates(const char *user) {
        int dl = -1, ul = -1;
        EXPECT_EQ(DownloadTotalRateGet(user, &dl, &ul), 0) << user;
        return std::to_string(dl) + " " + std::to_string(ul);
    }
};

TEST_F(TaskRate, AdministratorsSeeEveryonesActiveTasksOthersTheirOwn) {
    EXPECT_EQ(rates(admin_.c_str()), "85 170");
    EXPECT_EQ(rates(plain_.c_str()), "21 42");
    // Nothing downloading or seeding: both rates 0, and still success.
    exec("UPDATE download_queue SET status=6 WHERE status IN (2, 7, 8)");
    EXPECT_EQ(rates(admin_.c_str()), "0 0");

    // Refusals and unknown users leave the outputs as they were.
    int dl = 7, ul = 9;
    EXPECT_EQ(DownloadTotalRateGet(nullptr, &dl, &ul), -1);
    EXPECT_EQ(DownloadTotalRateGet(plain_.c_str(), nullptr, &ul), -1);
    EXPECT_EQ(DownloadTotalRateGet(plain_.c_str(), &dl, nullptr), -1);
    EXPECT_EQ(DownloadTotalRateGet("no-such-user-anywhere", &dl, &ul), -1);
    EXPECT_EQ((V{dl, ul}), (V{7, 9}));
    EXPECT_EQ(logs(), (S{"taskget (#) Bad parameter.", "taskget (#) Bad parameter.",
                         "taskget (#) Bad parameter.",
                         "taskget:# Failed to check admin group, user [no-such-user-anywhere]. "
                         "[0x1D00]"}));
}
