// Per-user settings: the default destination share, the watch folder and the disabled
// flag, one `user_setting` row per user created by the first write.
#include <cstring>
#include <initializer_list>
#include <new>
#include <string>

#include "db/access.h"
#include "platform/log.h"
#include "platform/navosdk.h"
#include "torvale/user.h"

namespace {

using torvale::db::present;

constexpr char kLogUnit[] = "user";

constexpr char kSelectRow[] =
    "SELECT share_folder FROM user_setting WHERE lower(username)=lower('%s')";
constexpr char kUpdateShare[] =
    "UPDATE user_setting set share_folder='%s' WHERE lower(username)=lower('%s')";
constexpr char kInsertShare[] = "INSERT INTO user_setting(username, uid, share_folder, "
                                "user_disabled) VALUES('%s', %d, '%s', 'f')";
constexpr char kSelectShare[] = "SELECT share_folder, user_disabled FROM user_setting WHERE "
                                "lower(username)=lower('%s')";
constexpr char kSelectWatch[] = "SELECT enable_watchffolder, delete_watchtorrent, watchfolder "
                                "FROM user_setting WHERE lower(username)=lower('%s')";
constexpr char kInsertWatch[] =
    "INSERT INTO user_setting(username, uid, share_folder, user_disabled, "
    "enable_watchffolder, delete_watchtorrent, watchfolder) VALUES('%s', %d, '', 'f', '%s', "
    "'%s', '%s')";
constexpr char kUpdateWatch[] = "UPDATE user_setting set enable_watchffolder='%s', "
                                "delete_watchtorrent='%s', watchfolder='%s' WHERE "
                                "lower(username)=lower('%s')";
constexpr char kUpdateWatchOff[] =
    "UPDATE user_setting set enable_watchffolder='%s' WHERE lower(username)=lower('%s')";
constexpr char kSelectWatchers[] =
    "SELECT watchfolder FROM user_setting WHERE enable_watchffolder='t' and user_disabled='f' "
    "and lower(username)!=lower('%s')";
constexpr char kDisable[] = "UPDATE user_setting SET user_disabled='t', "
                            "enable_watchffolder='f' WHERE lower(username)=lower('%s')";
constexpr char kEnable[] =
    "UPDATE user_setting SET user_disabled='f' WHERE lower(username)=lower('%s')";

constexpr size_t kFolderBytes = 4096;

bool is_true(const char *value) {
    return value != nullptr && value[0] == 't';
}

const char *flag(int on) {
    return on != 0 ? "t" : "f";
}

// What a statement carrying these texts needs: each escaped, plus room for the rest.
int statement_bytes(std::initializer_list<const char *> texts) {
    size_t n = 512;
    for (const char *t : texts)
        n += t != nullptr ? 2 * std::strlen(t) : 0;
    return static_cast<int>(n);
}

// Runs `body`; running out of memory is reported like a failed buffer allocation.
template <typename Body> int guarded(int bytes, Body body) noexcept {
    try {
        return body();
    } catch (const std::bad_alloc &) {
        TV_LOG("%s (%d) Failed to malloc(%d)", bytes);
        return -1;
    }
}

DBConn_tag *connect() {
    DBConn_tag *conn = DownloadDBConnect();
    if (conn == nullptr)
        TV_LOG("%s (%d) Failed to connect to database");
    return conn;
}

bool query(DBConn_tag *conn, const std::string &sql, torvale::db::Result &result) {
    if (torvale::db::execute(conn, sql.c_str(), result) == -1) {
        TV_LOG("%s (%d) Failed to exec [%s] (%s)", sql.c_str(), NAVODBErrorGet(conn));
        return false;
    }
    return true;
}

// The uid of a user the platform knows; a user it does not know never reaches the table.
bool platform_uid(const char *user, int &uid) {
    NAVOUSER *raw = nullptr;
    if (NAVOUserGet(user, &raw) == -1) {
        TV_LOG("%s:%d Failed to get user [%s][0x%04X]", user, NLIBCErrGet());
        return false;
    }
    torvale::platform::User record(raw);
    uid = static_cast<int>(record->uid);
    return true;
}

// Updates the user's row when there is one, else inserts it.
int upsert(const std::string &user, const std::string &insert, const std::string &update) {
    DBConn_tag *conn = connect();
    if (conn == nullptr)
        return -1;
    torvale::db::Result existing;
    if (!query(conn, torvale::db::format(kSelectRow, user.c_str()), existing))
        return -1;
    const std::string &sql = NAVODBNumRows(existing.get()) > 0 ? update : insert;
    torvale::db::Result written;
    if (!query(conn, sql, written))
        return -1;
    DownloadDBClose(conn);
    return 0;
}

enum class Lookup { Failed, Absent, Unreadable, Found };

// Runs a per-user select and moves to its row.
Lookup lookup(const char *tmpl, const char *user, torvale::db::Result &result, unsigned &row) {
    DBConn_tag *conn = connect();
    if (conn == nullptr)
        return Lookup::Failed;
    std::string sql = torvale::db::format(tmpl, torvale::db::escape(user).c_str());
    if (!query(conn, sql, result))
        return Lookup::Failed;
    DownloadDBClose(conn);
    if (NAVODBNumRows(result.get()) <= 0)
        return Lookup::Absent;
    return NAVODBFetchRow(result.get(), &row) == -1 ? Lookup::Unreadable : Lookup::Found;
}

int share_set(const char *user, const char *share) {
    int uid = 0;
    std::string name = torvale::db::escape(user);
    if (!platform_uid(user, uid))
        return -1;
    std::string folder = torvale::db::escape(share);
    return upsert(name, torvale::db::format(kInsertShare, name.c_str(), uid, folder.c_str()),
                  torvale::db::format(kUpdateShare, folder.c_str(), name.c_str()));
}

int share_get(const char *user, char *share, int size) {
    torvale::db::Result result;
    unsigned row = 0;
    Lookup found = lookup(kSelectShare, user, result, row);
    if (found == Lookup::Failed)
        return -1;
    if (found == Lookup::Unreadable)
        TV_LOG("%s (%d) Failed to get share_folder setting for user [%s]", user);
    const char *folder =
        found == Lookup::Found ? NAVODBFetchField(result.get(), row, "share_folder") : nullptr;
    if (folder == nullptr) {
        std::memset(share, 0, static_cast<size_t>(size));
        return 0;
    }
    torvale::db::copy_text(share, static_cast<size_t>(size), folder);
    return is_true(NAVODBFetchField(result.get(), row, "user_disabled")) ? 2 : 1;
}

int watch_get(const char *user, int *enabled, int *delete_torrent, char *folder, int size) {
    torvale::db::Result result;
    unsigned row = 0;
    Lookup found = lookup(kSelectWatch, user, result, row);
    if (found == Lookup::Failed)
        return -1;
    if (found == Lookup::Unreadable)
        TV_LOG("%s (%d) Failed to get watchfolder setting for user [%s]", user);
    const char *stored =
        found == Lookup::Found ? NAVODBFetchField(result.get(), row, "watchfolder") : nullptr;
    if (stored == nullptr) {
        std::memset(folder, 0, static_cast<size_t>(size));
        return 0;
    }
    torvale::db::copy_text(folder, static_cast<size_t>(size), stored);
    // Both flags are written either way, so a caller's leftover value never reads as set.
    *enabled = is_true(NAVODBFetchField(result.get(), row, "enable_watchffolder")) ? 1 : 0;
    *delete_torrent = is_true(NAVODBFetchField(result.get(), row, "delete_watchtorrent")) ? 1 : 0;
    return 1;
}

int watch_set(const char *user, int enable, int delete_torrent, const char *folder) {
    int uid = 0;
    std::string name = torvale::db::escape(user);
    if (!platform_uid(user, uid))
        return -1;
    std::string watched = enable != 0 ? torvale::db::escape(folder) : std::string();
    std::string insert = torvale::db::format(kInsertWatch, name.c_str(), uid, flag(enable),
                                             flag(delete_torrent), watched.c_str());
    // Switching off keeps the stored folder and delete flag for when it is switched on.
    std::string update = enable != 0
                             ? torvale::db::format(kUpdateWatch, flag(1), flag(delete_torrent),
                                                   watched.c_str(), name.c_str())
                             : torvale::db::format(kUpdateWatchOff, flag(0), name.c_str());
    return upsert(name, insert, update);
}

int check_watchfolder(const char *user, const char *folder) {
    DBConn_tag *conn = connect();
    if (conn == nullptr)
        return -1;
    torvale::db::Result result;
    if (!query(conn, torvale::db::format(kSelectWatchers, torvale::db::escape(user).c_str()),
               result))
        return -1;
    DownloadDBClose(conn);
    char watched[kFolderBytes];
    unsigned row = 0;
    while (NAVODBFetchRow(result.get(), &row) != -1) {
        torvale::db::copy_text(watched, sizeof watched,
                               torvale::db::field_text(result.get(), row, "watchfolder"));
        if (std::strcmp(watched, folder) == 0)
            return 0;
    }
    return 1;
}

int disable(const char *user, int disabled) {
    std::string sql =
        torvale::db::format(disabled != 0 ? kDisable : kEnable, torvale::db::escape(user).c_str());
    if (DownloadDBExec(sql.c_str()) < 0) {
        TV_LOG("%s (%d) Failed to exec [%s]", sql.c_str());
        return -1;
    }
    return 0;
}

} // namespace

