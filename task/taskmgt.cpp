// Task creation: links and files become waiting rows of download_queue. Also the
// progress request, the one signal that a web handler sends along with a listing.
#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <ctime>
#include <fcntl.h>
#include <memory>
#include <new>
#include <string>
#include <sys/stat.h>
#include <sys/sysinfo.h>
#include <unistd.h>

#include "db/access.h"
#include "platform/log.h"
#include "torvale/task.h"
#include "torvale/user.h"
#include "torvale/utils.h"

namespace {

using torvale::db::present;

constexpr char kLogUnit[] = "taskmgt";

constexpr char kLinkInsert[] =
    "INSERT INTO download_queue(username, pid, url, filename,created_time, started_time, "
    "status, total_size, current_size, current_rate,total_peers, connected_peers, total_pieces, "
    "downloaded_pieces, available_pieces,upload_rate, total_upload, seeding_ratio, "
    "seeding_interval, seeding_elapsed, task_flags, destination) VALUES('%s', -1, '%s', '%s', "
    "%ld,  0, %d, 0, 0, 0, 0, 0, 0, 0, 0, 0,0, %d, %d, 0, %d, '%s')";
constexpr char kFileInsert[] =
    "INSERT INTO download_queue(username, pid, url, filename,created_time, started_time, "
    "status, total_size, current_size, current_rate,total_peers, connected_peers, total_pieces, "
    "downloaded_pieces, available_pieces, torrent,upload_rate, total_upload, seeding_ratio, "
    "seeding_interval, seeding_elapsed, task_flags, destination, extra_info) VALUES('%s', -1, "
    "'%s', '%s', %ld,  0, %d, 0, 0, 0, 0, 0, 0, 0, 0, '%s', 0, 0, %d, %d, 0, %d, '%s', '%s')";

constexpr char kDnParam[] = "&dn=";
constexpr char kEmptyDnParam[] = "&dn=&";
constexpr char kInfoHash[] = "urn:btih:";

// The user's share folder is read into a buffer of this size.
constexpr int kShareBytes = 4096;

// Escapes `text` for use between single quotes into `out`. Returns 0, or -1.
int DownloadTaskEscape(const char *text, std::string *out) noexcept {
    if (text == nullptr || out == nullptr) {
        TV_LOG("%s:%d Bad parameter");
        return -1;
    }
    try {
        *out = torvale::db::escape(text);
    } catch (const std::bad_alloc &) {
        TV_LOG("%s:%d Failed to calloc(%d, 1)", static_cast<int>(2 * std::strlen(text) + 1));
        return -1;
    }
    return 0;
}

// The text after the last '/' when something follows it, else the whole text.
const char *base_name(const char *text) {
    const char *slash = std::strrchr(text, '/');
    return slash != nullptr && slash[1] != '\0' ? slash + 1 : text;
}

// A magnet link's name: its dn value, else its info hash, each up to the next '&'; the
// whole link when neither is found or no '&' follows. Percent-escapes stay as they are.
std::string magnet_name(const std::string &link) {
    size_t start = std::string::npos;
    size_t dn = link.find(kDnParam);
    size_t hash = link.find(kInfoHash);
    if (dn != std::string::npos && link.find(kEmptyDnParam) == std::string::npos)
        start = dn + sizeof kDnParam - 1;
    else if (hash != std::string::npos)
        start = hash + sizeof kInfoHash - 1;
    size_t end = start != std::string::npos ? link.find('&', start) : std::string::npos;
    if (end == std::string::npos)
        return link;
    return link.substr(start, end - start);
}

// Builds a statement of about `size` bytes with `build`. A statement that cannot be
// allocated, or that would outgrow what the client can send, is logged and refused.
template <typename Build> bool statement(long long size, Build build) noexcept {
    try {
        if (size > INT_MAX)
            throw std::bad_alloc();
        build();
        return true;
    } catch (const std::bad_alloc &) {
        TV_LOG("%s (%d) Failed to malloc(%d)",
               static_cast<int>(std::min<long long>(size, INT_MAX)));
        return false;
    }
}

// The seeding defaults that every new task copies.
bool load_conf(DownloadConf &conf) noexcept {
    std::memset(&conf, 0, sizeof conf);
    if (DownloadConfGet(&conf) == -1) {
        TV_LOG("%s (%d) Failed to retrieve dlcfg from DB");
        return false;
    }
    return true;
}

int insert(const std::string &sql) noexcept {
    DBConn_tag *conn = DownloadDBConnect();
    if (conn == nullptr) {
        TV_LOG("%s (%d) Failed to connect to database");
        return -1;
    }
    int rc = 0;
    if (NAVODBExecute(conn, sql.c_str(), nullptr) == -1) {
        TV_LOG("%s (%d) Failed to exec [%s] (%s)", sql.c_str(), NAVODBErrorGet(conn));
        rc = -1;
    }
    DownloadDBClose(conn);
    return rc;
}

long now() noexcept {
    return static_cast<long>(std::time(nullptr));
}

int add_link(const char *user, const char *url, const char *destination) noexcept {
    std::string e_user, e_url, e_dest;
    if (DownloadTaskEscape(user, &e_user) == -1 || DownloadTaskEscape(url, &e_url) == -1 ||
        DownloadTaskEscape(destination, &e_dest) == -1)
        return -1;
    DownloadConf conf;
    if (!load_conf(conf))
        return -1;
    int flags = 0;
    bool magnet = DownloadUtilsIsMagnetLink(url) == 1;
    if (magnet)
        flags = DOWNLOAD_TASK_FLAG_TORRENT;
    int ftp = DownloadUtilsIsFTPEncrptionLink(url);
    if (ftp == 1)
        flags = DOWNLOAD_TASK_FLAG_FTPS;
    else if (ftp == 2)
        flags = DOWNLOAD_TASK_FLAG_SFTP;
    std::string name, sql;
    long long size = 2LL * e_url.size() + e_user.size() + e_dest.size() + 512;
    bool built = statement(size, [&] {
        name = magnet ? magnet_name(e_url) : base_name(e_url.c_str());
        sql = torvale::db::format(kLinkInsert, e_user.c_str(), e_url.c_str(), name.c_str(), now(),
                                  TASK_STATUS_WAITING, conf.seeding_ratio, conf.seeding_interval,
                                  flags, e_dest.c_str());
    });
    return built ? insert(sql) : -1;
}

// A file's bytes read from its path.
struct FileBytes {
    std::unique_ptr<unsigned char[]> data;
    size_t size = 0;
};

struct FdClose {
    int fd;
    ~FdClose() {
        if (fd != -1)
            close(fd);
    }
};

// Reads the whole regular file at `path`, of at most DOWNLOAD_TASK_FILE_MAX bytes.
bool read_file(const char *path, FileBytes &out) noexcept {
    // Non-blocking, so that a FIFO given as path is refused rather than waited on.
    FdClose file{open(path, O_RDONLY | O_CLOEXEC | O_NONBLOCK)};
    if (file.fd == -1) {
        TV_LOG("%s (%d) Failed to open [%s].", path);
        return false;
    }
    struct stat st {};
    if (fstat(file.fd, &st) == -1 || !S_ISREG(st.st_mode)) {
        TV_LOG("%s (%d) Failed to stat file or it's not a regular file.");
        return false;
    }
    long long size = st.st_size;
    if (size > DOWNLOAD_TASK_FILE_MAX) {
        TV_LOG("%s (%d) The torrent file size of %s is too big (%lld). Max size allow is [%d].",
               path, size, DOWNLOAD_TASK_FILE_MAX);
        return false;
    }
    out.data.reset(new (std::nothrow) unsigned char[static_cast<size_t>(size)]);
    if (out.data == nullptr) {
        TV_LOG("%s (%d) Failed to malloc(%lld).", size);
        return false;
    }
    out.size = static_cast<size_t>(size);
    // One read may bring fewer bytes than asked for: go on until all have arrived, and
    // fail only on an error or an end before the size the file had.
    size_t got = 0;
    while (got < out.size) {
        ssize_t n = read(file.fd, out.data.get() + got, out.size - got);
        if (n > 0)
            got += static_cast<size_t>(n);
        else if (n == 0 || errno != EINTR)
            break;
    }
    if (got != out.size) {
        TV_LOG("%s (%d) Failed to read torrent content. ReadSize:%d.", static_cast<int>(got));
        return false;
    }
    return true;
}

int add_file(const char *user, const char *path, const char *destination, const DLFileSet *content,
             int kind, const char *extra_info) noexcept {
    FileBytes file;
    if (content == nullptr) {
        if (!read_file(path, file))
            return -1;
    }
    const unsigned char *bytes = content != nullptr ? content->data : file.data.get();
    size_t length = content != nullptr ? content->length : file.size;

    std::string e_name, e_user, e_dest, e_extra;
    if (DownloadTaskEscape(base_name(path), &e_name) == -1 ||
        DownloadTaskEscape(user, &e_user) == -1 || DownloadTaskEscape(destination, &e_dest) == -1 ||
        (present(extra_info) && DownloadTaskEscape(extra_info, &e_extra) == -1))
        return -1;
    size_t encoded_length = 0;
    torvale::db::Text encoded(NAVODBBlogEncode(bytes, length, &encoded_length));
    if (encoded == nullptr) {
        TV_LOG("%s (%d) Failed to NAVODBEscapeBlog().");
        return -1;
    }
    // The encoded text stands for the bytes from here on: up to 100 MiB less to hold.
    file.data.reset();
    DownloadConf conf;
    if (!load_conf(conf))
        return -1;
    int flags = kind != 0 ? DOWNLOAD_TASK_FLAG_FILE_KIND : DOWNLOAD_TASK_FLAG_TORRENT;
    std::string sql;
    long long size = 2LL * e_name.size() + e_user.size() + e_dest.size() +
                     static_cast<long long>(encoded_length) + 512 + e_extra.size();
    bool built = statement(size, [&] {
        sql = torvale::db::format(kFileInsert, e_user.c_str(), e_name.c_str(), e_name.c_str(),
                                  now(), TASK_STATUS_WAITING, encoded.get(), conf.seeding_ratio,
                                  conf.seeding_interval, flags, e_dest.c_str(), e_extra.c_str());
    });
    encoded.reset();
    return built ? insert(sql) : -1;
}

// The user's default share, for the operations that take no destination. Only an
// enabled user with a setting has one.
bool share_of(const char *user, char (&share)[kShareBytes]) noexcept {
    if (DownloadUserShareGet(user, share, kShareBytes) != 1) {
        TV_LOG("%s:%d Failed to get share of user [%s].", user);
        return false;
    }
    return true;
}

// This side's own attachment to the progress segment, kept for the process's life.
volatile int *g_progress_request = nullptr;

} // namespace

