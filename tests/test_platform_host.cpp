#include <fstream>
#include <string>
#include <sys/vfs.h>
#include <vector>

#include "platform/navosdk.h"
#include "tests/test_platform_support.h"

namespace {

class Shares : public ScratchDir {
  protected:
    std::string share(const char *name) {
        NAVOSHARE *raw = nullptr;
        if (NAVOShareGet(name, &raw) != 0)
            return "<none>";
        torvale::platform::Share s(raw);
        return s->path + " " + std::to_string(s->status);
    }
    std::vector<std::string> mounted_at(const char *path) {
        torvale::platform::SzList list(NLIBCSzListAlloc(8));
        int count = NAVOShareEnumByMntPath(list.get(), path);
        std::vector<std::string> out;
        for (int i = 0; i < NLIBCSzListCount(list.get()); ++i)
            out.emplace_back(NLIBCSzListGet(list.get(), i));
        EXPECT_EQ(count, static_cast<int>(out.size()));
        return out;
    }
};

using MediaIndex = ScratchDir;

} // namespace

TEST_F(Shares, RegistryLinesGivePathAndFlagsAndMalformedLinesAreSkipped) {
    // A host without a registry has no shares.
    EXPECT_TRUE(mounted_at("/volume1/secret").empty());
    EXPECT_EQ(share("secret"), "<none>");
    ASSERT_EQ(run_shell("mkdir -p '" + dir_ + "/etc/torvale'"), 0);
    std::ofstream(dir_ + "/etc/torvale/shares") << "# name\tpath\tflags\n\n"
                                                   "secret\t/volume1/secret\t0x4\n"
                                                   "locked\t/volume2/locked\t2\r\n"
                                                   "vidéo 2\t/volume1/vidéo 2\t010\n"
                                                   "broken\t/volume1/broken\n"
                                                   "badflags\t/volume1/b\tlots\n"
                                                   "usbshare1\t/volumeUSB1/usbshare1\t0\n"
                                                   "photos\t/volumeUSB1/usbshare1\t0\n"
                                                   "sub\t/volumeUSB1/usbshare1/sub\t0\n";
    EXPECT_EQ(share("secret"), "/volume1/secret 4");
    EXPECT_EQ(share("locked"), "/volume2/locked 2");
    EXPECT_EQ(share("vidéo 2"), "/volume1/vidéo 2 8");
    EXPECT_EQ(share("broken"), "<none>");
    EXPECT_EQ(NLIBCErrGet(), kNavoErrNoSuchShare);
    EXPECT_EQ(share("badflags"), "<none>");
    EXPECT_EQ(share("Secret"), "<none>");
    EXPECT_EQ(mounted_at("/volumeUSB1/usbshare1"),
              (std::vector<std::string>{"usbshare1", "photos"}));
}

TEST(PlatformFsType, OwnershipFreeFileSystemsAreOneAndFour) {
    // msdos and vfat, exfat, ntfs and ntfs3, fuseblk, ext4, tmpfs.
    const std::pair<unsigned long, int> codes[] = {{0x4d44, 1},     {0x2011BAB0, 1},
                                                   {0x5346544e, 4}, {0x65735546, 4},
                                                   {0xEF53, 2},     {0x01021994, 0}};
    for (const auto &[magic, code] : codes)
        EXPECT_EQ(torvale::platform::fs_type_code(magic), code) << std::hex << magic;
    struct statfs st;
    ASSERT_EQ(statfs("/tmp", &st), 0);
    EXPECT_EQ(NAVOGetFSType("/tmp", 0), torvale::platform::fs_type_code(
                                            static_cast<unsigned long>(st.f_type) & 0xffffffffUL));
    EXPECT_EQ(NAVOGetFSType("/no/such/path", 0), -1);
}

TEST_F(MediaIndex, RequestsAreQueuedAsKindAndPathLines) {
    EXPECT_EQ(NLIBNavoIndexAdd("/volume1/video/film.mkv", 1), 0);
    EXPECT_EQ(NLIBNavoIndexAdd("/volume1/video/it's 映画", 3), 0);
    EXPECT_EQ(NLIBNavoFileIndexAdd("/volume1/video/film.mkv", 0, 1), 0);
    // A line break would forge a second request.
    EXPECT_EQ(NLIBNavoIndexAdd("/v/a\n1 /etc/shadow", 1), -1);
    EXPECT_EQ(NLIBNavoIndexAdd("/v/a", 2), -1);
    EXPECT_EQ(read_all(dir_ + "/var/spool/torvale/index"),
              "1 /volume1/video/film.mkv\n3 /volume1/video/it's 映画\n");
    EXPECT_EQ(read_all(dir_ + "/var/spool/torvale/fileindex"), "1 /volume1/video/film.mkv\n");
}
