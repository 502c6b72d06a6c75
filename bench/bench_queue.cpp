// Queue listings and task reads over 100,000 tasks of 1,000 users, each beside the raw
// round trip of the statement the library sends. Load the data first:
//   psql -U admin -d download -f bench/queue_data.sql
// The rate totals ask the host whether a user is an administrator, so they want two host
// accounts: "user42" (not an administrator) and one member of the group
// "administrators" (say: groupadd administrators; useradd -M -N -G administrators
// benchadmin).
#include <grp.h>
#include <pwd.h>
#include <string>

#include "bench/raw.h"
#include "torvale/torvale.h"

namespace {

constexpr int kTasks = 100000;
constexpr int kPage = 50;

const std::string kColumns =
    "task_id, username, pid, url, filename, status, created_time, started_time, total_size, "
    "current_size, upload_rate, total_upload, seeding_ratio, seeding_interval, "
    "seeding_elapsed,seeders,leechers,current_rate, total_peers, connected_peers, "
    "task_flags,total_pieces, downloaded_pieces, available_pieces, length(torrent)";

// The rewritten forms of the conditions below, as the library sends them.
constexpr char kRangeCondition[] = "task_id between 50001 and 50050";
constexpr char kUserCondition[] = "lower(username)=lower('user42')";
const std::string kUserRewritten = "lower ( username ) = lower ( 'user42' )";

bool loaded(benchmark::State &state) {
    PGresult *r = PQexec(bench::raw(), "SELECT count(*) FROM download_queue");
    bool ok = PQresultStatus(r) == PGRES_TUPLES_OK && std::stoi(PQgetvalue(r, 0, 0)) == kTasks;
    PQclear(r);
    if (!ok)
        state.SkipWithError("load bench/queue_data.sql into the database first");
    return ok;
}

// Opens with `open`, walks every row and closes, as a caller shows one page.
template <typename Open> void walk(benchmark::State &state, Open open) {
    if (!loaded(state))
        return;
    for (auto _ : state) {
        DownloadQueueHandle *handle = open();
        if (handle == nullptr) {
            state.SkipWithError("open failed");
            return;
        }
        int rows = 0;
        while (DownloadQueueGet(handle) != nullptr)
            ++rows;
        DownloadQueueClose(handle);
        benchmark::DoNotOptimize(rows);
    }
}

void raw(benchmark::State &state, const std::string &sql) {
    if (!loaded(state))
        return;
    for (auto _ : state)
        bench::raw_exec(state, sql);
}

std::string progress(const std::string &where, int offset) {
    std::string w = where.empty() ? "" : "(" + where + ") and ";
    return "SELECT " + kColumns +
           ", ((current_size::float/total_size::float)*100) as progress FROM download_queue "
           "WHERE " +
           w + "total_size != 0 UNION ALL SELECT " + kColumns +
           ", 0 as progress FROM download_queue WHERE " + w +
           "total_size = 0 ORDER BY progress asc, task_id asc LIMIT 50 OFFSET " +
           std::to_string(offset);
}

std::string time_left(const std::string &where, int offset) {
    std::string w = where.empty() ? "" : "(" + where + ") and ";
    return "SELECT " + kColumns +
           ", ((total_size::float-current_size::float)/current_rate::float) as time_left "
           "FROM download_queue WHERE " +
           w + "status = 2 and total_size != 0 and current_rate > 512 UNION ALL SELECT " +
           kColumns + ", 9999999999 as time_left FROM download_queue WHERE " + w +
           "(status != 2 or total_size = 0 or current_rate <= 512) ORDER BY time_left asc, "
           "status asc, task_id asc LIMIT 50 OFFSET " +
           std::to_string(offset);
}

// DownloadQueueOpen: a 50-task id range.
void BM_QueueOpen(benchmark::State &state) {
    walk(state, [] { return DownloadQueueOpen(kRangeCondition); });
}
BENCHMARK(BM_QueueOpen);
void BM_QueueOpen_Raw(benchmark::State &state) {
    raw(state, "SELECT " + kColumns + " FROM download_queue WHERE task_id between 50001 and 50050");
}
BENCHMARK(BM_QueueOpen_Raw);

// DownloadQueueOpenCondition: a middle page in task id order.
void BM_QueueOpenCondition_Id(benchmark::State &state) {
    walk(state, [] { return DownloadQueueOpenCondition(nullptr, kPage, 50000, nullptr, 1); });
}
BENCHMARK(BM_QueueOpenCondition_Id);
void BM_QueueOpenCondition_Id_Raw(benchmark::State &state) {
    raw(state,
        "SELECT " + kColumns + " FROM download_queue ORDER BY task_id asc  LIMIT 50 OFFSET 50000");
}
BENCHMARK(BM_QueueOpenCondition_Id_Raw);

// DownloadQueueOpenCondition: a page of the whole queue by user name.
void BM_QueueOpenCondition_User(benchmark::State &state) {
    walk(state, [] { return DownloadQueueOpenCondition(nullptr, kPage, 1000, "username", 1); });
}
BENCHMARK(BM_QueueOpenCondition_User);
void BM_QueueOpenCondition_User_Raw(benchmark::State &state) {
    raw(state, "SELECT " + kColumns +
                   " FROM download_queue ORDER BY username asc , task_id asc LIMIT 50 OFFSET 1000");
}
BENCHMARK(BM_QueueOpenCondition_User_Raw);

// DownloadQueueOpenCondition: one user's first page by status, as the web page shows it.
void BM_QueueOpenCondition_OwnByStatus(benchmark::State &state) {
    walk(state, [] { return DownloadQueueOpenCondition(kUserCondition, kPage, 0, "status", 1); });
}
BENCHMARK(BM_QueueOpenCondition_OwnByStatus);
void BM_QueueOpenCondition_OwnByStatus_Raw(benchmark::State &state) {
    raw(state, "SELECT " + kColumns + " FROM download_queue WHERE " + kUserRewritten +
                   " ORDER BY status asc , task_id asc LIMIT 50 OFFSET 0");
}
BENCHMARK(BM_QueueOpenCondition_OwnByStatus_Raw);

void BM_QueueOpenProgress_All(benchmark::State &state) {
    walk(state, [] { return DownloadQueueOpenProgress(nullptr, kPage, 1000, 1); });
}
BENCHMARK(BM_QueueOpenProgress_All);
void BM_QueueOpenProgress_All_Raw(benchmark::State &state) {
    raw(state, progress("", 1000));
}
BENCHMARK(BM_QueueOpenProgress_All_Raw);

void BM_QueueOpenProgress_Own(benchmark::State &state) {
    walk(state, [] { return DownloadQueueOpenProgress(kUserCondition, kPage, 0, 1); });
}
BENCHMARK(BM_QueueOpenProgress_Own);
void BM_QueueOpenProgress_Own_Raw(benchmark::State &state) {
    raw(state, progress(kUserRewritten, 0));
}
BENCHMARK(BM_QueueOpenProgress_Own_Raw);

void BM_QueueOpenTimeLeft_All(benchmark::State &state) {
    walk(state, [] { return DownloadQueueOpenTimeLeft(nullptr, kPage, 1000, 1); });
}
BENCHMARK(BM_QueueOpenTimeLeft_All);
void BM_QueueOpenTimeLeft_All_Raw(benchmark::State &state) {
    raw(state, time_left("", 1000));
}
BENCHMARK(BM_QueueOpenTimeLeft_All_Raw);

void BM_QueueOpenTimeLeft_Own(benchmark::State &state) {
    walk(state, [] { return DownloadQueueOpenTimeLeft(kUserCondition, kPage, 0, 1); });
}
BENCHMARK(BM_QueueOpenTimeLeft_Own);
void BM_QueueOpenTimeLeft_Own_Raw(benchmark::State &state) {
    raw(state, time_left(kUserRewritten, 0));
}
BENCHMARK(BM_QueueOpenTimeLeft_Own_Raw);

void BM_DownloadTaskStatusGet(benchmark::State &state) {
    if (!loaded(state))
        return;
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadTaskStatusGet(50000));
}
BENCHMARK(BM_DownloadTaskStatusGet);
void BM_DownloadTaskStatusGet_Raw(benchmark::State &state) {
    raw(state, "SELECT " + kColumns + " FROM download_queue WHERE task_id = 50000");
}
BENCHMARK(BM_DownloadTaskStatusGet_Raw);

