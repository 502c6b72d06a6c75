// The access layer against the raw round trip of the same statement.
#include <cstring>

#include "bench/raw.h"
#include "torvale/torvale.h"

namespace {

constexpr char kUpdate[] = "UPDATE sysconf SET download_order=download_order WHERE false";

void BM_DownloadDBExec(benchmark::State &state) {
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadDBExec(kUpdate));
}
BENCHMARK(BM_DownloadDBExec);

void BM_DownloadDBExec_Raw(benchmark::State &state) {
    for (auto _ : state)
        bench::raw_exec(state, kUpdate);
}
BENCHMARK(BM_DownloadDBExec_Raw);

void BM_DownloadConfGet(benchmark::State &state) {
    bench::raw_exec(state, "TRUNCATE sysconf");
    bench::raw_exec(state, "INSERT INTO sysconf VALUES (1, '00:00-23:59', 1, 100, 3600)");
    DownloadConf conf;
    for (auto _ : state) {
        std::memset(&conf, 0, sizeof conf);
        benchmark::DoNotOptimize(DownloadConfGet(&conf));
    }
}
BENCHMARK(BM_DownloadConfGet);

void BM_DownloadConfGet_Raw(benchmark::State &state) {
    for (auto _ : state)
        bench::raw_exec(state, "SELECT * FROM sysconf LIMIT 1 OFFSET 0");
}
BENCHMARK(BM_DownloadConfGet_Raw);

} // namespace
