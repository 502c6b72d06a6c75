#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <ctime>
#include <fstream>
#include <string>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <vector>

#include "tests/fixture.h"
#include "torvale/task.h"

// Reads of this test binary pass through here, so that a test can make the file reads of
// task creation come in pieces, end early or fail. Unless a test asks, read is read.
namespace {
size_t g_read_piece = 0;    // no read returns more than this many bytes
long g_read_end_after = -1; // after this many bytes, reads end (or fail, below)
int g_read_errno = 0;       // the error of the failing read, 0 for an early end
size_t g_read_so_far = 0;
} // namespace

extern "C" ssize_t read(int fd, void *buf, size_t count) {
    if (g_read_piece != 0 && count > g_read_piece)
        count = g_read_piece;
    if (g_read_end_after >= 0) {
        size_t left = static_cast<size_t>(g_read_end_after) - g_read_so_far;
        if (left == 0 && g_read_errno != 0) {
            errno = g_read_errno;
            return -1;
        }
        count = std::min(count, left);
    }
    ssize_t n = syscall(SYS_read, fd, buf, count);
    if (n > 0)
        g_read_so_far += static_cast<size_t>(n);
    return n;
}

namespace {

class TaskCreate : public DbTest {
  protected:
    void SetUp() override {
        DbTest::SetUp();
        exec("INSERT INTO sysconf VALUES (1, '', 0, 150, 3600)");
        exec("INSERT INTO user_setting(username, uid, share_folder, user_disabled) VALUES "
             "('ann', 1, '/volume1/ann', false), ('bob', 2, '/volume1/bob', true)");
    }
    void TearDown() override {
        g_read_piece = 0;
        g_read_end_after = -1;
        g_read_errno = 0;
        DbTest::TearDown();
    }
    // Fields of the newest task, joined by '|'.
    std::string newest(const std::string &fields) {
        return value("SELECT concat_ws('|', " + fields +
                     ") FROM download_queue ORDER BY task_id DESC LIMIT 1");
    }
    int tasks() { return count("SELECT * FROM download_queue"); }
    // The newest task's stored bytes, fetched in binary.
    std::string stored_bytes() {
        PGresult *r =
            PQexecParams(raw_, "SELECT torrent FROM download_queue ORDER BY task_id DESC LIMIT 1",
                         0, nullptr, nullptr, nullptr, nullptr, 1);
        std::string bytes = PQntuples(r) == 1 && !PQgetisnull(r, 0, 0)
                                ? std::string(PQgetvalue(r, 0, 0), PQgetlength(r, 0, 0))
                                : "<none>";
        PQclear(r);
        return bytes;
    }
    std::string write_file(const std::string &name, const std::string &bytes) {
        std::string path = root() + "/" + name;
        std::ofstream(path, std::ios::binary) << bytes;
        return path;
    }
};

// Every byte value, quotes and backslashes among them.
std::string all_bytes() {
    std::string bytes;
    for (int i = 0; i < 256; ++i)
        bytes += static_cast<char>(i);
    return bytes + "'\\'";
}

DLFileSet file_set(std::string &bytes) {
    return DLFileSet{reinterpret_cast<unsigned char *>(bytes.data()), bytes.size()};
}

} // namespace

TEST_F(TaskCreate, LinkTaskStartsWaitingWithTheConfiguredSeeding) {
    long before = static_cast<long>(std::time(nullptr));
    ASSERT_EQ(DownloadTaskAddWithDst("ann", "http://host/pub/file.iso", "/volume1/dl"), 0);
    long created = std::stol(newest("created_time"));
    EXPECT_GE(created, before);
    EXPECT_LE(created, static_cast<long>(std::time(nullptr)));
    EXPECT_EQ(newest("username, pid, url, filename, started_time, status, total_size, "
                     "current_size, current_rate, total_peers, connected_peers, total_pieces, "
                     "downloaded_pieces, available_pieces, upload_rate, total_upload, "
                     "seeding_ratio, seeding_interval, seeding_elapsed, seeders, leechers, "
                     "task_flags, destination, torrent IS NULL, extra_info IS NULL"),
              "ann|-1|http://host/pub/file.iso|file.iso|0|1|0|0|0|0|0|0|0|0|0|0|150|3600|0|0|0|0|"
              "/volume1/dl|t|t");
    EXPECT_TRUE(logs().empty());
}

