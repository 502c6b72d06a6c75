#include <algorithm>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "db/navodb.h"
#include "tests/fixture.h"
#include "torvale/queue.h"

namespace {

struct HandleClose {
    void operator()(DownloadQueueHandle *h) const noexcept { DownloadQueueClose(h); }
};
using Handle = std::unique_ptr<DownloadQueueHandle, HandleClose>;

// Walks the listing: the task ids in the order handed out.
std::vector<int> ids(DownloadQueueHandle *raw) {
    Handle handle(raw);
    std::vector<int> out;
    if (handle == nullptr)
        return {-999};
    while (const DownloadTaskInfo *task = DownloadQueueGet(handle.get()))
        out.push_back(task->task_id);
    return out;
}

// Walks the listing: "id:value" of the computed column `column` for each row.
std::vector<std::string> computed(DownloadQueueHandle *raw, const char *column) {
    Handle handle(raw);
    std::vector<std::string> out;
    if (handle == nullptr)
        return {"<null handle>"};
    while (const DownloadTaskInfo *task = DownloadQueueGet(handle.get()))
        out.push_back(std::to_string(task->task_id) + ":" +
                      NAVODBFetchField(handle->result, handle->row, column));
    return out;
}

// Every field of the record in declaration order.
std::string dump(const DownloadTaskInfo &t) {
    auto str = [](const char *s) { return s != nullptr ? s : "(null)"; };
    std::ostringstream os;
    os << t.task_id << ' ' << str(t.username) << ' ' << t.pid << ' ' << str(t.url) << ' '
       << str(t.filename) << ' ' << t.status << ' ' << t.created_time << ' ' << t.started_time
       << ' ' << t.total_size << ' ' << t.current_size << ' ' << t.current_rate << ' '
       << t.total_peers << ' ' << t.connected_peers << ' ' << t.total_pieces << ' '
       << t.downloaded_pieces << ' ' << t.available_pieces << ' ' << t.upload_rate << ' '
       << t.total_upload << ' ' << t.seeding_ratio << ' ' << t.seeding_interval << ' '
       << t.seeding_elapsed << ' ' << t.seeders << ' ' << t.leechers << ' ' << t.task_flags << ' '
       << t.has_torrent;
    return os.str();
}

using V = std::vector<int>;
using S = std::vector<std::string>;

} // namespace

class Queue : public DbTest {
  protected:
    // A task with the columns that order listings; the rest are left to the table.
    void task(int id, const char *user, int status, long long total, long long current, int rate) {
        exec("INSERT INTO download_queue(task_id, username, pid, url, filename, status, "
             "total_size, current_size, current_rate) VALUES (" +
             std::to_string(id) + ", '" + user + "', -1, 'http://h/" + std::to_string(id) +
             "', 'f', " + std::to_string(status) + ", " + std::to_string(total) + ", " +
             std::to_string(current) + ", " + std::to_string(rate) + ")");
    }
    bool table_intact() { return value("SELECT count(*) FROM download_queue") == "4"; }
};

TEST_F(Queue, RecordTakesEveryColumnByNameAndNullsReadAsZero) {
    exec("INSERT INTO download_queue VALUES (7, 'alice', 4242, 'http://h/a.iso', 'a.iso', "
         "-1, 1700000000, 2, 1099511627776, 549755813888, 600, 11, 5, 300, 150, 290, "
         "'\\x0102', 70, 8589934592, 150, 3600, 120, 9, 4, 6, '/share', 'x')");
    exec("INSERT INTO download_queue(task_id) VALUES (8)");
    exec("INSERT INTO download_queue(task_id, torrent) VALUES (9, '')");

    Handle handle(DownloadQueueOpen(nullptr));
    ASSERT_NE(handle, nullptr);
    EXPECT_EQ(handle->rows, 3);
    DownloadTaskInfo *t = DownloadQueueGet(handle.get());
    ASSERT_NE(t, nullptr);
    // A time stored as -1 reads as the unsigned 32-bit value it always was.
    EXPECT_EQ(dump(*t), "7 alice 4242 http://h/a.iso a.iso 2 4294967295 1700000000 "
                        "1099511627776 549755813888 600 11 5 300 150 290 70 8589934592 150 3600 "
                        "120 9 4 6 1");
    ASSERT_EQ(DownloadQueueGet(handle.get()), t); // one record, overwritten
    EXPECT_EQ(dump(*t), "8 (null) 0 (null) (null) 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0");
    ASSERT_EQ(DownloadQueueGet(handle.get()), t);
    EXPECT_EQ(t->has_torrent, 0); // stored but empty

    // After the last row, and for a null handle: null, and the record cleared.
    EXPECT_EQ(DownloadQueueGet(handle.get()), nullptr);
    EXPECT_EQ(dump(*t), "0 (null) 0 (null) (null) 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0");
    EXPECT_TRUE(logs().empty());
    Handle again(DownloadQueueOpen("task_id=7"));
    ASSERT_NE(DownloadQueueGet(again.get()), nullptr);
    EXPECT_EQ(DownloadQueueGet(nullptr), nullptr);
    EXPECT_EQ(dump(*t), "0 (null) 0 (null) (null) 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0");
    DownloadQueueClose(nullptr);
    EXPECT_EQ(logs(), S{"queue (#) Bad parameter."});
}

