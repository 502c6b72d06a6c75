#include "tests/fixture.h"

#include <cctype>
#include <cstdlib>
#include <unistd.h>

#include "platform/log.h"

namespace {

std::vector<std::string> g_logs;

// "unit (123) text" -> "unit (#) text"; "unit:123 text" -> "unit:# text".
void capture(const char *line) {
    std::string s = line;
    size_t i = 0;
    while (i < s.size() && (std::isalnum(static_cast<unsigned char>(s[i])) || s[i] == '_'))
        ++i;
    size_t digits = s.compare(i, 2, " (") == 0 ? i + 2 : (s.compare(i, 1, ":") == 0 ? i + 1 : 0);
    size_t end = digits;
    while (digits > 0 && end < s.size() && std::isdigit(static_cast<unsigned char>(s[end])))
        ++end;
    if (end > digits)
        s.replace(digits, end - digits, "#");
    g_logs.push_back(s);
}

} // namespace

void DbTest::SetUp() {
    raw_ = PQconnectdb("user=admin dbname=download");
    ASSERT_EQ(PQstatus(raw_), CONNECTION_OK) << PQerrorMessage(raw_);
    exec("SET client_min_messages = warning");
    exec("TRUNCATE download_queue, user_setting, sysconf, rss_feed, rss_item, rss_filter "
         "RESTART IDENTITY");
    char tmpl[] = "/tmp/torvale-root.XXXXXX";
    ASSERT_NE(mkdtemp(tmpl), nullptr);
    root_ = tmpl;
    setenv("TORVALE_ROOT", root_.c_str(), 1);
    g_logs.clear();
    torvale::log_set_sink(capture);
}

void DbTest::TearDown() {
    torvale::log_set_sink(nullptr);
    if (!root_.empty())
        run_shell("rm -rf '" + root_ + "'");
    unsetenv("TORVALE_ROOT");
    PQfinish(raw_);
}

void DbTest::exec(const std::string &sql) {
    PGresult *r = PQexec(raw_, sql.c_str());
    ExecStatusType st = PQresultStatus(r);
    EXPECT_TRUE(st == PGRES_COMMAND_OK || st == PGRES_TUPLES_OK)
        << sql << ": " << PQresultErrorMessage(r);
    PQclear(r);
}

std::string DbTest::value(const std::string &sql) {
    PGresult *r = PQexec(raw_, sql.c_str());
    EXPECT_EQ(PQresultStatus(r), PGRES_TUPLES_OK) << sql << ": " << PQresultErrorMessage(r);
    std::string v = PQntuples(r) > 0 ? PQgetvalue(r, 0, 0) : "<none>";
    PQclear(r);
    return v;
}

int DbTest::count(const std::string &sql) {
    PGresult *r = PQexec(raw_, sql.c_str());
    EXPECT_EQ(PQresultStatus(r), PGRES_TUPLES_OK) << sql << ": " << PQresultErrorMessage(r);
    int n = PQntuples(r);
    PQclear(r);
    return n;
}

const std::vector<std::string> &DbTest::logs() const {
    return g_logs;
}

bool DbTest::logged(const std::string &masked) const {
    for (const auto &line : g_logs)
        if (line == masked)
            return true;
    return false;
}

void DbTest::clear_logs() {
    g_logs.clear();
}

int run_shell(const std::string &cmd) {
    int rc = std::system(cmd.c_str());
    return WIFEXITED(rc) ? WEXITSTATUS(rc) : -1;
}
