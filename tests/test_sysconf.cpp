#include <cstdio>
#include <cstring>

#include "tests/fixture.h"
#include "torvale/task.h"

namespace {

DownloadConf make_conf(const char *when, int order, int ratio, int interval) {
    DownloadConf conf;
    std::memset(&conf, 0, sizeof conf);
    std::snprintf(conf.download_when, sizeof conf.download_when, "%s", when);
    conf.download_order = order;
    conf.seeding_ratio = ratio;
    conf.seeding_interval = interval;
    return conf;
}

} // namespace

using SysConf = DbTest;

TEST_F(SysConf, FirstSetInsertsLaterSetsUpdateAndEnabledIsAlwaysOne) {
    DownloadConf conf = make_conf("01:00-05:00", 1, 150, 3600);
    conf.enabled = 0;
    ASSERT_EQ(DownloadConfSet(&conf), 0);
    conf = make_conf("it's", 2, 0, 60);
    ASSERT_EQ(DownloadConfSet(&conf), 0);
    EXPECT_EQ(count("SELECT * FROM sysconf"), 1);
    EXPECT_EQ(value("SELECT download_enabled || ' ' || download_when || ' ' || download_order || "
                    "' ' || seeding_ratio || ' ' || seeding_interval FROM sysconf"),
              "1 it's 2 0 60");

    DownloadConf back;
    std::memset(&back, 0x5a, sizeof back);
    ASSERT_EQ(DownloadConfGet(&back), 0);
    EXPECT_EQ(back.enabled, 1);
    EXPECT_STREQ(back.download_when, "it's");
    EXPECT_EQ(back.download_order, 2);
    EXPECT_EQ(back.seeding_ratio, 0);
    EXPECT_EQ(back.seeding_interval, 60);
    // The daemon's words are left as they were.
    EXPECT_EQ(back.reserved[0], 0x5a5a5a5a);
    EXPECT_EQ(back.daemon_fields[31], 0x5a5a5a5a);
    EXPECT_TRUE(logs().empty());
}

TEST_F(SysConf, ScheduleTextsAreCutToElevenCharactersBothWays) {
    exec("INSERT INTO sysconf VALUES (1, '0123456789abcdef', 1, 2, 3)");
    DownloadConf conf;
    std::memset(&conf, 0, sizeof conf);
    ASSERT_EQ(DownloadConfGet(&conf), 0);
    EXPECT_STREQ(conf.download_when, "0123456789a");

    // A record whose schedule fills all twelve bytes is read as its first eleven.
    std::memset(conf.download_when, 'w', sizeof conf.download_when);
    ASSERT_EQ(DownloadConfSet(&conf), 0);
    EXPECT_EQ(value("SELECT download_when FROM sysconf"), "wwwwwwwwwww");
}

TEST_F(SysConf, FailuresLeaveTheRecordUntouched) {
    DownloadConf conf;
    std::memset(&conf, 0x33, sizeof conf);
    DownloadConf before = conf;
    EXPECT_EQ(DownloadConfGet(&conf), -1);
    EXPECT_EQ(std::memcmp(&conf, &before, sizeof conf), 0);
    EXPECT_EQ(DownloadConfGet(nullptr), -1);
    EXPECT_EQ(DownloadConfSet(nullptr), -1);
    EXPECT_EQ(logs(), (std::vector<std::string>{
                          "sysconf (#) There is no system config in the database...why~~~",
                          "sysconf (#) Bad parameter.", "sysconf (#) Bad parameters."}));
}

TEST_F(SysConf, AFailingStoreLeavesTheTableAsItWas) {
    exec("INSERT INTO sysconf VALUES (1, 'keep', 1, 2, 3)");
    exec("ALTER TABLE sysconf RENAME COLUMN seeding_interval TO seeding_secs");
    DownloadConf conf = make_conf("new", 9, 9, 9);
    EXPECT_EQ(DownloadConfSet(&conf), -1);
    exec("ALTER TABLE sysconf RENAME COLUMN seeding_secs TO seeding_interval");
    EXPECT_EQ(value("SELECT download_when FROM sysconf"), "keep");
    ASSERT_EQ(logs().size(), 1u);
    EXPECT_EQ(logs()[0].rfind("sysconf (#) Failed to exec [UPDATE sysconf set download_enabled=1,"
                              "download_when='new', download_order=9,seeding_ratio=9, "
                              "seeding_interval=9] (ERROR:",
                              0),
              0u)
        << logs()[0];
}