TEST_F(Queue, OpenListsAllInIdOrderOrWhatMatches) {
    task(5, "b", 1, 0, 0, 0);
    task(2, "a", 2, 0, 0, 0);
    task(9, "A", 3, 0, 0, 0);
    EXPECT_EQ(ids(DownloadQueueOpen(nullptr)), (V{2, 5, 9}));
    std::vector<int> a = ids(DownloadQueueOpen("lower(username)=lower('A')"));
    std::sort(a.begin(), a.end());
    EXPECT_EQ(a, (V{2, 9}));
    // An empty listing is no failure.
    Handle none(DownloadQueueOpen("task_id=-3"));
    ASSERT_NE(none, nullptr);
    EXPECT_EQ(none->rows, 0);
    EXPECT_EQ(DownloadQueueGet(none.get()), nullptr);
    EXPECT_TRUE(logs().empty());
}

TEST_F(Queue, SortColumnDefaultsToTaskIdAndTiesGoByAscendingId) {
    task(1, "bob", 1, 0, 0, 0);
    task(2, "alice", 1, 0, 0, 0);
    task(3, "bob", 1, 0, 0, 0);
    task(4, "alice", 3, 0, 0, 0);
    EXPECT_EQ(ids(DownloadQueueOpenCondition(nullptr, -1, -1, nullptr, 0)), (V{4, 3, 2, 1}));
    EXPECT_EQ(ids(DownloadQueueOpenCondition(nullptr, -1, -1, "", 1)), (V{1, 2, 3, 4}));
    EXPECT_EQ(ids(DownloadQueueOpenCondition(nullptr, -1, -1, "username", 0)), (V{1, 3, 2, 4}));
    EXPECT_EQ(ids(DownloadQueueOpenCondition(nullptr, -1, -1, "USERNAME", 1)), (V{2, 4, 1, 3}));
    // With a condition too, so that pages of equal keys neither repeat nor skip a task.
    EXPECT_EQ(ids(DownloadQueueOpenCondition("status=1", -1, -1, "username", 0)), (V{1, 3, 2}));
    EXPECT_EQ(ids(DownloadQueueOpenCondition("status=1", 1, 1, "username", 0)), (V{3}));
    EXPECT_EQ(ids(DownloadQueueOpenCondition(nullptr, 2, -1, "status", 1)), (V{1, 2}));
    EXPECT_EQ(ids(DownloadQueueOpenCondition(nullptr, -1, 3, "status", 1)), (V{4}));
    EXPECT_EQ(ids(DownloadQueueOpenCondition(nullptr, 0, 0, nullptr, 1)), V{});
    EXPECT_TRUE(logs().empty());
}