TEST_F(TaskCreate, PlainLinksAreNamedAfterTheirLastPartAndFlaggedByScheme) {
    struct Case {
        const char *url, *name, *flags;
    } cases[] = {
        {"http://host/dir/", "http://host/dir/", "0"},
        {"no-slash-at-all", "no-slash-at-all", "0"},
        {"ftp://host/a/b.zip", "b.zip", "0"},
        {"ftps://host/secure.bin", "secure.bin", "16"},
        {"SFTP://host/x/y.tar", "y.tar", "32"},
        {"http://host/get?f=a/b&dn=c", "b&dn=c", "0"},
    };
    for (const Case &c : cases) {
        ASSERT_EQ(DownloadTaskAddWithDst("ann", c.url, "/d"), 0) << c.url;
        EXPECT_EQ(newest("filename, task_flags"), std::string(c.name) + "|" + c.flags) << c.url;
    }
}

TEST_F(TaskCreate, MagnetLinksAreNamedAfterDnOrHashUpToTheNextParameter) {
    struct Case {
        const char *url, *name;
    } cases[] = {
        {"magnet:?xt=urn:btih:AB12&dn=Some.Show%20S01&tr=udp://t/a", "Some.Show%20S01"},
        {"magnet:?xt=urn:btih:AB12&dn=&tr=udp://t/a", "AB12"},
        {"MAGNET:?xt=urn:btih:CD34&tr=x", "CD34"},
        {"magnet:?dn=First&xt=urn:btih:EF56&tr=x", "EF56"},
        {"magnet:?xt=urn:btih:AB12&dn=Last", "magnet:?xt=urn:btih:AB12&dn=Last"},
        {"magnet:?xt=urn:btih:AB12", "magnet:?xt=urn:btih:AB12"},
        {"magnet:?xt=urn:sha1:AB12&tr=x/y", "magnet:?xt=urn:sha1:AB12&tr=x/y"},
    };
    for (const Case &c : cases) {
        ASSERT_EQ(DownloadTaskAddWithDst("ann", c.url, "/d"), 0) << c.url;
        EXPECT_EQ(newest("url, filename, task_flags"), std::string(c.url) + "|" + c.name + "|4");
    }
    EXPECT_TRUE(logs().empty());
}

TEST_F(TaskCreate, QuotesInEveryTextAreStoredUnchanged) {
    ASSERT_EQ(DownloadTaskAddWithDst("o'neil", "magnet:?xt=urn:btih:H&dn=it's&x=1", "/v/o'dir\\"),
              0);
    EXPECT_EQ(newest("username, filename, destination"), "o'neil|it's|/v/o'dir\\");
    std::string bytes = "'; DROP TABLE download_queue; --";
    DLFileSet set = file_set(bytes);
    ASSERT_EQ(DownloadTaskAddFileEX("o'neil", "/in/it's.torrent", "/v/'", &set, 0, "x'y"), 0);
    EXPECT_EQ(newest("username, url, filename, destination, extra_info"),
              "o'neil|it's.torrent|it's.torrent|/v/'|x'y");
    EXPECT_EQ(stored_bytes(), bytes);
    EXPECT_EQ(tasks(), 2);
}

