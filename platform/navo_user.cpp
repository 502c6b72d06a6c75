// Users and groups, answered by the host's name service (passwd and group databases).
#include <cerrno>
#include <grp.h>
#include <new>
#include <pwd.h>
#include <strings.h>
#include <vector>

#include "platform/navosdk.h"

namespace {

constexpr char kAdminGroup[] = "administrators";

// getpwnam_r with a buffer that grows until the entry fits. 0 found, 1 absent, -1 error.
int lookup_passwd(const char *name, passwd &entry, std::vector<char> &buf) {
    buf.resize(1024);
    for (;;) {
        passwd *found = nullptr;
        int rc = getpwnam_r(name, &entry, buf.data(), buf.size(), &found);
        if (rc == ERANGE && buf.size() < (1u << 20)) {
            buf.resize(buf.size() * 2);
            continue;
        }
        if (rc != 0)
            return -1;
        return found != nullptr ? 0 : 1;
    }
}

// The host's account names are case-sensitive, the system's are not: without an exact
// match, the first account whose name differs only in ASCII letter case is taken.
int lookup_passwd_any_case(const char *name, passwd &entry, std::vector<char> &buf) {
    int rc = lookup_passwd(name, entry, buf);
    if (rc != 1)
        return rc;
    setpwent();
    for (;;) {
        passwd *found = nullptr;
        int err = getpwent_r(&entry, buf.data(), buf.size(), &found);
        if (err == ERANGE && buf.size() < (1u << 20)) {
            // The entry is skipped by the failed call's position; start over, larger.
            buf.resize(buf.size() * 2);
            setpwent();
            continue;
        }
        if (err != 0 || found == nullptr)
            break;
        if (strcasecmp(found->pw_name, name) == 0) {
            endpwent();
            return 0;
        }
    }
    endpwent();
    return 1;
}

// The gid of `name`, or false when the host has no such group (or cannot say).
bool lookup_group_gid(const char *name, gid_t &gid) {
    std::vector<char> buf(1024);
    for (;;) {
        group entry;
        group *found = nullptr;
        int rc = getgrnam_r(name, &entry, buf.data(), buf.size(), &found);
        if (rc == ERANGE && buf.size() < (1u << 20)) {
            buf.resize(buf.size() * 2);
            continue;
        }
        if (rc != 0 || found == nullptr)
            return false;
        gid = found->gr_gid;
        return true;
    }
}

// Fills `entry`, leaving the reason for NLIBCErrGet on failure.
bool user_entry(const char *name, passwd &entry, std::vector<char> &buf) {
    if (name == nullptr || *name == '\0') {
        NLIBCErrSet(kNavoErrBadParam);
        return false;
    }
    int rc = lookup_passwd_any_case(name, entry, buf);
    if (rc != 0) {
        NLIBCErrSet(rc == 1 ? kNavoErrNoSuchUser : kNavoErrSystem);
        return false;
    }
    return true;
}

bool in_group_list(const char *user, gid_t primary, gid_t wanted) {
    std::vector<gid_t> groups(32);
    for (;;) {
        int n = static_cast<int>(groups.size());
        if (getgrouplist(user, primary, groups.data(), &n) >= 0) {
            groups.resize(static_cast<size_t>(n));
            break;
        }
        // n now holds the number needed; a list that keeps growing is a broken source.
        if (groups.size() >= 65536)
            return false;
        groups.resize(static_cast<size_t>(n) > groups.size() ? static_cast<size_t>(n)
                                                             : groups.size() * 2);
    }
    for (gid_t g : groups)
        if (g == wanted)
            return true;
    return false;
}

} // namespace

int NAVOUserGet(const char *name, NAVOUSER **user) noexcept {
    if (user == nullptr) {
        NLIBCErrSet(kNavoErrBadParam);
        return -1;
    }
    try {
        passwd entry;
        std::vector<char> buf;
        if (!user_entry(name, entry, buf))
            return -1;
        auto *record = new NAVOUSER;
        record->name = entry.pw_name;
        record->uid = entry.pw_uid;
        record->gid = entry.pw_gid;
        *user = record;
        return 0;
    } catch (const std::bad_alloc &) {
        NLIBCErrSet(kNavoErrNoMemory);
        return -1;
    }
}

void NAVOUserFree(NAVOUSER *user) noexcept {
    delete user;
}

int NAVOGroupIsAdminGroupMem(const char *user) noexcept {
    try {
        passwd entry;
        std::vector<char> buf;
        if (!user_entry(user, entry, buf))
            return -1;
        gid_t admin = 0;
        // A host without the group has no administrators to find.
        if (!lookup_group_gid(kAdminGroup, admin))
            return 0;
        if (entry.pw_gid == admin)
            return 1;
        return in_group_list(entry.pw_name, entry.pw_gid, admin) ? 1 : 0;
    } catch (const std::bad_alloc &) {
        NLIBCErrSet(kNavoErrNoMemory);
        return -1;
    }
}
