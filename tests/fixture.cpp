#include "tests/fixture.h"

#include <cstdlib>
#include <regex>
#include <unistd.h>

#include "platform/log.h"

namespace {

std::vector<std::string> g_logs;

void capture(const char *line) {
    static const std::regex prefix(R"(^(\w+)( \(|:)\d+)");
    g_logs.push_back(
        std::regex_replace(line, prefix, "$1$2#", std::regex_constants::format_first_only));
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
