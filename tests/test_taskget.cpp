#include <cctype>
#include <cstring>
#include <string>
#include <vector>

#include "record/taskset_read.h"
#include "tests/fixture.h"
#include "tests/test_platform_support.h"
#include "torvale/task.h"

namespace {
using S = std::vector<std::string>;
}

class TaskRead : public DbTest {
  protected:
    void SetUp() override {
        DbTest::SetUp();
        exec("INSERT INTO download_queue(task_id, username, pid, url, filename, status, "
             "total_upload, seeding_ratio, seeding_interval, seeding_elapsed, task_flags, "
             "destination, extra_info) VALUES "
             "(1, 'Alice', -1, 'http://h/x', 'a-rather-long-name.iso', 1, 6442450944, 150, "
             "3600, 77, 36, 'downloads/iso', 'tracker=http://t/announce'), "
             "(2, 'bob', 3131, 'http://h/y', NULL, 2, NULL, NULL, NULL, NULL, 0, NULL, NULL)");
    }
};

TEST_F(TaskRead, ListingReadsReturnTheFieldOrTheirOwnFailureValue) {
    char name[8];
    std::memset(name, '#', sizeof name);
    EXPECT_EQ(DownloadTaskFilenameGet(1, name, sizeof name), 0);
    EXPECT_STREQ(name, "a-rathe");
    EXPECT_EQ(DownloadTaskFilenameGet(2, name, sizeof name), 0);
    EXPECT_STREQ(name, "");
    EXPECT_EQ(DownloadTaskPidGet(1), -1); // waiting: the stored "no process"
    EXPECT_EQ(DownloadTaskPidGet(2), 3131);
    EXPECT_EQ(DownloadTaskStatusGet(2), 2);
    EXPECT_TRUE(logs().empty());

    std::strcpy(name, "keep");
    EXPECT_EQ(DownloadTaskFilenameGet(99, name, sizeof name), -1);
    EXPECT_STREQ(name, "keep");
    EXPECT_EQ(DownloadTaskPidGet(99), -2);
    EXPECT_EQ(DownloadTaskPidGet(-1), -2);
    EXPECT_EQ(DownloadTaskStatusGet(99), -1);
    EXPECT_EQ(logs(), S(4, "taskget (#) Failed to get the queue infor."));
}

TEST_F(TaskRead, ColumnReaderCopiesCutTextsAndNamesTheFieldOnFailure) {
    EXPECT_EQ(DownloadTaskSeedElapsedGet(1), 77);
    EXPECT_EQ(DownloadTaskTotalUploadGet(1), 6442450944ULL);
    EXPECT_EQ(DownloadTaskSeedElapsedGet(2), 0);
    EXPECT_EQ(DownloadTaskTotalUploadGet(2), 0ULL);
    char buf[6];
    EXPECT_EQ(DownloadTaskUserGet(1, buf, sizeof buf), 0);
    EXPECT_STREQ(buf, "Alice");
    EXPECT_EQ(DownloadTaskDestinationGet(1, buf, sizeof buf), 0);
    EXPECT_STREQ(buf, "downl");
    EXPECT_EQ(DownloadTaskDestinationGet(2, buf, sizeof buf), 0);
    EXPECT_STREQ(buf, "");
    EXPECT_EQ(DownloadTaskFieldGet(1, "status", buf, 2), 0);
    EXPECT_STREQ(buf, "1");
    EXPECT_TRUE(logs().empty());

    EXPECT_EQ(DownloadTaskUserGet(1, buf, 0), -1);
    EXPECT_EQ(DownloadTaskDestinationGet(1, nullptr, 10), -1);
    EXPECT_EQ(DownloadTaskSeedElapsedGet(-4), 0);
    EXPECT_EQ(DownloadTaskFieldGet(1, nullptr, buf, sizeof buf), -1);
    EXPECT_EQ(DownloadTaskTotalUploadGet(42), 0ULL);
    EXPECT_EQ(
        logs(),
        (S{"taskset:# Bad parameter", "taskset:# Failed to get [username] value of task [1]",
           "taskset:# Bad parameter", "taskset:# Failed to get [destination] value of task [1]",
           "taskset:# Bad parameter",
           "taskset:# Failed to get [seeding_elapsed] value of task [-4]",
           "taskset:# Bad parameter", "taskset:# No such task id [42] in database",
           "taskset:# Failed to get [total_upload] value of task [42]"}));
}

