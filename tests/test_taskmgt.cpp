#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <ctime>
#include <fstream>
#include <string>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <vector>

#include "tests/fixture.h"
#include "torvale/task.h"

// Every read of this test binary passes through here, so that a test can make the file
// reads of task creation come in pieces of at most g_read_piece bytes, and end (or fail
// with g_read_errno) once g_read_left bytes have come. Unless asked, read is read.
namespace {
size_t g_read_piece = SIZE_MAX, g_read_left = SIZE_MAX;
int g_read_errno = 0;
} // namespace

extern "C" ssize_t read(int fd, void *buf, size_t count) {
    count = std::min({count, g_read_piece, g_read_left});
    if (count == 0 && g_read_errno != 0) {
        errno = g_read_errno;
        return -1;
    }
    ssize_t n = syscall(SYS_read, fd, buf, count);
    g_read_left -= n > 0 ? static_cast<size_t>(n) : 0;
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
        g_read_piece = g_read_left = SIZE_MAX;
        g_read_errno = 0;
        DbTest::TearDown();
    }
    // Fields of the newest task, joined by '|'.
    std::string newest(const std::string &fields) {
        return value("SELECT concat_ws('|', " + fields +
                     ") FROM download_queue ORDER BY task_id DESC LIMIT 1");
    }
    // The newest task's stored bytes, fetched in binary.
    std::string stored_bytes() {
        PGresult *r = PQexecParams(raw_,
                                   "SELECT torrent FROM download_queue ORDER BY task_id "
                                   "DESC LIMIT 1",
                                   0, nullptr, nullptr, nullptr, nullptr, 1);
        std::string bytes(PQgetvalue(r, 0, 0), PQgetlength(r, 0, 0));
        PQclear(r);
        return bytes;
    }
    std::string write_file(const std::string &name, const std::string &bytes) {
        std::string path = root() + "/" + name;
        std::ofstream(path, std::ios::binary) << bytes;
        return path;
    }
};

DLFileSet file_set(std::string &bytes) {
    return DLFileSet{reinterpret_cast<unsigned char *>(bytes.data()), bytes.size()};
}

} // namespace

TEST_F(TaskCreate, LinkTasksStartWaitingNamedAfterTheirLastPartMagnetsAfterDnOrHash) {
    struct Case {
        const char *url, *name, *flags;
    } cases[] = {
        {"http://host/dir/", "http://host/dir/", "0"},
        {"no-slash-at-all", "no-slash-at-all", "0"},
        {"ftps://host/secure.bin", "secure.bin", "16"},
        {"SFTP://host/x/y.tar", "y.tar", "32"},
        {"magnet:?xt=urn:btih:AB12&dn=It's%20S01&tr=udp://t/a", "It's%20S01", "4"},
        {"magnet:?xt=urn:btih:AB12&dn=&tr=udp://t/a", "AB12", "4"},
        {"MAGNET:?dn=First&xt=urn:btih:EF56&tr=x", "EF56", "4"},
        {"magnet:?xt=urn:btih:AB12&dn=Last", "magnet:?xt=urn:btih:AB12&dn=Last", "4"},
        {"magnet:?xt=urn:sha1:AB12&tr=x/y", "magnet:?xt=urn:sha1:AB12&tr=x/y", "4"},
    };
    for (const Case &c : cases) {
        ASSERT_EQ(DownloadTaskAddWithDst("ann", c.url, "/d"), 0) << c.url;
        EXPECT_EQ(newest("url, filename, task_flags"),
                  std::string(c.url) + "|" + c.name + "|" + c.flags);
    }
    long before = static_cast<long>(std::time(nullptr));
    ASSERT_EQ(DownloadTaskAddWithDst("o'neil", "http://host/pub/it's.iso", "/v/o'dir\\"), 0);
    long created = std::stol(newest("created_time"));
    EXPECT_TRUE(created >= before && created <= static_cast<long>(std::time(nullptr)));
    EXPECT_EQ(newest("username, pid, url, filename, started_time, status, total_size, "
                     "current_size, current_rate, total_peers, connected_peers, total_pieces, "
                     "downloaded_pieces, available_pieces, upload_rate, total_upload, "
                     "seeding_ratio, seeding_interval, seeding_elapsed, seeders, leechers, "
                     "task_flags, destination, torrent IS NULL, extra_info IS NULL"),
              "o'neil|-1|http://host/pub/it's.iso|it's.iso|0|1|0|0|0|0|0|0|0|0|0|0|150|3600|0|0|0|"
              "0|/v/o'dir\\|t|t");
    EXPECT_TRUE(logs().empty());
}

