#include <cstring>
#include <string>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

#include "db/access.h"
#include "tests/fixture.h"

using Database = DbTest;

TEST_F(Database, ExecReturnsChangedRowsAndZeroForNone) {
    exec("INSERT INTO user_setting(username, uid) VALUES ('a', 1), ('b', 2)");
    EXPECT_EQ(DownloadDBExec("UPDATE user_setting SET uid=5"), 2);
    EXPECT_EQ(DownloadDBExec("UPDATE user_setting SET uid=5 WHERE username='nobody'"), 0);
    EXPECT_EQ(DownloadDBExec("DELETE FROM download_queue WHERE task_id=42"), 0);
    EXPECT_EQ(DownloadDBExecNonPersistent("DELETE FROM user_setting WHERE username='a'"), 1);

    // Closing does nothing, whatever it is given: the persistent connection stays.
    DBConn_tag *conn = DownloadDBConnect();
    ASSERT_NE(conn, nullptr);
    DownloadDBClose(conn);
    DownloadDBClose(nullptr);
    EXPECT_EQ(DownloadDBConnect(), conn);
    EXPECT_EQ(DownloadDBExec("SELECT 1"), 1);
    EXPECT_TRUE(logs().empty());
}

TEST_F(Database, BadStatementsAreLoggedWithTheServersText) {
    EXPECT_EQ(DownloadDBExec(nullptr), -1);
    EXPECT_EQ(DownloadDBExecNonPersistent(nullptr), -1);
    EXPECT_EQ(DownloadDBExec("UPDATE nowhere SET x=1"), -1);
    ASSERT_EQ(logs().size(), 3u);
    EXPECT_EQ(logs()[0], "database (#) Bad parameters.");
    EXPECT_EQ(logs()[1], "database (#) Bad parameters.");
    EXPECT_EQ(logs()[2].rfind("database (#) Failed to exec [UPDATE nowhere SET x=1] "
                              "(ERROR:  relation \"nowhere\" does not exist",
                              0),
              0u)
        << logs()[2];
    EXPECT_EQ(logs()[2].back(), ')');
}

TEST_F(Database, LinkRowReadsBackWithZeroSwarmCountsAndNullTorrent) {
    ASSERT_EQ(DownloadDBExec("INSERT INTO download_queue(username, pid, url, status, task_flags) "
                             "VALUES ('a', -1, 'http://x/y', 1, 0)"),
              1);
    DBConn_tag *conn = DownloadDBConnect();
    torvale::db::Result r;
    ASSERT_EQ(torvale::db::execute(conn, "SELECT * FROM download_queue", r), 0);
    unsigned row = 99;
    ASSERT_EQ(NAVODBFetchRow(r.get(), &row), 0);
    EXPECT_EQ(row, 0u);
    EXPECT_STREQ(NAVODBFetchField(r.get(), row, "seeders"), "0");
    EXPECT_STREQ(NAVODBFetchField(r.get(), row, "leechers"), "0");
    EXPECT_EQ(NAVODBFetchField(r.get(), row, "torrent"), nullptr);
    EXPECT_EQ(NAVODBFetchField(r.get(), row, "no_such_column"), nullptr);
    EXPECT_EQ(NAVODBFetchRow(r.get(), &row), -1);
}

TEST_F(Database, ReconnectsAfterTheServerDroppedTheSession) {
    DBConn_tag *conn = DownloadDBConnect();
    ASSERT_NE(conn, nullptr);
    torvale::db::Result r;
    ASSERT_EQ(torvale::db::execute(conn, "SELECT pg_backend_pid() AS pid", r), 0);
    std::string old_pid = NAVODBFetchField(r.get(), 0, "pid");
    r.reset();
    // What a server restart does to an idle client: its backend goes away.
    exec("SELECT pg_terminate_backend(" + old_pid + ")");
    for (int i = 0; i < 100 && count("SELECT 1 FROM pg_stat_activity WHERE pid=" + old_pid); ++i)
        usleep(10000);
    EXPECT_EQ(DownloadDBExec("UPDATE user_setting SET uid=1"), 0);
    ASSERT_EQ(torvale::db::execute(DownloadDBConnect(), "SELECT pg_backend_pid() AS pid", r), 0);
    EXPECT_NE(std::string(NAVODBFetchField(r.get(), 0, "pid")), old_pid);
    EXPECT_TRUE(logs().empty());
}