TEST_F(TaskRead, FlagsAndSettingsReadOrLeaveTheRecordAlone) {
    EXPECT_EQ(DownloadTaskFlagsGet(1), 36);
    DownloadTaskSetting setting{-5, -5};
    EXPECT_EQ(DownloadTaskSettingGet(1, &setting), 0);
    EXPECT_EQ(setting.seeding_ratio, 150);
    EXPECT_EQ(setting.seeding_interval, 3600);
    EXPECT_EQ(DownloadTaskSettingGet(2, &setting), 0);
    EXPECT_EQ(setting.seeding_ratio, 0);
    EXPECT_EQ(setting.seeding_interval, 0);
    EXPECT_TRUE(logs().empty());

    setting = {7, 8};
    EXPECT_EQ(DownloadTaskSettingGet(9, &setting), -1);
    EXPECT_EQ(DownloadTaskSettingGet(-1, &setting), -1);
    EXPECT_EQ(setting.seeding_ratio, 7);
    EXPECT_EQ(setting.seeding_interval, 8);
    EXPECT_EQ(DownloadTaskSettingGet(1, nullptr), -1);
    EXPECT_EQ(DownloadTaskFlagsGet(9), -1);
    EXPECT_EQ(DownloadTaskFlagsGet(-9), -1);
    EXPECT_EQ(logs(), (S{"taskset (#) There is no such task id 9 in the database...why~~~",
                         "taskset (#) Bad parameters.", "taskset (#) Bad parameters.",
                         "taskset (#) There is no such task id 9 in the database...why~~~",
                         "taskset (#) Bad parameters."}));
}

TEST_F(TaskRead, ExtraInfoGivesItsLengthThenTheText) {
    int length = DownloadTaskExtraInfoGet(1, nullptr, 0);
    EXPECT_EQ(length, 25);
    std::vector<char> whole(static_cast<size_t>(length) + 1, '#');
    EXPECT_EQ(DownloadTaskExtraInfoGet(1, whole.data(), length + 1), 25);
    EXPECT_STREQ(whole.data(), "tracker=http://t/announce");
    char cut[8];
    EXPECT_EQ(DownloadTaskExtraInfoGet(1, cut, sizeof cut), 25);
    EXPECT_STREQ(cut, "tracker");

    // The length is in bytes, so that it sizes the buffer of the second call.
    exec("UPDATE download_queue SET extra_info='añ日' WHERE task_id=1");
    length = DownloadTaskExtraInfoGet(1, nullptr, 0);
    EXPECT_EQ(length, 6);
    whole.assign(static_cast<size_t>(length) + 1, '#');
    EXPECT_EQ(DownloadTaskExtraInfoGet(1, whole.data(), length + 1), 6);
    EXPECT_STREQ(whole.data(), "añ日");

    // NULL reads as the empty text in both modes.
    EXPECT_EQ(DownloadTaskExtraInfoGet(2, nullptr, 0), 0);
    std::strcpy(cut, "old");
    EXPECT_EQ(DownloadTaskExtraInfoGet(2, cut, sizeof cut), 0);
    EXPECT_STREQ(cut, "");
    EXPECT_TRUE(logs().empty());

    EXPECT_EQ(DownloadTaskExtraInfoGet(1, cut, 0), 0);
    EXPECT_EQ(DownloadTaskExtraInfoGet(-1, nullptr, 0), 0);
    EXPECT_EQ(DownloadTaskExtraInfoGet(5, nullptr, 0), 0);
    EXPECT_EQ(logs(), (S{"taskset (#) Bad parameters.", "taskset (#) Bad parameters.",
                         "taskset (#) There is no such task id 5 in the database...why~~~"}));
}

TEST_F(TaskRead, FailingStatementsAreLoggedInTheFormOfTheirUnit) {
    exec("ALTER TABLE download_queue RENAME COLUMN task_flags TO flags_gone");
    exec("ALTER TABLE download_queue RENAME COLUMN destination TO destination_gone");
    exec("ALTER TABLE download_queue RENAME COLUMN username TO owner");
    char buf[16];
    EXPECT_EQ(DownloadTaskFlagsGet(1), -1);
    EXPECT_EQ(DownloadTaskDestinationGet(1, buf, sizeof buf), -1);
    EXPECT_EQ(DownloadTaskStatusGet(1), -1);
    EXPECT_EQ(DownloadTaskCount("x"), -1);
    exec("ALTER TABLE download_queue RENAME TO download_queue_gone");
    EXPECT_EQ(DownloadLastTaskIDGet(nullptr), -1);
    exec("ALTER TABLE download_queue_gone RENAME TO download_queue");
    exec("ALTER TABLE download_queue RENAME COLUMN flags_gone TO task_flags");
    exec("ALTER TABLE download_queue RENAME COLUMN destination_gone TO destination");
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
        "taskget (#) Failed to query database. (ERROR:  relation \"download_queue\" does not "
        "exist"};
    ASSERT_EQ(logs().size(), starts.size());
    for (size_t i = 0; i < starts.size(); ++i)
        EXPECT_EQ(logs()[i].rfind(starts[i], 0), 0u) << logs()[i];
}

using TaskTotals = DbTest;