TEST_F(Queue, HostileSortColumnsAndConditionsAreRefusedAndChangeNothing) {
    for (int id = 1; id <= 4; ++id)
        task(id, "u", 1, 0, 0, 0);
    for (const char *sort : {"task_id; DELETE FROM download_queue", "username desc", "(SELECT 1)",
                             "1", "task_id--", "no_such_column", "TRUE", "download_queue.status"})
        EXPECT_EQ(DownloadQueueOpenCondition(nullptr, -1, -1, sort, 1), nullptr) << sort;
    EXPECT_TRUE(logged("queue (#) Bad sort column [task_id; DELETE FROM download_queue]."));
    EXPECT_EQ(logs().size(), 8u);
    clear_logs();

    const char *hostile = "1=1; DELETE FROM download_queue";
    EXPECT_EQ(DownloadQueueOpen(hostile), nullptr);
    EXPECT_EQ(DownloadQueueOpenCondition(hostile, 1, 0, nullptr, 1), nullptr);
    EXPECT_EQ(DownloadQueueOpenProgress("0=0) or (1=1", 1, 0, 1), nullptr);
    EXPECT_EQ(DownloadQueueOpenTimeLeft("task_id=1 /* x */", 1, 0, 1), nullptr);
    EXPECT_EQ(logs(), S(4, "queue (#) Failed to escape condition."));
    EXPECT_TRUE(table_intact());
}

TEST_F(Queue, ProgressOrderPutsUnknownSizesAtZeroAndBreaksTiesById) {
    task(1, "a", 2, 1000, 500, 0); // 50 %
    task(2, "a", 1, 0, 0, 0);      // unknown size: 0 %
    task(3, "b", 2, 1000, 0, 0);   // 0 %
    task(4, "b", 5, 1000, 1000, 0);
    EXPECT_EQ(computed(DownloadQueueOpenProgress(nullptr, 10, 0, 1), "progress"),
              (S{"2:0", "3:0", "1:50", "4:100"}));
    EXPECT_EQ(ids(DownloadQueueOpenProgress(nullptr, 10, 0, 0)), (V{4, 1, 2, 3}));
    EXPECT_EQ(ids(DownloadQueueOpenProgress(nullptr, 2, 1, 1)), (V{3, 1}));
    EXPECT_EQ(ids(DownloadQueueOpenProgress("username='b'", 10, 0, 1)), (V{3, 4}));
    // Negative paging is sent as 0: no row for limit -1, the first rows for offset -1.
    Handle none(DownloadQueueOpenProgress(nullptr, -1, 0, 1));
    ASSERT_NE(none, nullptr);
    EXPECT_EQ(none->rows, 0);
    EXPECT_EQ(ids(DownloadQueueOpenProgress(nullptr, 1, -1, 1)), (V{2}));
    EXPECT_TRUE(logs().empty());
}

TEST_F(Queue, TimeLeftIsComputedOnlyForDownloadsAboveRate512) {
    task(1, "a", 2, 7000, 1000, 600); // 6000 bytes left at 600: 10 s
    task(2, "a", 3, 7000, 1000, 600); // paused
    task(3, "a", 2, 7000, 1000, 512); // rate exactly 512
    task(4, "b", 2, 0, 0, 9000);      // size unknown
    task(5, "b", 2, 1200, 0, 600);    // 2 s
    EXPECT_EQ(computed(DownloadQueueOpenTimeLeft(nullptr, 10, 0, 1), "time_left"),
              (S{"5:2", "1:10", "3:9999999999", "4:9999999999", "2:9999999999"}));
    // Both keys turn with the direction; equal keys stay in id order.
    EXPECT_EQ(ids(DownloadQueueOpenTimeLeft(nullptr, 10, 0, 0)), (V{2, 3, 4, 1, 5}));
    EXPECT_EQ(ids(DownloadQueueOpenTimeLeft(nullptr, 2, 1, 1)), (V{1, 3}));
    EXPECT_EQ(ids(DownloadQueueOpenTimeLeft("username='a'", 10, 0, 1)), (V{1, 3, 2}));
    EXPECT_EQ(ids(DownloadQueueOpenTimeLeft(nullptr, -1, -1, 1)), V{});
    EXPECT_TRUE(logs().empty());
}