TEST_F(Database, ForkedChildUsesItsOwnConnectionAndLeavesTheParentsAlone) {
    DBConn_tag *conn = DownloadDBConnect();
    torvale::db::Result r;
    ASSERT_EQ(torvale::db::execute(conn, "SELECT pg_backend_pid() AS pid", r), 0);
    std::string parent_pid = NAVODBFetchField(r.get(), 0, "pid");
    r.reset();

    pid_t child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        torvale::db::Result cr;
        int rc = torvale::db::execute(DownloadDBConnect(), "SELECT pg_backend_pid() AS pid", cr);
        bool own = rc == 0 && parent_pid != NAVODBFetchField(cr.get(), 0, "pid");
        cr.reset();
        _exit(own && DownloadDBExec("INSERT INTO sysconf(download_order) VALUES (7)") == 1 ? 0 : 1);
    }
    int status = 0;
    waitpid(child, &status, 0);
    ASSERT_TRUE(WIFEXITED(status));
    EXPECT_EQ(WEXITSTATUS(status), 0);
    ASSERT_EQ(torvale::db::execute(DownloadDBConnect(), "SELECT pg_backend_pid() AS pid", r), 0);
    EXPECT_EQ(std::string(NAVODBFetchField(r.get(), 0, "pid")), parent_pid);
    EXPECT_EQ(value("SELECT download_order FROM sysconf"), "7");
}

TEST_F(Database, EscapedTextsRoundTripByteForByte) {
    const char *texts[] = {"it's", "''", "back\\slash\\'", "ünïcødé 日本語 🎉", "a'b\"c;--d", ""};
    for (const char *text : texts) {
        std::string sql = "INSERT INTO rss_feed(url) VALUES ('" + torvale::db::escape(text) + "')";
        ASSERT_EQ(DownloadDBExec(sql.c_str()), 1) << text;
        torvale::db::Text alloc(NAVODBEscapeStrAlloc(text));
        ASSERT_NE(alloc, nullptr);
        EXPECT_EQ(torvale::db::escape(text), alloc.get());
    }
    exec("SELECT 1");
    PGresult *res = PQexec(raw_, "SELECT url FROM rss_feed ORDER BY id");
    ASSERT_EQ(PQntuples(res), 6);
    for (int i = 0; i < 6; ++i)
        EXPECT_STREQ(PQgetvalue(res, i, 0), texts[i]);
    PQclear(res);
}

TEST_F(Database, PlaceholdersBuildStatements) {
    torvale::db::Text like(
        NAVODBEscapeStringEX3(1, " AND title ILIKE '%@NAVO:LVAR%'", "50%_o'k\\"));
    ASSERT_NE(like, nullptr);
    EXPECT_STREQ(like.get(), " AND title ILIKE '%50\\%\\_o''k\\\\%'");
    torvale::db::Text sql(NAVODBEscapeStringEX3(
        1, "SELECT title FROM rss_item WHERE feed_id=@NAVO:INT @NAVO:NEVAR", -3, like.get()));
    ASSERT_NE(sql, nullptr);
    EXPECT_STREQ(sql.get(), "SELECT title FROM rss_item WHERE feed_id=-3  AND title ILIKE "
                            "'%50\\%\\_o''k\\\\%'");
    EXPECT_EQ(NAVODBEscapeStringEX3(0, "x"), nullptr);
    EXPECT_EQ(NAVODBEscapeStringEX3(1, "@NAVO:NEVAR", static_cast<const char *>(nullptr)), nullptr);

    // The pattern matches its text literally, wildcards included.
    exec("INSERT INTO rss_item(feed_id, title) VALUES (-3, 'A 50%_o''k\\ title'), "
         "(-3, 'A 50xxo''k\\ title')");
    torvale::db::Result r;
    ASSERT_EQ(torvale::db::execute(DownloadDBConnect(), sql.get(), r), 0);
    EXPECT_EQ(NAVODBNumRows(r.get()), 1);
}

