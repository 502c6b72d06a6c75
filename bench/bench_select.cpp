// Next-task selection and the running count on queues of 1,000 to 1,000,000 tasks, each
// beside the raw round trips of the same statements. The queue is made by
// bench_select.sql, which REPLACES download_queue and user_setting; it is made once per
// size, as the benchmarks run size by size.
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <string>
#include <unistd.h>

#include "bench/raw.h"
#include "torvale/torvale.h"

namespace {

constexpr char kOldest[] = "SELECT task_id, user_setting.user_disabled FROM download_queue, "
                           "user_setting WHERE "
                           "lower(user_setting.username)=lower(download_queue.username) and "
                           "user_disabled!='t' and status=1 and pid=-1 %s ORDER BY task_id "
                           "LIMIT 1 OFFSET 0";
constexpr char kRotationHead[] =
    "SELECT task_id, download_queue.username, user_setting.user_disabled FROM download_queue, "
    "user_setting WHERE lower(user_setting.username)=lower(download_queue.username) and "
    "user_disabled!='t' and ";
constexpr char kFtpDownloading[] =
    "SELECT url FROM download_queue WHERE url ILIKE 'ftp://%' AND status=2";

constexpr char kDownloading[] =
    "SELECT task_id, pid FROM download_queue WHERE status=2 or status=6";

constexpr int kSizes[] = {1000, 100000, 1000000};
// The data script has two servers to a downloading ftp:// task pair: a limit of 2
// holds back all 50.
constexpr int kFtpLimit = 2;
constexpr int kBusyServers = 50;

std::string data_script() {
    std::string here = __FILE__;
    std::ifstream in(here.substr(0, here.rfind('/') + 1) + "bench_select.sql");
    std::ostringstream text;
    for (std::string line; std::getline(in, line);)
        if (line.rfind("--", 0) != 0)
            text << line << '\n';
    return text.str();
}

// Makes the queue of `state.range(0)` tasks unless it is there already. VACUUM must run
// alone, so the script goes statement by statement.
void ensure_queue(benchmark::State &state) {
    static long made = -1;
    if (made == state.range(0))
        return;
    std::string script = data_script();
    if (script.empty()) {
        state.SkipWithError("bench_select.sql not found");
        return;
    }
    bench::raw_exec(state, "SET bench.tasks = " + std::to_string(state.range(0)));
    bench::raw_exec(state, "SET bench.pid = " + std::to_string(getpid()));
    std::istringstream in(script);
    for (std::string sql; std::getline(in, sql, ';');)
        if (sql.find_first_not_of(" \n") != std::string::npos)
            bench::raw_exec(state, sql);
    made = state.range(0);
}

std::string oldest_sql(const std::string &clause) {
    std::string sql(sizeof kOldest + clause.size(), '\0');
    sql.resize(static_cast<size_t>(std::snprintf(sql.data(), sql.size(), kOldest, clause.c_str())));
    return sql;
}

// What the FTP limit excludes on this queue, in the library's words.
std::string busy_clause() {
    std::string clause = "AND ( ";
    for (int i = 0; i < kBusyServers; ++i)
        clause += " url NOT ILIKE 'ftp://ftp" + std::to_string(i) + ".example.net%' AND ";
    return clause + " TRUE )";
}

// The rotating statements A, B and C for the cursor, in turn, until one finds a row;
// the cursor moves to its user.
void raw_rotate(benchmark::State &state, std::string &cursor) {
    const std::string waiting = " and status=1 and pid=-1  ";
    const std::string steps[] = {
        kRotationHead + ("lower(download_queue.username) > lower('" + cursor + "')") + waiting +
            "ORDER BY lower(download_queue.username), task_id LIMIT 1 OFFSET 0",
        kRotationHead + ("lower(download_queue.username) < lower('" + cursor + "')") + waiting +
            "ORDER BY lower(download_queue.username),task_id LIMIT 1 OFFSET 0",
        kRotationHead + std::string("status=1 and pid=-1  ORDER BY task_id LIMIT 1 OFFSET 0"),
    };
    for (const std::string &sql : steps) {
        PGresult *r = PQexec(bench::raw(), sql.c_str());
        if (PQresultStatus(r) != PGRES_TUPLES_OK)
            state.SkipWithError(PQresultErrorMessage(r));
        bool found = PQntuples(r) > 0;
        if (found)
            cursor = PQgetvalue(r, 0, 1);
        PQclear(r);
        if (found)
            return;
    }
    cursor.clear();
}

void BM_GetNextOldest(benchmark::State &state) {
    ensure_queue(state);
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadTaskGetNext(0, 0));
}

void BM_GetNextOldest_Raw(benchmark::State &state) {
    ensure_queue(state);
    const std::string sql = oldest_sql("");
    for (auto _ : state)
        bench::raw_exec(state, sql);
}

void BM_GetNextRotating(benchmark::State &state) {
    ensure_queue(state);
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadTaskGetNext(1, 0));
}

void BM_GetNextRotating_Raw(benchmark::State &state) {
    ensure_queue(state);
    std::string cursor;
    for (auto _ : state)
        raw_rotate(state, cursor);
}

void BM_GetNextFtpLimit(benchmark::State &state) {
    ensure_queue(state);
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadTaskGetNext(0, kFtpLimit));
}

void BM_GetNextFtpLimit_Raw(benchmark::State &state) {
    ensure_queue(state);
    const std::string sql = oldest_sql(busy_clause());
    for (auto _ : state) {
        bench::raw_exec(state, kFtpDownloading);
        bench::raw_exec(state, sql);
    }
}

// The downloading tasks' pid is this process, so the count repairs nothing.
void BM_DownloadingCount(benchmark::State &state) {
    ensure_queue(state);
    for (auto _ : state)
        if (DownloadTaskDownloadingCount() != 200)
            state.SkipWithError("the count is not the 200 downloading tasks");
}

void BM_DownloadingCount_Raw(benchmark::State &state) {
    ensure_queue(state);
    for (auto _ : state)
        bench::raw_exec(state, kDownloading);
}

struct Case {
    const char *name;
    void (*run)(benchmark::State &);
};

constexpr Case kCases[] = {
    {"GetNextOldest", BM_GetNextOldest},       {"GetNextOldest_Raw", BM_GetNextOldest_Raw},
    {"GetNextRotating", BM_GetNextRotating},   {"GetNextRotating_Raw", BM_GetNextRotating_Raw},
    {"GetNextFtpLimit", BM_GetNextFtpLimit},   {"GetNextFtpLimit_Raw", BM_GetNextFtpLimit_Raw},
    {"DownloadingCount", BM_DownloadingCount}, {"DownloadingCount_Raw", BM_DownloadingCount_Raw},
};

// Size by size, so that each queue is made once.
const bool kRegistered = [] {
    for (int size : kSizes)
        for (const Case &c : kCases)
            benchmark::RegisterBenchmark((std::string("Select/") + c.name).c_str(), c.run)
                ->Arg(size)
                ->Unit(benchmark::kMicrosecond)
                ->UseRealTime();
    return true;
}();

} // namespace
