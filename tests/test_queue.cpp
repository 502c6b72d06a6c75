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
using S = std::vector<std::string>;

// Walks the listing: the task ids in the order handed out, each followed by ":value" of
// the computed column when one is named.
std::string walk(DownloadQueueHandle *raw, const char *column = nullptr) {
    Handle handle(raw);
    if (handle == nullptr)
        return "<null handle>";
    std::string out;
    while (const DownloadTaskInfo *task = DownloadQueueGet(handle.get())) {
        out += (out.empty() ? "" : " ") + std::to_string(task->task_id);
        if (column != nullptr)
            out += std::string(":") + NAVODBFetchField(handle->result, handle->row, column);
    }
    return out;
}

// Every field of the record in declaration order, each followed by a space.
std::string dump(const DownloadTaskInfo &t) {
    auto s = [](const char *v) { return v != nullptr ? v : "(null)"; };
    std::ostringstream os;
    auto put = [&os](const auto &...v) { ((os << v << ' '), ...); };
    put(t.task_id, s(t.username), t.pid, s(t.url), s(t.filename), t.status, t.created_time,
        t.started_time, t.total_size, t.current_size, t.current_rate, t.total_peers,
        t.connected_peers, t.total_pieces, t.downloaded_pieces, t.available_pieces, t.upload_rate,
        t.total_upload, t.seeding_ratio, t.seeding_interval, t.seeding_elapsed, t.seeders,
        t.leechers, t.task_flags, t.has_torrent);
    return os.str();
}

} // namespace

class Queue : public DbTest {
  protected:
    // Inserted in falling id order, so that only the statement's ORDER BY gives id order
    // and ties come out in ascending id only when the statement asks for it.
    // Progress: 25 % for 1-3, 0 % for 4 (size unknown) and 5, 100 % for 6. Time left:
    // 10 s for 1, 2 s for 5; none for 2 (paused), 3 (rate exactly 512), 4 and 6.
    void SetUp() override {
        DbTest::SetUp();
        exec("INSERT INTO download_queue(task_id, username, status, total_size, current_size, "
             "current_rate) VALUES (6, 'a', 5, 1000, 1000, 0), (5, 'b', 2, 1200, 0, 600), "
             "(4, 'a', 2, 0, 0, 9000), (3, 'b', 2, 8000, 2000, 512), "
             "(2, 'a', 3, 8000, 2000, 600), (1, 'b', 2, 8000, 2000, 600)");
    }
};

TEST_F(Queue, RecordTakesEveryColumnByNameAndNullsReadAsZero) {
    exec("TRUNCATE download_queue");
    exec("INSERT INTO download_queue VALUES (7, 'alice', 4242, 'http://h/a.iso', 'a.iso', "
         "-1, 1700000000, 2, 1099511627776, 549755813888, 600, 11, 5, 300, 150, 290, "
         "'\\x0102', 70, 8589934592, 150, 3600, 120, 9, 4, 6, '/share', 'x')");
    exec("INSERT INTO download_queue(task_id, torrent) VALUES (8, NULL), (9, '')");
    const std::string zeros = "(null) 0 (null) (null) 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 ";

    Handle handle(DownloadQueueOpen(nullptr));
    ASSERT_NE(handle, nullptr);
    EXPECT_EQ(handle->rows, 3);
    DownloadTaskInfo *t = DownloadQueueGet(handle.get());
    ASSERT_NE(t, nullptr);
    // A time stored as -1 reads as the unsigned 32-bit value it always was.
    EXPECT_EQ(dump(*t), "7 alice 4242 http://h/a.iso a.iso 2 4294967295 1700000000 "
                        "1099511627776 549755813888 600 11 5 300 150 290 70 8589934592 150 3600 "
                        "120 9 4 6 1 ");
    ASSERT_EQ(DownloadQueueGet(handle.get()), t); // one record, overwritten
    EXPECT_EQ(dump(*t), "8 " + zeros);
    // A null handle: null, the record cleared, and the listing goes on.
    EXPECT_EQ(DownloadQueueGet(nullptr), nullptr);
    EXPECT_EQ(dump(*t), "0 " + zeros);
    ASSERT_EQ(DownloadQueueGet(handle.get()), t);
    EXPECT_EQ(dump(*t), "9 " + zeros); // a torrent stored but empty counts as none
    // After the last row: null, and the record cleared.
    EXPECT_EQ(DownloadQueueGet(handle.get()), nullptr);
    EXPECT_EQ(dump(*t), "0 " + zeros);
    DownloadQueueClose(nullptr);
    EXPECT_EQ(logs(), S{"queue (#) Bad parameter."});
}