extern "C" {

TORVALE_API int DownloadUserShareSet(const char *user, const char *share) noexcept {
    if (!present(user) || !present(share)) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    return guarded(statement_bytes({user, share}), [&] { return share_set(user, share); });
}

TORVALE_API int DownloadUserShareGet(const char *user, char *share, int size) noexcept {
    if (!present(user) || share == nullptr || size <= 0) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    return guarded(statement_bytes({user}), [&] { return share_get(user, share, size); });
}

TORVALE_API int DownloadUserWatchInfoGet(const char *user, int *enabled, int *delete_torrent,
                                         char *folder, int size) noexcept {
    if (!present(user) || enabled == nullptr || delete_torrent == nullptr || folder == nullptr ||
        size <= 0) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    return guarded(statement_bytes({user}),
                   [&] { return watch_get(user, enabled, delete_torrent, folder, size); });
}

TORVALE_API int DownloadUserWatchInfoSet(const char *user, int enable, int delete_torrent,
                                         const char *folder) noexcept {
    if (!present(user) || (enable != 0 && !present(folder))) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    return guarded(statement_bytes({user, enable != 0 ? folder : nullptr}),
                   [&] { return watch_set(user, enable, delete_torrent, folder); });
}

TORVALE_API int DownloadCheckWatchfolder(const char *user, const char *folder) noexcept {
    if (!present(user) || folder == nullptr) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    return guarded(statement_bytes({user}), [&] { return check_watchfolder(user, folder); });
}

TORVALE_API int DownloadUserDisable(const char *user, int disabled) noexcept {
    if (!present(user)) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    return guarded(statement_bytes({user}), [&] { return disable(user, disabled); });
}

} // extern "C"