TEST_F(TaskCreate, FailuresAddNothingAndAreLogged) {
    std::string bytes = "b";
    DLFileSet set = file_set(bytes), broken{nullptr, 5};
    EXPECT_EQ(DownloadTaskAddWithDst("ann", "http://h/f", ""), -1);
    EXPECT_EQ(DownloadTaskAddURLHandler("ann", "http://h/f", ""), -1);
    EXPECT_EQ(DownloadTaskAddFileEX("ann", "/p/f", nullptr, &set, 0, nullptr), -1);
    EXPECT_EQ(DownloadTaskAddFileEX("ann", "/p/f", "/d", &broken, 0, nullptr), -1);
    exec("ALTER TABLE download_queue RENAME COLUMN destination TO dest");
    EXPECT_EQ(DownloadTaskAddWithDst("ann", "ftps://h/f.iso", "/d"), -1);
    exec("ALTER TABLE download_queue RENAME COLUMN dest TO destination");
    exec("TRUNCATE sysconf");
    EXPECT_EQ(DownloadTaskAddTorrent("ann", "/p/f", "/d", &set, nullptr), -1);
    EXPECT_EQ(count("SELECT * FROM download_queue"), 0);
    // The statement as it went out, up to the server's error; only its time varies.
    std::vector<std::string> lines = logs();
    ASSERT_EQ(lines.size(), 7u);
    lines[4] = lines[4].substr(0, lines[4].find("] (ERROR:"));
    size_t time_at = lines[4].find("'f.iso', ") + 9;
    lines[4].replace(time_at, lines[4].find(',', time_at) - time_at, "T");
    EXPECT_EQ(lines,
              (std::vector<std::string>{
                  "taskmgt:# Bad parameters", "taskmgt:# Bad parameters",
                  "taskmgt (#) Bad parameters.", "taskmgt (#) Failed to NAVODBEscapeBlog().",
                  "taskmgt (#) Failed to exec [INSERT INTO download_queue(username, pid, url, "
                  "filename,created_time, started_time, status, total_size, current_size, "
                  "current_rate,total_peers, connected_peers, total_pieces, downloaded_pieces, "
                  "available_pieces,upload_rate, total_upload, seeding_ratio, seeding_interval, "
                  "seeding_elapsed, task_flags, destination) VALUES('ann', -1, 'ftps://h/f.iso', "
                  "'f.iso', T,  0, 1, 0, 0, 0, 0, 0, 0, 0, 0, 0,0, 150, 3600, 0, 16, '/d')",
                  "sysconf (#) There is no system config in the database...why~~~",
                  "taskmgt (#) Failed to retrieve dlcfg from DB"}));
}

TEST_F(TaskCreate, ShareFolderIsTheDefaultDestinationOfEnabledUsersOnly) {
    std::string bytes = "b";
    DLFileSet set = file_set(bytes);
    ASSERT_EQ(DownloadTaskAddURLHandler("ANN", "http://h/f", nullptr), 0);
    EXPECT_EQ(newest("username, destination"), "ANN|/volume1/ann");
    ASSERT_EQ(DownloadTaskAddFileHandler("ann", "/p/f.nzb", "", &set, 1), 0);
    EXPECT_EQ(newest("filename, destination, task_flags"), "f.nzb|/volume1/ann|2");
    ASSERT_EQ(DownloadTaskAddFileHandler("ann", "/p/f.nzb", "/mine", &set, 1), 0);
    EXPECT_EQ(newest("destination"), "/mine");

    EXPECT_EQ(DownloadTaskAdd("bob", "http://h/f"), -1);
    EXPECT_EQ(DownloadTaskAddDLFileSet("carl", "/p/f", &set, 1), -1);
    EXPECT_EQ(logs(), (std::vector<std::string>{"taskmgt:# Failed to get share of user [bob].",
                                                "taskmgt:# Failed to get share of user [carl]."}));
    // With a destination of its own, a disabled user's task is no business of the settings.
    ASSERT_EQ(DownloadTaskAddWithDst("bob", "http://h/g", "/volume1/elsewhere"), 0);
    EXPECT_EQ(count("SELECT * FROM download_queue"), 4);
}

