#include <cstring>
#include <string>

#include "tests/test_platform_support.h"
#include "torvale/user.h"

namespace {

constexpr char kUnknown[] = "user:# Failed to get user [tv-no-such-user][0x1D00]";

class UserSettings : public DbTest {
  protected:
    // The row of `user` as "uid|share|disabled|watch|delete|folder", "<none>" without one.
    std::string row(const std::string &user) {
        return value("SELECT concat_ws('|', uid, share_folder, user_disabled::int, "
                     "enable_watchffolder::int, delete_watchtorrent::int, watchfolder) "
                     "FROM user_setting WHERE username = '" +
                     user + "'");
    }
    // The user's watch settings as "rc enabled delete folder", starting from ints of 7.
    std::string watch(const std::string &user) {
        int enabled = 7, del = 7;
        char folder[8] = "x";
        int rc = DownloadUserWatchInfoGet(user.c_str(), &enabled, &del, folder, sizeof folder);
        return std::to_string(rc) + " " + std::to_string(enabled) + " " + std::to_string(del) +
               " " + folder;
    }
};

std::string share_of(const std::string &user) {
    char buf[64];
    std::memset(buf, 'x', sizeof buf);
    int rc = DownloadUserShareGet(user.c_str(), buf, sizeof buf);
    return std::to_string(rc) + " " + std::string(buf, strnlen(buf, sizeof buf));
}

} // namespace

TEST_F(UserSettings, FirstShareSetInsertsWithThePlatformUidLaterOnesUpdate) {
    HostUser user;
    ASSERT_EQ(DownloadUserShareSet(user.c_str(), "video"), 0);
    EXPECT_EQ(row(user.name()), std::to_string(user.entry().pw_uid) + "|video|0|0|0|");
    EXPECT_EQ(share_of(upper(user.name())), "1 video");
    // Another letter case finds the same row; only the share changes.
    exec("UPDATE user_setting SET uid = 7, user_disabled = true");
    ASSERT_EQ(DownloadUserShareSet(upper(user.name()).c_str(), "it's \"映画\""), 0);
    EXPECT_EQ(count("SELECT * FROM user_setting"), 1);
    EXPECT_EQ(row(user.name()), "7|it's \"映画\"|1|0|0|");
    EXPECT_EQ(share_of(user.name()), "2 it's \"映画\"");
    EXPECT_EQ(share_of("nobody-here"), "0 ");
    char small[5];
    EXPECT_EQ(DownloadUserShareGet(user.c_str(), small, sizeof small), 2);
    EXPECT_STREQ(small, "it's");
    EXPECT_TRUE(logs().empty());
    // A user the host does not know never reaches the table.
    EXPECT_EQ(DownloadUserShareSet("tv-no-such-user", "video"), -1);
    EXPECT_EQ(DownloadUserWatchInfoSet("tv-no-such-user", 0, 0, nullptr), -1);
    EXPECT_EQ(count("SELECT * FROM user_setting"), 1);
    EXPECT_EQ(logs(), std::vector<std::string>(2, kUnknown));
}

TEST_F(UserSettings, WatchOnStoresFolderAndFlagOffKeepsThem) {
    HostUser user;
    std::string uid = std::to_string(user.entry().pw_uid);
    // Off for a new user inserts an empty switched-off row.
    ASSERT_EQ(DownloadUserWatchInfoSet(user.c_str(), 0, 1, nullptr), 0);
    EXPECT_EQ(row(user.name()), uid + "||0|0|1|");
    EXPECT_EQ(watch(user.name()), "1 0 1 ");
    EXPECT_EQ(watch("nobody-here"), "0 7 7 ");
    // Share and watch writes to the same row leave each other's columns alone.
    ASSERT_EQ(DownloadUserShareSet(user.c_str(), "video"), 0);
    ASSERT_EQ(DownloadUserWatchInfoSet(upper(user.name()).c_str(), 1, 1, "/volume1/it's/w"), 0);
    EXPECT_EQ(row(user.name()), uid + "|video|0|1|1|/volume1/it's/w");
    ASSERT_EQ(DownloadUserWatchInfoSet(user.c_str(), 0, 0, nullptr), 0);
    EXPECT_EQ(row(user.name()), uid + "|video|0|0|1|/volume1/it's/w");
    // Cut to the buffer; a false flag is written as 0, never left at the caller's 7.
    EXPECT_EQ(watch(user.name()), "1 0 1 /volume");
    ASSERT_EQ(DownloadUserWatchInfoSet(user.c_str(), 1, 0, "/w"), 0);
    EXPECT_EQ(watch(user.name()), "1 1 0 /w");
    EXPECT_TRUE(logs().empty());
}

