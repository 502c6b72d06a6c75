// User settings against the raw round trip of the same statements.
#include "bench/raw.h"
#include "torvale/torvale.h"

namespace {

constexpr char kSelectShare[] = "SELECT share_folder, user_disabled FROM user_setting WHERE "
                                "lower(username)=lower('benchuser')";
constexpr char kSelectWatchers[] =
    "SELECT watchfolder FROM user_setting WHERE enable_watchffolder='t' and user_disabled='f' "
    "and lower(username)!=lower('benchuser')";

// A settings table of `users` rows, every one watching its own folder.
void fill(benchmark::State &state, int users) {
    bench::raw_exec(state, "TRUNCATE user_setting");
    bench::raw_exec(state, "INSERT INTO user_setting(username, uid, share_folder, "
                           "enable_watchffolder, watchfolder) SELECT 'user' || i, i, 'video', "
                           "true, '/volume1/watch/' || i FROM generate_series(1, " +
                               std::to_string(users) + ") i");
    bench::raw_exec(state, "INSERT INTO user_setting(username, uid, share_folder) "
                           "VALUES ('BenchUser', 1, 'video')");
}

void BM_DownloadUserShareGet(benchmark::State &state) {
    fill(state, 1000);
    char share[256];
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadUserShareGet("benchuser", share, sizeof share));
}
BENCHMARK(BM_DownloadUserShareGet);

void BM_DownloadUserShareGet_Raw(benchmark::State &state) {
    fill(state, 1000);
    for (auto _ : state)
        bench::raw_exec(state, kSelectShare);
}
BENCHMARK(BM_DownloadUserShareGet_Raw);

void BM_DownloadCheckWatchfolder(benchmark::State &state) {
    fill(state, static_cast<int>(state.range(0)));
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadCheckWatchfolder("benchuser", "/volume1/free"));
}
BENCHMARK(BM_DownloadCheckWatchfolder)->Arg(100)->Arg(1000);

void BM_DownloadCheckWatchfolder_Raw(benchmark::State &state) {
    fill(state, static_cast<int>(state.range(0)));
    for (auto _ : state)
        bench::raw_exec(state, kSelectWatchers);
}
BENCHMARK(BM_DownloadCheckWatchfolder_Raw)->Arg(100)->Arg(1000);

void BM_DownloadUserDisable(benchmark::State &state) {
    fill(state, 1000);
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadUserDisable("benchuser", 0));
}
BENCHMARK(BM_DownloadUserDisable);

void BM_DownloadUserDisable_Raw(benchmark::State &state) {
    fill(state, 1000);
    for (auto _ : state)
        bench::raw_exec(state, "UPDATE user_setting SET user_disabled='f' WHERE "
                               "lower(username)=lower('benchuser')");
}
BENCHMARK(BM_DownloadUserDisable_Raw);

} // namespace
