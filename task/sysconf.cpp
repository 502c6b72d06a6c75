// The system download configuration: the one row of `sysconf`.
#include <cstring>
#include <string>

#include "db/access.h"
#include "platform/log.h"
#include "torvale/task.h"

namespace {

constexpr char kLogUnit[] = "sysconf";

constexpr char kSelect[] = "SELECT * FROM sysconf";
constexpr char kUpdate[] = "UPDATE sysconf set download_enabled=%d,download_when='%s', "
                           "download_order=%d,seeding_ratio=%d, seeding_interval=%d";
constexpr char kInsert[] = "INSERT INTO sysconf(download_enabled, download_when, "
                           "download_order,seeding_ratio,seeding_interval) "
                           "VALUES(%d, '%s', %d, %d, %d)";

constexpr size_t kWhenChars = sizeof(DownloadConf::download_when) - 1;

int conf_set(const DownloadConf &conf) {
    DBConn_tag *conn = DownloadDBConnect();
    if (conn == nullptr) {
        TV_LOG("%s (%d) Failed to connect to database");
        return -1;
    }
    torvale::db::Result existing;
    if (torvale::db::execute(conn, kSelect, existing) == -1) {
        TV_LOG("%s (%d) Failed to exec [%s] (%s)", kSelect, NAVODBErrorGet(conn));
        return -1;
    }
    // The daemon's record may carry a schedule without a terminator: never read past
    // the field.
    std::string when(conf.download_when, strnlen(conf.download_when, kWhenChars));
    std::string escaped = torvale::db::escape(when.c_str());
    std::string sql = torvale::db::format(NAVODBNumRows(existing.get()) > 0 ? kUpdate : kInsert, 1,
                                          escaped.c_str(), conf.download_order, conf.seeding_ratio,
                                          conf.seeding_interval);
    if (NAVODBExecute(conn, sql.c_str(), nullptr) == -1) {
        TV_LOG("%s (%d) Failed to exec [%s] (%s)", sql.c_str(), NAVODBErrorGet(conn));
        return -1;
    }
    DownloadDBClose(conn);
    return 0;
}

int conf_get(DownloadConf &conf) {
    DBConn_tag *conn = DownloadDBConnect();
    if (conn == nullptr) {
        TV_LOG("%s (%d) Failed to connect to database");
        return -1;
    }
    torvale::db::Result result;
    if (torvale::db::select_limit(conn, kSelect, 1, 0, result) == -1) {
        TV_LOG("%s (%d) Failed to exec [%s] (%s)", kSelect, NAVODBErrorGet(conn));
        return -1;
    }
    if (NAVODBNumRows(result.get()) <= 0) {
        TV_LOG("%s (%d) There is no system config in the database...why~~~");
        return -1;
    }
    unsigned row = 0;
    if (NAVODBFetchRow(result.get(), &row) == -1) {
        TV_LOG("%s (%d) Failed to fetch row...why~~~");
        return -1;
    }
    using torvale::db::field_int;
    conf.enabled = 1;
    torvale::db::copy_text(conf.download_when, sizeof conf.download_when,
                           torvale::db::field_text(result.get(), row, "download_when"));
    conf.download_order = static_cast<int>(field_int(result.get(), row, "download_order"));
    conf.seeding_ratio = static_cast<int>(field_int(result.get(), row, "seeding_ratio"));
    conf.seeding_interval = static_cast<int>(field_int(result.get(), row, "seeding_interval"));
    DownloadDBClose(conn);
    return 0;
}

} // namespace

extern "C" {

TORVALE_API int DownloadConfSet(const DownloadConf *conf) noexcept {
    if (conf == nullptr) {
        TV_LOG("%s (%d) Bad parameters.");
        return -1;
    }
    try {
        return conf_set(*conf);
    } catch (...) {
        return -1;
    }
}

TORVALE_API int DownloadConfGet(DownloadConf *conf) noexcept {
    if (conf == nullptr) {
        TV_LOG("%s (%d) Bad parameter.");
        return -1;
    }
    return conf_get(*conf);
}

} // extern "C"