TEST_F(TaskCreate, MissingArgumentsAndAMissingConfigurationAddNothing) {
    std::string bytes = "b";
    DLFileSet set = file_set(bytes);
    EXPECT_EQ(DownloadTaskAddWithDst(nullptr, "http://h/f", "/d"), -1);
    EXPECT_EQ(DownloadTaskAddWithDst("ann", "", "/d"), -1);
    EXPECT_EQ(DownloadTaskAddWithDst("ann", "http://h/f", ""), -1);
    EXPECT_EQ(DownloadTaskAdd("", "http://h/f"), -1);
    EXPECT_EQ(DownloadTaskAddFileEX("ann", "/p/f", nullptr, &set, 0, nullptr), -1);
    EXPECT_EQ(DownloadTaskAddFileEX("ann", "", "/d", &set, 0, nullptr), -1);
    EXPECT_EQ(DownloadTaskAddDLFileSet("ann", nullptr, &set, 0), -1);
    DLFileSet broken{nullptr, 5};
    EXPECT_EQ(DownloadTaskAddFileEX("ann", "/p/f", "/d", &broken, 0, nullptr), -1);
    exec("TRUNCATE sysconf");
    EXPECT_EQ(DownloadTaskAddWithDst("ann", "http://h/f", "/d"), -1);
    EXPECT_EQ(DownloadTaskAddTorrent("ann", "/p/f", "/d", &set, nullptr), -1);
    EXPECT_EQ(tasks(), 0);
    EXPECT_EQ(logs(), (std::vector<std::string>{
                          "taskmgt:# Bad parameters", "taskmgt:# Bad parameters",
                          "taskmgt:# Bad parameters", "taskmgt:# Bad parameters",
                          "taskmgt (#) Bad parameters.", "taskmgt (#) Bad parameters.",
                          "taskmgt:# Bad parameters", "taskmgt (#) Failed to NAVODBEscapeBlog().",
                          "sysconf (#) There is no system config in the database...why~~~",
                          "taskmgt (#) Failed to retrieve dlcfg from DB",
                          "sysconf (#) There is no system config in the database...why~~~",
                          "taskmgt (#) Failed to retrieve dlcfg from DB"}));
}

TEST_F(TaskCreate, ShareFolderIsTheDestinationOfEnabledUsersOnly) {
    std::string bytes = "b";
    DLFileSet set = file_set(bytes);
    ASSERT_EQ(DownloadTaskAdd("ANN", "http://h/f"), 0);
    EXPECT_EQ(newest("username, destination"), "ANN|/volume1/ann");
    ASSERT_EQ(DownloadTaskAddDLFileSet("ann", "/p/f.nzb", &set, 1), 0);
    EXPECT_EQ(newest("filename, destination, task_flags"), "f.nzb|/volume1/ann|2");

    EXPECT_EQ(DownloadTaskAdd("bob", "http://h/f"), -1);
    EXPECT_EQ(DownloadTaskAddDLFileSet("bob", "/p/f", &set, 1), -1);
    EXPECT_EQ(DownloadTaskAdd("carl", "http://h/f"), -1);
    EXPECT_EQ(logs(), (std::vector<std::string>{"taskmgt:# Failed to get share of user [bob].",
                                                "taskmgt:# Failed to get share of user [bob].",
                                                "taskmgt:# Failed to get share of user [carl]."}));
    // A destination of their own is no business of the user's settings.
    ASSERT_EQ(DownloadTaskAddWithDst("bob", "http://h/g", "/volume1/elsewhere"), 0);
    EXPECT_EQ(newest("username, destination"), "bob|/volume1/elsewhere");
    EXPECT_EQ(tasks(), 3);
}