TEST_F(UserSettings, BadArgumentsAreRefusedBeforeAnyStatement) {
    int n = 0;
    char buf[8] = "keep";
    EXPECT_EQ(DownloadUserShareGet("", buf, sizeof buf), -1);
    EXPECT_EQ(DownloadUserShareGet("a", buf, 0), -1);
    EXPECT_EQ(DownloadUserShareSet("a", ""), -1);
    EXPECT_EQ(DownloadUserWatchInfoGet("a", nullptr, &n, buf, sizeof buf), -1);
    EXPECT_EQ(DownloadUserWatchInfoGet("a", &n, nullptr, buf, sizeof buf), -1);
    EXPECT_EQ(DownloadUserWatchInfoSet("a", 1, 0, ""), -1);
    EXPECT_EQ(DownloadUserWatchInfoSet(nullptr, 0, 0, nullptr), -1);
    EXPECT_EQ(DownloadCheckWatchfolder("a", nullptr), -1);
    EXPECT_EQ(DownloadUserDisable("", 1), -1);
    EXPECT_STREQ(buf, "keep");
    EXPECT_EQ(logs(), std::vector<std::string>(9, "user (#) Bad parameters."));
}

TEST_F(UserSettings, WatchFolderClashesOnlyWithOtherActiveWatchersAndDisableSwitchesItOff) {
    exec("INSERT INTO user_setting(username, uid, user_disabled, enable_watchffolder, watchfolder) "
         "VALUES ('Me', 1, false, true, '/v/mine'), ('off', 1, false, false, '/v/off'), "
         "('gone', 1, true, true, '/v/gone'), ('other', 1, false, true, '/v/taken')");
    // Bytes are compared, and the user's own folder never clashes.
    for (const char *folder : {"/v/mine", "/v/off", "/v/gone", "/v/taken/", "/V/TAKEN"})
        EXPECT_EQ(DownloadCheckWatchfolder("me", folder), 1) << folder;
    EXPECT_EQ(DownloadCheckWatchfolder("me", "/v/taken"), 0);
    EXPECT_EQ(DownloadCheckWatchfolder("OTHER", "/v/taken"), 1);

    ASSERT_EQ(DownloadUserDisable("OTHER", 1), 0);
    EXPECT_EQ(row("other"), "1||1|0|0|/v/taken");
    ASSERT_EQ(DownloadUserDisable("other", 0), 0);
    EXPECT_EQ(row("other"), "1||0|0|0|/v/taken");
    EXPECT_EQ(DownloadCheckWatchfolder("me", "/v/taken"), 1);
    // A user without a row: nothing to change, no failure.
    EXPECT_EQ(DownloadUserDisable("nobody-here", 1), 0);
    EXPECT_EQ(count("SELECT * FROM user_setting"), 4);
    EXPECT_TRUE(logs().empty());
}

TEST_F(UserSettings, FailingStatementsAreLoggedAndLeaveTheRowAlone) {
    exec("INSERT INTO user_setting(username, uid, watchfolder) VALUES('ann', 1, '/w')");
    exec("ALTER TABLE user_setting RENAME COLUMN user_disabled TO user_off");
    char buf[16];
    EXPECT_EQ(DownloadUserShareGet("ann", buf, sizeof buf), -1);
    EXPECT_EQ(DownloadUserDisable("ann", 1), -1);
    exec("ALTER TABLE user_setting RENAME COLUMN user_off TO user_disabled");
    EXPECT_EQ(row("ann"), "1||0|0|0|/w");
    ASSERT_EQ(logs().size(), 3u);
    EXPECT_EQ(logs()[0].rfind("user (#) Failed to exec [SELECT share_folder, user_disabled FROM "
                              "user_setting WHERE lower(username)=lower('ann')] (ERROR:",
                              0),
              0u)
        << logs()[0];
    EXPECT_EQ(logs()[2], "user (#) Failed to exec [UPDATE user_setting SET user_disabled='t', "
                         "enable_watchffolder='f' WHERE lower(username)=lower('ann')]");
}
