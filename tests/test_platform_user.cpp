#include <cctype>
#include <thread>

#include "platform/navosdk.h"
#include "tests/test_platform_support.h"

namespace {

int admin_of(const HostUser &user) {
    return NAVOGroupIsAdminGroupMem(user.c_str());
}

} // namespace

TEST(PlatformUser, GetGivesTheNameServiceIdsAndRefusesUnknownNames) {
    HostUser user;
    NAVOUSER *raw = nullptr;
    ASSERT_EQ(NAVOUserGet(user.c_str(), &raw), 0);
    torvale::platform::User record(raw);
    EXPECT_EQ(record->name, user.name());
    EXPECT_EQ(record->uid, user.uid());
    EXPECT_EQ(record->gid, user.gid());

    // Names differing only in letter case reach the same account, by its own name.
    std::string upper = user.name();
    for (char &c : upper)
        c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    NAVOUSER *other = nullptr;
    ASSERT_EQ(NAVOUserGet(upper.c_str(), &other), 0);
    torvale::platform::User same(other);
    EXPECT_EQ(same->name, user.name());
    EXPECT_EQ(same->uid, user.uid());

    NLIBCErrSet(0);
    NAVOUSER *none = nullptr;
    EXPECT_EQ(NAVOUserGet("tv-no-such-user", &none), -1);
    EXPECT_EQ(none, nullptr);
    EXPECT_EQ(NLIBCErrGet(), kNavoErrNoSuchUser);
    EXPECT_EQ(NAVOUserGet("", &none), -1);
    EXPECT_EQ(NLIBCErrGet(), kNavoErrBadParam);
    EXPECT_EQ(NAVOUserGet(nullptr, &none), -1);
    EXPECT_EQ(NAVOUserGet(user.c_str(), nullptr), -1);
}

TEST(PlatformUser, AdministratorsAreMembersByPrimaryOrSupplementaryGroup) {
    HostGroup admins("administrators");
    HostUser plain;
    HostUser supplementary;
    HostUser primary(admins.name());
    admins.add(supplementary);
    EXPECT_EQ(admin_of(plain), 0);
    EXPECT_EQ(admin_of(supplementary), 1);
    EXPECT_EQ(admin_of(primary), 1);

    NLIBCErrSet(0);
    EXPECT_EQ(NAVOGroupIsAdminGroupMem("tv-no-such-user"), -1);
    EXPECT_EQ(NLIBCErrGet(), kNavoErrNoSuchUser);
    EXPECT_EQ(NAVOGroupIsAdminGroupMem(nullptr), -1);
}

TEST(PlatformUser, AHostWithoutTheAdministratorsGroupHasNoAdministrators) {
    if (run_shell("getent group administrators >/dev/null") == 0)
        GTEST_SKIP() << "the host has a group administrators of its own";
    HostUser user;
    EXPECT_EQ(admin_of(user), 0);
}

TEST(PlatformErrorCode, EachThreadKeepsItsOwnCode) {
    NLIBCErrSet(0x0B00);
    int seen = -1;
    std::thread other([&] {
        seen = NLIBCErrGet();
        NLIBCErrSet(0x4000);
    });
    other.join();
    EXPECT_EQ(seen, 0);
    EXPECT_EQ(NLIBCErrGet(), 0x0B00);
}