TEST_F(TaskCreate, HandlersTreatAnEmptyDestinationDifferently) {
    std::string bytes = "b";
    DLFileSet set = file_set(bytes);
    EXPECT_EQ(DownloadTaskAddURLHandler("ann", "http://h/f", ""), -1);
    EXPECT_EQ(logs(), (std::vector<std::string>{"taskmgt:# Bad parameters"}));
    ASSERT_EQ(DownloadTaskAddURLHandler("ann", "http://h/f", nullptr), 0);
    EXPECT_EQ(newest("destination"), "/volume1/ann");
    ASSERT_EQ(DownloadTaskAddURLHandler("ann", "http://h/f", "/mine"), 0);
    EXPECT_EQ(newest("destination"), "/mine");

    ASSERT_EQ(DownloadTaskAddFileHandler("ann", "/p/a.torrent", "", &set, 0), 0);
    EXPECT_EQ(newest("destination"), "/volume1/ann");
    ASSERT_EQ(DownloadTaskAddFileHandler("ann", "/p/a.torrent", nullptr, &set, 0), 0);
    EXPECT_EQ(newest("destination"), "/volume1/ann");
    ASSERT_EQ(DownloadTaskAddFileHandler("ann", "/p/a.torrent", "/mine", &set, 0), 0);
    EXPECT_EQ(newest("destination"), "/mine");
    EXPECT_EQ(tasks(), 5);
}

TEST_F(TaskCreate, FileTasksStoreTheBaseNameTheBytesAndTheKind) {
    std::string bytes = all_bytes();
    std::string path = write_file("show.torrent", bytes);
    ASSERT_EQ(DownloadTaskAddFileEX("ann", path.c_str(), "/d", nullptr, 0, "from rss"), 0);
    EXPECT_EQ(newest("url, filename, task_flags, extra_info, seeding_ratio, pid, status"),
              "show.torrent|show.torrent|4|from rss|150|-1|1");
    EXPECT_EQ(stored_bytes(), bytes);

    ASSERT_EQ(DownloadTaskAddFileWithDst("ann", path.c_str(), "/d", nullptr, 7), 0);
    EXPECT_EQ(newest("task_flags, extra_info"), "2|");
    ASSERT_EQ(DownloadTaskAddTorrent("ann", path.c_str(), "/d", nullptr, ""), 0);
    EXPECT_EQ(newest("task_flags, extra_info IS NOT NULL"), "4|t");

    // Handed-in bytes: the path is never opened and only names the task.
    std::string other = "other bytes";
    DLFileSet set = file_set(other);
    ASSERT_EQ(DownloadTaskAddFileEX("ann", "/no/such/dir/", "/d", &set, 1, nullptr), 0);
    EXPECT_EQ(newest("url, filename"), "/no/such/dir/|/no/such/dir/");
    EXPECT_EQ(stored_bytes(), other);
    DLFileSet empty{nullptr, 0};
    ASSERT_EQ(DownloadTaskAddFileEX("ann", "bare", "/d", &empty, 1, nullptr), 0);
    EXPECT_EQ(newest("url, length(torrent)"), "bare|0");
    EXPECT_TRUE(logs().empty());
}

TEST_F(TaskCreate, FilesReadFromAPathAreLimitedToOneHundredMebibytes) {
    std::string path = root() + "/big.torrent";
    ASSERT_EQ(truncate(write_file("big.torrent", "").c_str(), 104857601), 0);
    EXPECT_EQ(DownloadTaskAddFileEX("ann", path.c_str(), "/d", nullptr, 0, nullptr), -1);
    EXPECT_EQ(logs(), (std::vector<std::string>{"taskmgt (#) The torrent file size of " + path +
                                                " is too big (104857601). Max size allow is "
                                                "[104857600]."}));
    ASSERT_EQ(truncate(path.c_str(), 104857600), 0);
    ASSERT_EQ(DownloadTaskAddFileEX("ann", path.c_str(), "/d", nullptr, 0, nullptr), 0);
    EXPECT_EQ(newest("length(torrent)"), "104857600");
    EXPECT_EQ(tasks(), 1);
}

TEST_F(TaskCreate, BytesHandedInAreStoredWhateverTheirSize) {
    std::string bytes(104857601, '\0');
    for (size_t i = 0; i < bytes.size(); i += 4093)
        bytes[i] = static_cast<char>(i / 4093);
    bytes.back() = '\'';
    DLFileSet set = file_set(bytes);
    ASSERT_EQ(DownloadTaskAddFileWithDst("ann", "/p/huge.torrent", "/d", &set, 0), 0);
    EXPECT_TRUE(stored_bytes() == bytes) << "the bytes read back differ";
}