TEST_F(Queue, TopLevelOrRestrictsTheWholeListing) {
    task(1, "a", 2, 1000, 100, 600);
    task(2, "a", 3, 1000, 100, 600);
    task(3, "a", 2, 0, 0, 600);
    task(4, "a", 5, 1000, 1000, 0);
    // Each matching task once, with its own figure; the finished one not at all.
    EXPECT_EQ(computed(DownloadQueueOpenProgress("status=2 or status=3", 10, 0, 1), "progress"),
              (S{"3:0", "1:10", "2:10"}));
    EXPECT_EQ(computed(DownloadQueueOpenTimeLeft("status=3 or task_id=1", 10, 0, 1), "time_left"),
              (S{"1:1.5", "2:9999999999"}));
    EXPECT_EQ(ids(DownloadQueueOpenCondition("status=3 or task_id=1", -1, -1, "status", 1)),
              (V{1, 2}));
}

TEST_F(Queue, FailingStatementsAreLoggedWhole) {
    task(1, "a", 1, 0, 0, 0);
    exec("ALTER TABLE download_queue RENAME COLUMN leechers TO leechers_gone");
    const std::string cols =
        "task_id, username, pid, url, filename, status, created_time, started_time, total_size, "
        "current_size, upload_rate, total_upload, seeding_ratio, seeding_interval, "
        "seeding_elapsed,seeders,leechers,current_rate, total_peers, connected_peers, "
        "task_flags,total_pieces, downloaded_pieces, available_pieces, length(torrent)";
    EXPECT_EQ(DownloadQueueOpenCondition("task_id>0", -1, 5, "pid", 0), nullptr);
    EXPECT_EQ(DownloadQueueOpenCondition("task_id>0", 3, -1, "task_id", 1), nullptr);
    EXPECT_EQ(DownloadQueueOpenProgress("task_id>0", 3, 4, 1), nullptr);
    EXPECT_EQ(DownloadQueueOpenTimeLeft("task_id>0", 3, 4, 0), nullptr);
    EXPECT_EQ(DownloadQueueOpen(nullptr), nullptr);
    exec("ALTER TABLE download_queue RENAME COLUMN leechers_gone TO leechers");

    const S statements{
        "SELECT " + cols +
            " FROM download_queue WHERE task_id > 0 ORDER BY pid desc , task_id asc  OFFSET 5",
        "SELECT " + cols + " FROM download_queue WHERE task_id > 0 ORDER BY task_id asc  LIMIT 3 ",
        "SELECT " + cols +
            ", ((current_size::float/total_size::float)*100) as progress FROM download_queue "
            "WHERE (task_id > 0) and total_size != 0 UNION ALL SELECT " +
            cols +
            ", 0 as progress FROM download_queue WHERE (task_id > 0) and total_size = 0 "
            "ORDER BY progress asc, task_id asc LIMIT 3 OFFSET 4",
        "SELECT " + cols +
            ", ((total_size::float-current_size::float)/current_rate::float) as time_left FROM "
            "download_queue WHERE (task_id > 0) and status = 2 and total_size != 0 and "
            "current_rate > 512 UNION ALL SELECT " +
            cols +
            ", 9999999999 as time_left FROM download_queue WHERE (task_id > 0) and (status != 2 "
            "or total_size = 0 or current_rate <= 512) ORDER BY time_left desc, status desc, "
            "task_id asc LIMIT 3 OFFSET 4"};
    ASSERT_EQ(logs().size(), 5u);
    for (size_t i = 0; i < statements.size(); ++i)
        EXPECT_EQ(logs()[i].rfind("queue (#) Failed to exec [" + statements[i] + "] (ERROR:", 0),
                  0u)
            << logs()[i];
    // Without a condition the statement is not repeated.
    EXPECT_EQ(
        logs()[4].rfind("queue (#) Failed to query database. (ERROR:  column \"leechers\"", 0), 0u)
        << logs()[4];
}

TEST_F(Queue, LongConditionsAreSentWhole) {
    for (int id = 1; id <= 4; ++id)
        task(id, "u", 1, 0, 0, 0);
    std::string in = "task_id in (4";
    for (int i = 0; i < 2000; ++i)
        in += ", " + std::to_string(100000 + i);
    in += ") or username = '" + std::string(3000, 'x') + "'";
    EXPECT_EQ(ids(DownloadQueueOpenCondition(in.c_str(), -1, -1, std::string("status").c_str(), 1)),
              (V{4}));
    EXPECT_EQ(ids(DownloadQueueOpenTimeLeft(in.c_str(), 5, 0, 1)), (V{4}));
    EXPECT_TRUE(logs().empty());
}