TEST_F(Database, BlobsRoundTripEveryByteValue) {
    unsigned char bytes[512];
    for (int i = 0; i < 512; ++i)
        bytes[i] = static_cast<unsigned char>(i * 7 % 256);
    size_t enc_len = 0;
    torvale::db::Text enc(NAVODBBlogEncode(bytes, sizeof bytes, &enc_len));
    ASSERT_NE(enc, nullptr);
    EXPECT_EQ(enc_len, std::strlen(enc.get()));
    std::string sql =
        std::string("INSERT INTO download_queue(torrent) VALUES ('") + enc.get() + "')";
    ASSERT_EQ(DownloadDBExec(sql.c_str()), 1);

    torvale::db::Result r;
    ASSERT_EQ(torvale::db::execute(DownloadDBConnect(), "SELECT torrent FROM download_queue", r),
              0);
    size_t len = 0;
    torvale::db::Bytes back(NAVODBBlogDecode(NAVODBFetchField(r.get(), 0, "torrent"), &len));
    ASSERT_NE(back, nullptr);
    ASSERT_EQ(len, sizeof bytes);
    EXPECT_EQ(std::memcmp(back.get(), bytes, len), 0);

    size_t empty_len = 1;
    torvale::db::Bytes empty(NAVODBBlogDecode("\\x", &empty_len));
    EXPECT_NE(empty, nullptr);
    EXPECT_EQ(empty_len, 0u);
    EXPECT_EQ(NAVODBBlogDecode("\\x0", &len), nullptr);
    EXPECT_EQ(NAVODBBlogDecode("\\xzz", &len), nullptr);
}

TEST_F(Database, FieldsAreFoundByNameWhateverOrderAndBufferTheNamesComeIn) {
    exec("INSERT INTO download_queue(username, pid, status) VALUES ('a', 11, 1), ('b', 22, 2)");
    torvale::db::Result r;
    ASSERT_EQ(torvale::db::execute(DownloadDBConnect(),
                                   "SELECT username, pid, status FROM download_queue ORDER BY "
                                   "task_id",
                                   r),
              0);
    char name[16];
    std::vector<std::string> seen;
    unsigned row = 0;
    while (NAVODBFetchRow(r.get(), &row) != -1) {
        // One buffer for every name, asked for in a different order on each row.
        for (const char *col : row == 0 ? std::vector<const char *>{"status", "username", "pid"}
                                        : std::vector<const char *>{"pid", "status", "username"}) {
            std::strcpy(name, col);
            seen.push_back(std::string(col) + "=" + NAVODBFetchField(r.get(), row, name));
        }
    }
    EXPECT_EQ(seen, (std::vector<std::string>{"status=1", "username=a", "pid=11", "pid=22",
                                              "status=2", "username=b"}));
    EXPECT_STREQ(NAVODBFetchField(r.get(), 0, "STATUS"), "1");

    // Paging, and NULL read as null, "" and 0.
    exec("UPDATE download_queue SET username=NULL WHERE pid=22");
    ASSERT_EQ(torvale::db::select_limit(DownloadDBConnect(),
                                        "SELECT username FROM download_queue ORDER BY task_id", 1,
                                        1, r),
              0);
    ASSERT_EQ(NAVODBNumRows(r.get()), 1);
    ASSERT_EQ(NAVODBFetchRow(r.get(), &row), 0);
    EXPECT_EQ(NAVODBFetchField(r.get(), row, "username"), nullptr);
    EXPECT_STREQ(torvale::db::field_text(r.get(), row, "username"), "");
    EXPECT_EQ(torvale::db::field_int(r.get(), row, "username"), 0);
}