TEST_F(TaskCreate, UnreadablePathsAreRefused) {
    std::string missing = root() + "/missing.torrent";
    std::string fifo = root() + "/fifo";
    ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
    EXPECT_EQ(DownloadTaskAddFileEX("ann", missing.c_str(), "/d", nullptr, 0, nullptr), -1);
    EXPECT_EQ(DownloadTaskAddFileEX("ann", root().c_str(), "/d", nullptr, 0, nullptr), -1);
    // A FIFO is refused at once rather than waited on.
    EXPECT_EQ(DownloadTaskAddFileEX("ann", fifo.c_str(), "/d", nullptr, 0, nullptr), -1);
    EXPECT_EQ(tasks(), 0);
    EXPECT_EQ(logs(), (std::vector<std::string>{
                          "taskmgt (#) Failed to open [" + missing + "].",
                          "taskmgt (#) Failed to stat file or it's not a regular file.",
                          "taskmgt (#) Failed to stat file or it's not a regular file."}));
}

TEST_F(TaskCreate, FileIsReadUntilAllOfItHasArrived) {
    std::string bytes = all_bytes() + all_bytes() + all_bytes();
    std::string path = write_file("pieces.torrent", bytes);
    g_read_piece = 100;
    ASSERT_EQ(DownloadTaskAddFileEX("ann", path.c_str(), "/d", nullptr, 0, nullptr), 0);
    EXPECT_EQ(stored_bytes(), bytes);
    EXPECT_TRUE(logs().empty());

    // An end before the size the file had, or an error, is still a failure.
    g_read_so_far = 0;
    g_read_end_after = 250;
    EXPECT_EQ(DownloadTaskAddFileEX("ann", path.c_str(), "/d", nullptr, 0, nullptr), -1);
    g_read_so_far = 0;
    g_read_errno = EIO;
    EXPECT_EQ(DownloadTaskAddFileEX("ann", path.c_str(), "/d", nullptr, 0, nullptr), -1);
    EXPECT_EQ(tasks(), 1);
    EXPECT_EQ(logs(), (std::vector<std::string>{
                          "taskmgt (#) Failed to read torrent content. ReadSize:250.",
                          "taskmgt (#) Failed to read torrent content. ReadSize:250."}));
}

TEST_F(TaskCreate, AFailingInsertIsLoggedWithItsStatement) {
    exec("ALTER TABLE download_queue RENAME COLUMN destination TO dest");
    int rc = DownloadTaskAddWithDst("ann", "ftps://h/f.iso", "/d");
    exec("ALTER TABLE download_queue RENAME COLUMN dest TO destination");
    EXPECT_EQ(rc, -1);
    ASSERT_EQ(logs().size(), 1u);
    std::string line = logs()[0];
    const std::string head =
        "taskmgt (#) Failed to exec [INSERT INTO download_queue(username, pid, url, "
        "filename,created_time, started_time, status, total_size, current_size, "
        "current_rate,total_peers, connected_peers, total_pieces, downloaded_pieces, "
        "available_pieces,upload_rate, total_upload, seeding_ratio, seeding_interval, "
        "seeding_elapsed, task_flags, destination) VALUES('ann', -1, 'ftps://h/f.iso', 'f.iso', ";
    const std::string tail =
        ",  0, 1, 0, 0, 0, 0, 0, 0, 0, 0, 0,0, 150, 3600, 0, 16, '/d')] (ERROR:";
    EXPECT_EQ(line.substr(0, head.size()), head);
    size_t at = line.find(tail);
    ASSERT_NE(at, std::string::npos) << line;
    EXPECT_EQ(line.substr(head.size(), at - head.size()).find_first_not_of("0123456789"),
              std::string::npos)
        << "created_time is a plain number";
    EXPECT_EQ(tasks(), 0);
}
