#include <cstring>
#include <string>

#include "db/access.h"
#include "tests/fixture.h"

namespace {

// The safe form of a condition, or "<refused>".
std::string rewrite(const char *condition) {
    std::string out(2 * std::strlen(condition) + 1, '\0');
    if (EscapeCondition(condition, out.data(), out.size()) == -1)
        return "<refused>";
    return out.c_str();
}

} // namespace

TEST(Condition, CallersConditionsPassWithTheirMeaning) {
    EXPECT_EQ(rewrite("task_id=7"), "task_id = 7");
    EXPECT_EQ(rewrite("status=2 or status=6"), "status = 2 or status = 6");
    EXPECT_EQ(rewrite("lower(username)=lower('O''Brien')"),
              "lower ( username ) = lower ( 'O''Brien' )");
    EXPECT_EQ(rewrite("pid=-1 AND NOT (status IN (3, 101) OR status >= 101)"),
              "pid = - 1 and not ( status in ( 3 , 101 ) or status >= 101 )");
    EXPECT_EQ(rewrite("task_flags & 4 <> 0 and url ILIKE 'ftp://%' and extra_info IS NOT NULL"),
              "task_flags & 4 <> 0 and url ilike 'ftp://%' and extra_info is not null");
    EXPECT_EQ(rewrite("download_queue.total_size - current_size BETWEEN 0 AND 6000*2"),
              "download_queue.total_size - current_size between 0 and 6000 * 2");
    EXPECT_EQ(rewrite("filename NOT LIKE 'a\\b%' and length(url) > 3 and TRUE"),
              "filename not like 'a\\b%' and length ( url ) > 3 and true");
    EXPECT_EQ(rewrite("upper(destination) = 'ÜBER 日本'"), "upper ( destination ) = 'ÜBER 日本'");
}

TEST(Condition, EverythingOutsideTheLanguageIsRefused) {
    const char *hostile[] = {
        "1=1; DROP TABLE download_queue",
        "x' OR '1'='1",
        "status=1 -- comment",
        "status=1 /* c */",
        "task_id IN (SELECT task_id FROM download_queue)",
        "task_id = (SELECT 1)",
        "password = 'x'",
        "user_setting.uid = 0",
        "pg_sleep(10) IS NULL",
        "\"status\" = 1",
        "status = $$x$$",
        "status = E'\\x27'",
        "status::text = '1'",
        "status = 1e3",
        "(status = 1",
        "status = 1)",
        "'unterminated",
        "status = 1 and",
        "status NOT 1",
        "a = b = c",
        "",
    };
    int refused = 0;
    for (const char *condition : hostile)
        refused += rewrite(condition) == "<refused>";
    EXPECT_EQ(refused, static_cast<int>(std::size(hostile)));
    EXPECT_EQ(rewrite("username='x' OR '1'='1'"), "username = 'x' or '1' = '1'");
}

TEST(Condition, DeepNestingAndSmallBuffersAreRefusedNotCrashed) {
    std::string deep(10000, '(');
    deep += "status=1";
    deep += std::string(10000, ')');
    EXPECT_EQ(rewrite(deep.c_str()), "<refused>");
    std::string unary(10000, '-');
    unary += "1 = 1";
    EXPECT_EQ(rewrite(unary.c_str()), "<refused>");

    char small[8];
    EXPECT_EQ(EscapeCondition("status=1 or status=2", small, sizeof small), -1);
    EXPECT_EQ(EscapeCondition(nullptr, small, sizeof small), -1);
}

using ConditionOnServer = DbTest;

TEST_F(ConditionOnServer, RewrittenConditionsRunAndHostileOnesLeaveTheTableIntact) {
    exec("INSERT INTO download_queue(username, status, pid) VALUES ('O''Brien', 2, 10), "
         "('bob', 3, -1), ('o''brien', 6, -1)");
    std::string safe = rewrite("lower(username)=lower('O''Brien') and (status=2 or status=6)");
    std::string sql = "DELETE FROM download_queue WHERE " + safe;
    EXPECT_EQ(DownloadDBExec(sql.c_str()), 2);
    EXPECT_EQ(rewrite("1=1; DROP TABLE download_queue"), "<refused>");
    EXPECT_EQ(value("SELECT count(*) FROM download_queue"), "1");
}
