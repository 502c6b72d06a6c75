// The fixed paths of the host layout, in one place.
//
// When TORVALE_ROOT is set, each of these is taken under it ("/tmp/dl_rss" becomes
// "$TORVALE_ROOT/tmp/dl_rss"), so that tests and demonstrations run in a scratch
// directory. System programs in /bin ("/bin/sed", "/bin/chown", "/bin/rm") are not
// relocated. The root is read with secure_getenv at each use, so a set-id caller
// never takes it from its environment.
#pragma once

#include <string>

namespace torvale::paths {

// The relocation root: "" when TORVALE_ROOT is unset or empty.
std::string root();

// Returns `absolute` taken under the root.
std::string under_root(const char *absolute);

// The host layout.
inline constexpr char kPackageDir[] = "/var/packages/Torvale";
inline constexpr char kSettingsFile[] = "/var/packages/Torvale/etc/settings.conf";
inline constexpr char kWget[] = "/var/packages/Torvale/target/bin/wget";
inline constexpr char kMailer[] = "/var/packages/Torvale/target/bin/navodlmail";
inline constexpr char kNotifier[] = "/usr/navo/bin/navovosnotify";
inline constexpr char kRssTempDir[] = "/tmp/dl_rss";
inline constexpr char kDownloadServiceLink[] = "/var/services/download";
inline constexpr char kProcMounts[] = "/proc/mounts";
inline constexpr char kSharesRegistry[] = "/etc/torvale/shares";
inline constexpr char kIndexSpool[] = "/var/spool/torvale/index";
inline constexpr char kFileIndexSpool[] = "/var/spool/torvale/fileindex";

} // namespace torvale::paths