TEST_F(TaskCreate, OnlyFilesReadFromAPathAreLimitedToOneHundredMebibytes) {
    std::string path = write_file("big.torrent", "");
    ASSERT_EQ(truncate(path.c_str(), 104857601), 0);
    EXPECT_EQ(DownloadTaskAddFileEX("ann", path.c_str(), "/d", nullptr, 0, nullptr), -1);
    EXPECT_EQ(logs(), (std::vector<std::string>{"taskmgt (#) The torrent file size of " + path +
                                                " is too big (104857601). Max size allow is "
                                                "[104857600]."}));
    ASSERT_EQ(truncate(path.c_str(), 104857600), 0);
    ASSERT_EQ(DownloadTaskAddFileEX("ann", path.c_str(), "/d", nullptr, 0, nullptr), 0);
    EXPECT_EQ(newest("length(torrent)"), "104857600");

    std::string bytes(104857601, '\0');
    for (size_t i = 0; i < bytes.size(); i += 4093)
        bytes[i] = static_cast<char>(i / 4093);
    DLFileSet set = file_set(bytes);
    ASSERT_EQ(DownloadTaskAddFileWithDst("ann", "/p/huge.torrent", "/d", &set, 0), 0);
    EXPECT_TRUE(stored_bytes() == bytes) << "the bytes read back differ";
}

TEST_F(TaskCreate, FileTasksStoreTheBaseNameTheBytesAndTheKindReadInPiecesAndInFull) {
    std::string bytes = "'\\'"; // and every byte value
    for (int i = 0; i < 256; ++i)
        bytes += static_cast<char>(i);
    std::string path = write_file("it's.torrent", bytes);
    g_read_piece = 100; // the file arrives in three reads, all of which are kept
    ASSERT_EQ(DownloadTaskAddFileEX("ann", path.c_str(), "/d", nullptr, 0, "from 'rss'"), 0);
    EXPECT_EQ(newest("url, filename, task_flags, extra_info, seeding_ratio, pid, status"),
              "it's.torrent|it's.torrent|4|from 'rss'|150|-1|1");
    EXPECT_EQ(stored_bytes(), bytes);
    ASSERT_EQ(DownloadTaskAddFileWithDst("ann", path.c_str(), "/d", nullptr, 7), 0);
    EXPECT_EQ(newest("task_flags, extra_info"), "2|");
    // Handed-in bytes: the path is never opened and only names the task.
    std::string other = "other bytes";
    DLFileSet set = file_set(other);
    ASSERT_EQ(DownloadTaskAddTorrent("ann", "/no/such/dir/", "/d", &set, ""), 0);
    EXPECT_EQ(newest("url, filename, task_flags"), "/no/such/dir/|/no/such/dir/|4");
    EXPECT_EQ(stored_bytes(), other);

    // Refused: a missing path, a FIFO (not waited on), and an end before the size the file
    // had or an error.
    std::string missing = root() + "/missing", fifo = root() + "/fifo";
    ASSERT_EQ(mkfifo(fifo.c_str(), 0600), 0);
    EXPECT_EQ(DownloadTaskAddFileEX("ann", missing.c_str(), "/d", nullptr, 0, nullptr), -1);
    EXPECT_EQ(DownloadTaskAddFileEX("ann", fifo.c_str(), "/d", nullptr, 0, nullptr), -1);
    for (int error : {0, EIO}) {
        g_read_left = 250;
        g_read_errno = error;
        EXPECT_EQ(DownloadTaskAddFileEX("ann", path.c_str(), "/d", nullptr, 0, nullptr), -1);
    }
    EXPECT_EQ(count("SELECT * FROM download_queue"), 3);
    EXPECT_EQ(logs(), (std::vector<std::string>{
                          "taskmgt (#) Failed to open [" + missing + "].",
                          "taskmgt (#) Failed to stat file or it's not a regular file.",
                          "taskmgt (#) Failed to read torrent content. ReadSize:250.",
                          "taskmgt (#) Failed to read torrent content. ReadSize:250."}));
}