TEST_F(Queue, EachOpenCallOrdersPagesAndRestrictsAsDocumented) {
    // 'C'ondition: ids; 'P'rogress and 'T'ime left: ids with the computed figure.
    auto list = [](char call, const char *cond, int limit, int offset, const char *sort, int asc) {
        if (call == 'C')
            return walk(DownloadQueueOpenCondition(cond, limit, offset, sort, asc));
        if (call == 'P')
            return walk(DownloadQueueOpenProgress(cond, limit, offset, asc), "progress");
        return walk(DownloadQueueOpenTimeLeft(cond, limit, offset, asc), "time_left");
    };
    EXPECT_EQ(walk(DownloadQueueOpen(nullptr)), "1 2 3 4 5 6");
    EXPECT_EQ(walk(DownloadQueueOpen("task_id=-3")), ""); // an empty listing is no failure
    // Sort column null or empty: task_id. Equal keys always in ascending id, with or
    // without a condition, so that pages neither repeat nor skip a task.
    EXPECT_EQ(list('C', nullptr, -1, -1, nullptr, 0), "6 5 4 3 2 1");
    EXPECT_EQ(list('C', nullptr, -1, -1, "", 1), "1 2 3 4 5 6");
    EXPECT_EQ(list('C', nullptr, -1, -1, "username", 0), "1 3 5 2 4 6");
    EXPECT_EQ(list('C', nullptr, -1, -1, "USERNAME", 1), "2 4 6 1 3 5");
    EXPECT_EQ(list('C', "status=2", 1, 1, "username", 0), "3");
    EXPECT_EQ(list('C', nullptr, 2, -1, "status", 1), "1 3");
    EXPECT_EQ(list('C', nullptr, -1, 4, "status", 1), "2 6");
    EXPECT_EQ(list('C', nullptr, 0, 0, nullptr, 1), "");
    EXPECT_EQ(list('C', "status=3 or task_id=1", -1, -1, "status", 1), "1 2");
    EXPECT_EQ(list('P', nullptr, 10, 0, nullptr, 1), "4:0 5:0 1:25 2:25 3:25 6:100");
    EXPECT_EQ(list('P', nullptr, 10, 0, nullptr, 0), "6:100 1:25 2:25 3:25 4:0 5:0");
    // A top-level OR restricts both halves: each match once, with its own figure.
    EXPECT_EQ(list('P', "status=2 or status=3", 10, 0, nullptr, 1), "4:0 5:0 1:25 2:25 3:25");
    EXPECT_EQ(list('T', "status=2 or task_id=2", 10, 0, nullptr, 1),
              "5:2 1:10 3:9999999999 4:9999999999 2:9999999999");
    // Negative paging is sent as 0: no row for limit -1, the first rows for offset -1.
    EXPECT_EQ(list('P', nullptr, -1, 0, nullptr, 1), "");
    EXPECT_EQ(list('P', nullptr, 1, -1, nullptr, 1), "4:0");
    // Equal times by status in the same direction, then by ascending id.
    EXPECT_EQ(list('T', nullptr, 10, 0, nullptr, 1),
              "5:2 1:10 3:9999999999 4:9999999999 2:9999999999 6:9999999999");
    EXPECT_EQ(list('T', nullptr, 10, 0, nullptr, 0),
              "6:9999999999 2:9999999999 3:9999999999 4:9999999999 1:10 5:2");
    EXPECT_TRUE(logs().empty());
}

