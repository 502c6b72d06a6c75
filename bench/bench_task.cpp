// Task creation, task field writes and the change trigger against the raw round trips of
// the same statements on one libpq connection.
#include <string>
#include <sys/ipc.h>
#include <sys/shm.h>

#include "bench/raw.h"
#include "torvale/torvale.h"

namespace {

constexpr char kConfSelect[] = "SELECT * FROM sysconf LIMIT 1 OFFSET 0";
// What DownloadTaskAddWithDst sends for the link below (the time aside).
constexpr char kLinkInsert[] =
    "INSERT INTO download_queue(username, pid, url, filename,created_time, started_time, "
    "status, total_size, current_size, current_rate,total_peers, connected_peers, total_pieces, "
    "downloaded_pieces, available_pieces,upload_rate, total_upload, seeding_ratio, "
    "seeding_interval, seeding_elapsed, task_flags, destination) VALUES('ann', -1, "
    "'http://host/pub/file.iso', 'file.iso', 1700000000,  0, 1, 0, 0, 0, 0, 0, 0, 0, 0, 0,0, "
    "150, 3600, 0, 0, '/volume1/dl')";
constexpr char kStatusUpdate[] = "UPDATE download_queue SET status=2 WHERE task_id=1";
constexpr char kProgressUpdate[] =
    "UPDATE download_queue SET current_size=123456789, current_rate=1, total_peers=3, "
    "connected_peers=4, total_pieces=5, downloaded_pieces=6, available_pieces=7, upload_rate=2, "
    "total_upload=987654321, seeding_elapsed=8,seeders=9, leechers=10 WHERE task_id=1";

// An empty queue with the configuration row, then one task (id 1) to write to.
void fresh_tables(benchmark::State &state) {
    bench::raw_exec(state, "TRUNCATE download_queue, sysconf RESTART IDENTITY");
    bench::raw_exec(state, "INSERT INTO sysconf VALUES (1, '', 0, 150, 3600)");
    bench::raw_exec(state, kLinkInsert);
}

void BM_DownloadTaskAddWithDst(benchmark::State &state) {
    fresh_tables(state);
    for (auto _ : state)
        benchmark::DoNotOptimize(
            DownloadTaskAddWithDst("ann", "http://host/pub/file.iso", "/volume1/dl"));
}
BENCHMARK(BM_DownloadTaskAddWithDst);

// Creation reads the configuration, then inserts: two round trips.
void BM_DownloadTaskAddWithDst_Raw(benchmark::State &state) {
    fresh_tables(state);
    for (auto _ : state) {
        bench::raw_exec(state, kConfSelect);
        bench::raw_exec(state, kLinkInsert);
    }
}
BENCHMARK(BM_DownloadTaskAddWithDst_Raw);

void BM_DownloadTaskStatusSet(benchmark::State &state) {
    fresh_tables(state);
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadTaskStatusSet(1, 2));
}
BENCHMARK(BM_DownloadTaskStatusSet);

void BM_DownloadTaskStatusSet_Raw(benchmark::State &state) {
    fresh_tables(state);
    for (auto _ : state)
        bench::raw_exec(state, kStatusUpdate);
}
BENCHMARK(BM_DownloadTaskStatusSet_Raw);

void BM_DownloadTaskProgressSet2Forced(benchmark::State &state) {
    fresh_tables(state);
    DownloadProgressInfo info{123456789, 1, 2, 3, 4, 5, 6, 7, 987654321, 8, 9, 10};
    for (auto _ : state)
        benchmark::DoNotOptimize(DownloadTaskProgressSet2(1, &info, 1));
}
BENCHMARK(BM_DownloadTaskProgressSet2Forced);

void BM_DownloadTaskProgressSet2Forced_Raw(benchmark::State &state) {
    fresh_tables(state);
    for (auto _ : state)
        bench::raw_exec(state, kProgressUpdate);
}
BENCHMARK(BM_DownloadTaskProgressSet2Forced_Raw);

// The trigger segment, made as the daemon makes it and removed when the run ends.
class TriggerSegment {
  public:
    TriggerSegment() {
        id_ = shmget(DOWNLOAD_SHM_TRIGGER_KEY, DOWNLOAD_SHM_TRIGGER_SIZE, IPC_CREAT | 0666);
        void *addr = id_ != -1 ? shmat(id_, nullptr, 0) : reinterpret_cast<void *>(-1);
        word_ = addr != reinterpret_cast<void *>(-1) ? static_cast<volatile int *>(addr) : nullptr;
    }
    ~TriggerSegment() {
        if (word_ != nullptr)
            shmdt(const_cast<int *>(word_));
        if (id_ != -1)
            shmctl(id_, IPC_RMID, nullptr);
    }
    volatile int *word() const { return word_; }

  private:
    int id_ = -1;
    volatile int *word_ = nullptr;
};

void BM_NAVODownloadTrigger(benchmark::State &state) {
    TriggerSegment segment;
    if (segment.word() == nullptr)
        state.SkipWithError("cannot create the trigger segment");
    for (auto _ : state)
        benchmark::DoNotOptimize(NAVODownloadTrigger());
}
BENCHMARK(BM_NAVODownloadTrigger);

// The floor: one store into an attached segment.
void BM_NAVODownloadTrigger_Raw(benchmark::State &state) {
    TriggerSegment segment;
    volatile int *word = segment.word();
    if (word == nullptr)
        state.SkipWithError("cannot create the trigger segment");
    for (auto _ : state)
        if (word != nullptr)
            word[0] = 1;
}
BENCHMARK(BM_NAVODownloadTrigger_Raw);

} // namespace