extern "C" {

TORVALE_API int DownloadTaskAddWithDst(const char *user, const char *url,
                                       const char *destination) noexcept {
    if (!present(user) || !present(url) || !present(destination)) {
        TV_LOG("%s:%d Bad parameters");
        return -1;
    }
    return add_link(user, url, destination);
}

TORVALE_API int DownloadTaskAdd(const char *user, const char *url) noexcept {
    if (!present(user) || !present(url)) {
        TV_LOG("%s:%d Bad parameters");
        return -1;
    }
    char share[kShareBytes];
    if (!share_of(user, share))
        return -1;
    return DownloadTaskAddWithDst(user, url, share);
}

TORVALE_API int DownloadTaskAddURLHandler(const char *user, const char *url,
                                          const char *destination) noexcept {
    if (destination != nullptr)
        return DownloadTaskAddWithDst(user, url, destination);
    return DownloadTaskAdd(user, url);
}

TORVALE_API int DownloadTaskAddFileEX(const char *user, const char *path, const char *destination,
                                      const DLFileSet *content, int kind,
                                      const char *extra_info) noexcept {
    if (!present(user) || !present(path) || !present(destination)) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    return add_file(user, path, destination, content, kind, extra_info);
}

TORVALE_API int DownloadTaskAddTorrent(const char *user, const char *path, const char *destination,
                                       const DLFileSet *content, const char *extra_info) noexcept {
    return DownloadTaskAddFileEX(user, path, destination, content, 0, extra_info);
}

TORVALE_API int DownloadTaskAddFileWithDst(const char *user, const char *path,
                                           const char *destination, const DLFileSet *content,
                                           int kind) noexcept {
    return DownloadTaskAddFileEX(user, path, destination, content, kind, nullptr);
}

TORVALE_API int DownloadTaskAddDLFileSet(const char *user, const char *path,
                                         const DLFileSet *content, int kind) noexcept {
    if (!present(user) || !present(path)) {
        TV_LOG("%s:%d Bad parameters");
        return -1;
    }
    char share[kShareBytes];
    if (!share_of(user, share))
        return -1;
    return DownloadTaskAddFileWithDst(user, path, share, content, kind);
}

TORVALE_API int DownloadTaskAddFileHandler(const char *user, const char *path,
                                           const char *destination, const DLFileSet *content,
                                           int kind) noexcept {
    if (present(destination))
        return DownloadTaskAddFileWithDst(user, path, destination, content, kind);
    return DownloadTaskAddDLFileSet(user, path, content, kind);
}

TORVALE_API int DownloadTriggerProgress(void) noexcept {
    if (g_progress_request == nullptr)
        g_progress_request = static_cast<volatile int *>(
            NAVODownloadShmAttach(DOWNLOAD_SHM_PROGRESS_KEY, DOWNLOAD_SHM_PROGRESS_SIZE, 0));
    if (g_progress_request == nullptr) {
        // No segment yet: the daemon is not running, which is no fault of the caller.
        if (errno != ENOENT)
            TV_LOG("%s:%d Failed to attach shared memory. %m");
        return 0;
    }
    // The stamp goes first, so that a daemon that sees the flag also sees a fresh time.
    struct sysinfo info {};
    if (sysinfo(&info) == 0)
        g_progress_request[1] = static_cast<int>(info.uptime);
    int was = g_progress_request[0];
    g_progress_request[0] = 1;
    return was;
}

} // extern "C"