TEST_F(Queue, ConditionsAreSentWholeAndHostileTextsRefusedChangingNothing) {
    std::string in = "task_id in (4";
    for (int i = 0; i < 2000; ++i)
        in += ", " + std::to_string(100000 + i);
    in += ") or username = '" + std::string(3000, 'x') + "'";
    EXPECT_EQ(walk(DownloadQueueOpenCondition(in.c_str(), -1, -1, "status", 1)), "4");
    EXPECT_EQ(walk(DownloadQueueOpenTimeLeft(in.c_str(), 5, 0, 1)), "4");

    S refused;
    for (const char *sort : {"task_id; DELETE FROM download_queue", "username desc", "(SELECT 1)",
                             "1", "task_id--", "no_such_column", "TRUE", "download_queue.status"}) {
        EXPECT_EQ(DownloadQueueOpenCondition(nullptr, -1, -1, sort, 1), nullptr) << sort;
        refused.push_back(std::string("queue (#) Bad sort column [") + sort + "].");
    }
    EXPECT_EQ(logs(), refused); // and nothing for the long conditions
    clear_logs();

    const char *hostile = "1=1; DELETE FROM download_queue";
    EXPECT_EQ(DownloadQueueOpen(hostile), nullptr);
    EXPECT_EQ(DownloadQueueOpenCondition(hostile, 1, 0, nullptr, 1), nullptr);
    EXPECT_EQ(DownloadQueueOpenProgress("0=0) or (1=1", 1, 0, 1), nullptr);
    EXPECT_EQ(DownloadQueueOpenTimeLeft("task_id=1 /* x */", 1, 0, 1), nullptr);
    EXPECT_EQ(logs(), S(4, "queue (#) Failed to escape condition."));
    EXPECT_EQ(value("SELECT count(*) FROM download_queue"), "6");
}

TEST_F(Queue, FailingStatementsAreLoggedWhole) {
    exec("ALTER TABLE download_queue RENAME COLUMN leechers TO leechers_gone");
    EXPECT_EQ(DownloadQueueOpenProgress("task_id>0", 3, 4, 1), nullptr);
    EXPECT_EQ(DownloadQueueOpenTimeLeft("task_id>0", 3, 4, 0), nullptr);
    EXPECT_EQ(DownloadQueueOpen(nullptr), nullptr);
    exec("ALTER TABLE download_queue RENAME COLUMN leechers_gone TO leechers");

    // Each line up to the server's message, with the column list shown as C.
    S got;
    for (std::string line : logs()) {
        for (size_t at; (at = line.find("SELECT task_id, username,")) != std::string::npos;)
            line.replace(at + 7, line.find("length(torrent)", at) + 15 - at - 7, "C");
        got.push_back(line.substr(0, line.find("(ERROR:") + 7));
    }
    const std::string fail = "queue (#) Failed to exec [SELECT C";
    EXPECT_EQ(
        got,
        (S{fail + ", ((current_size::float/total_size::float)*100) as progress FROM "
                  "download_queue WHERE (task_id > 0) and total_size != 0 UNION ALL SELECT C, 0 "
                  "as progress FROM download_queue WHERE (task_id > 0) and total_size = 0 ORDER "
                  "BY progress asc, task_id asc LIMIT 3 OFFSET 4] (ERROR:",
           fail + ", ((total_size::float-current_size::float)/current_rate::float) as time_left "
                  "FROM download_queue WHERE (task_id > 0) and status = 2 and total_size != 0 "
                  "and current_rate > 512 UNION ALL SELECT C, 9999999999 as time_left FROM "
                  "download_queue WHERE (task_id > 0) and (status != 2 or total_size = 0 or "
                  "current_rate <= 512) ORDER BY time_left desc, status desc, task_id asc LIMIT 3 "
                  "OFFSET 4] (ERROR:",
           // Without a condition the statement is not repeated.
           "queue (#) Failed to query database. (ERROR:"}));
}