void BM_DownloadTaskCount_All(benchmark::State &state) {
    if (!loaded(state))
        return;
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadTaskCount(nullptr));
}
BENCHMARK(BM_DownloadTaskCount_All);
void BM_DownloadTaskCount_All_Raw(benchmark::State &state) {
    raw(state, "SELECT count(*) FROM download_queue");
}
BENCHMARK(BM_DownloadTaskCount_All_Raw);

void BM_DownloadTaskCount_User(benchmark::State &state) {
    if (!loaded(state))
        return;
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadTaskCount("user42"));
}
BENCHMARK(BM_DownloadTaskCount_User);
void BM_DownloadTaskCount_User_Raw(benchmark::State &state) {
    raw(state, "SELECT count(*) FROM download_queue WHERE lower(username)=lower('user42')");
}
BENCHMARK(BM_DownloadTaskCount_User_Raw);

// A member of "administrators", or "" when the host has none.
std::string administrator() {
    const group *admins = getgrnam("administrators");
    return admins != nullptr && admins->gr_mem[0] != nullptr ? admins->gr_mem[0] : "";
}

void rate(benchmark::State &state, const std::string &user) {
    if (!loaded(state))
        return;
    if (user.empty() || getpwnam(user.c_str()) == nullptr) {
        state.SkipWithError("no such host user (see the top of bench_queue.cpp)");
        return;
    }
    int download = 0, upload = 0;
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadTotalRateGet(user.c_str(), &download, &upload));
}

void BM_DownloadTotalRateGet_Admin(benchmark::State &state) {
    rate(state, administrator());
}
BENCHMARK(BM_DownloadTotalRateGet_Admin);
void BM_DownloadTotalRateGet_Admin_Raw(benchmark::State &state) {
    raw(state, "SELECT sum(current_rate) as sumdl, sum(upload_rate) as sumul FROM download_queue "
               "WHERE status=2 or status=8 or status=7");
}
BENCHMARK(BM_DownloadTotalRateGet_Admin_Raw);

void BM_DownloadTotalRateGet_User(benchmark::State &state) {
    rate(state, "user42");
}
BENCHMARK(BM_DownloadTotalRateGet_User);
void BM_DownloadTotalRateGet_User_Raw(benchmark::State &state) {
    raw(state, "SELECT sum(current_rate) as sumdl, sum(upload_rate) as sumul FROM download_queue "
               "WHERE (status=2 or status=8 or status=7) and lower(username)=lower('user42')");
}
BENCHMARK(BM_DownloadTotalRateGet_User_Raw);

} // namespace
