#include <thread>

#include "platform/navosdk.h"
#include "tests/test_platform_support.h"

TEST(PlatformUser, GetGivesNameServiceIdsWhateverTheCaseAndAdminsCountByAnyGroup) {
    HostGroup admins("administrators");
    HostUser plain;
    HostUser supplementary;
    HostUser primary("administrators");
    admins.add(supplementary);
    for (const std::string &name : {plain.name(), upper(plain.name())}) {
        NAVOUSER *raw = nullptr;
        ASSERT_EQ(NAVOUserGet(name.c_str(), &raw), 0) << name;
        torvale::platform::User record(raw);
        EXPECT_EQ(record->name, plain.name());
        EXPECT_EQ(record->uid, plain.entry().pw_uid);
        EXPECT_EQ(record->gid, plain.entry().pw_gid);
    }
    EXPECT_EQ(NAVOGroupIsAdminGroupMem(plain.c_str()), 0);
    EXPECT_EQ(NAVOGroupIsAdminGroupMem(supplementary.c_str()), 1);
    EXPECT_EQ(NAVOGroupIsAdminGroupMem(upper(primary.name()).c_str()), 1);

    NAVOUSER *none = nullptr;
    EXPECT_EQ(NAVOUserGet("tv-no-such-user", &none), -1);
    EXPECT_EQ(none, nullptr);
    EXPECT_EQ(NAVOGroupIsAdminGroupMem("tv-no-such-user"), -1);
    EXPECT_EQ(NLIBCErrGet(), kNavoErrNoSuchUser);
    EXPECT_EQ(NAVOUserGet("", &none), -1);
    EXPECT_EQ(NLIBCErrGet(), kNavoErrBadParam);
}

TEST(PlatformErrorCode, EachThreadKeepsItsOwnCode) {
    NLIBCErrSet(0x0B00);
    int seen = -1;
    std::thread([&] {
        seen = NLIBCErrGet();
        NLIBCErrSet(0x4000);
    }).join();
    EXPECT_EQ(seen, 0);
    EXPECT_EQ(NLIBCErrGet(), 0x0B00);
}