TEST_F(TaskTotals, CountAndLastIdOverAllOrOneUser) {
    EXPECT_EQ(DownloadTaskCount(nullptr), 0);
    EXPECT_EQ(DownloadLastTaskIDGet(nullptr), 0); // max over nothing is NULL
    EXPECT_EQ(DownloadLastTaskIDGet("alice"), 0);
    exec("INSERT INTO download_queue(task_id, username) VALUES (3, 'Alice'), (8, 'bob'), "
         "(5, 'ALICE'), (11, 'o''brien')");
    EXPECT_EQ(DownloadTaskCount(nullptr), 4);
    EXPECT_EQ(DownloadTaskCount("alice"), 2);
    EXPECT_EQ(DownloadTaskCount("O'Brien"), 1);
    EXPECT_EQ(DownloadTaskCount(""), 0);
    EXPECT_EQ(DownloadLastTaskIDGet(nullptr), 11);
    EXPECT_EQ(DownloadLastTaskIDGet("aLiCe"), 5);
    // However long the name, the statement is sent whole.
    std::string hostile = std::string(1500, '\'') + "') OR TRUE OR lower('";
    EXPECT_EQ(DownloadTaskCount(hostile.c_str()), 0);
    EXPECT_EQ(DownloadLastTaskIDGet(hostile.c_str()), 0);
    EXPECT_TRUE(logs().empty());
    EXPECT_EQ(value("SELECT count(*) FROM download_queue"), "4");
}

class TaskRate : public DbTest {
  protected:
    HostGroup admins_{"administrators"};
    HostUser admin_;
    HostUser plain_;

    void SetUp() override {
        DbTest::SetUp();
        admins_.add(admin_);
        // Rates in powers of two, so each sum says which statuses it took.
        std::string values;
        int bit = 0;
        for (const std::string &user : {plain_.name(), upper(plain_.name()), admin_.name()})
            for (int status : {1, 2, 3, 5, 6, 7, 8, 101, 4}) {
                values += (values.empty() ? "('" : ", ('") + user + "', " + std::to_string(status) +
                          ", " + std::to_string(1 << bit) + ", " + std::to_string(1 << (bit + 1)) +
                          ")";
                bit = (bit + 2) % 28;
            }
        exec("INSERT INTO download_queue(username, status, current_rate, upload_rate) VALUES " +
             values);
    }
    static std::string upper(std::string s) {
        for (char &c : s)
            c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
        return s;
    }
    std::string sums(const std::string &where) {
        return value("SELECT coalesce(sum(current_rate), 0) || ' ' || coalesce(sum(upload_rate), "
                     "0) FROM download_queue WHERE status IN (2, 7, 8) " +
                     where);
    }
};

TEST_F(TaskRate, AdministratorsSeeEveryonesActiveTasksOthersTheirOwn) {
    int dl = -1, ul = -1;
    ASSERT_EQ(DownloadTotalRateGet(admin_.c_str(), &dl, &ul), 0);
    EXPECT_EQ(std::to_string(dl) + " " + std::to_string(ul), sums(""));

    ASSERT_EQ(DownloadTotalRateGet(plain_.c_str(), &dl, &ul), 0);
    EXPECT_EQ(std::to_string(dl) + " " + std::to_string(ul),
              sums("AND lower(username)=lower('" + plain_.name() + "')"));
    EXPECT_NE(sums("AND lower(username)=lower('" + plain_.name() + "')"), sums(""));
    EXPECT_TRUE(logs().empty());

    // Nothing downloading or seeding: both rates 0, and still success.
    exec("UPDATE download_queue SET status=6 WHERE status IN (2, 7, 8)");
    ASSERT_EQ(DownloadTotalRateGet(admin_.c_str(), &dl, &ul), 0);
    EXPECT_EQ(dl, 0);
    EXPECT_EQ(ul, 0);
    dl = ul = -1;
    ASSERT_EQ(DownloadTotalRateGet(plain_.c_str(), &dl, &ul), 0);
    EXPECT_EQ(dl, 0);
    EXPECT_EQ(ul, 0);
}

TEST_F(TaskRate, RefusalsAndUnknownUsersLeaveTheRatesAlone) {
    int dl = 7, ul = 9;
    EXPECT_EQ(DownloadTotalRateGet(nullptr, &dl, &ul), -1);
    EXPECT_EQ(DownloadTotalRateGet(plain_.c_str(), nullptr, &ul), -1);
    EXPECT_EQ(DownloadTotalRateGet(plain_.c_str(), &dl, nullptr), -1);
    EXPECT_EQ(DownloadTotalRateGet("no-such-user-anywhere", &dl, &ul), -1);
    EXPECT_EQ(dl, 7);
    EXPECT_EQ(ul, 9);
    EXPECT_EQ(logs(), (S{"taskget (#) Bad parameter.", "taskget (#) Bad parameter.",
                         "taskget (#) Bad parameter.",
                         "taskget:# Failed to check admin group, user [no-such-user-anywhere]. "
                         "[0x1D00]"}));
}
