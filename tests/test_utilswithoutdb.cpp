#include <fstream>
#include <string>
#include <sys/stat.h>

#include "tests/fixture.h"
#include "torvale/utils.h"

namespace {

class FreeName : public DbTest {
  protected:
    void SetUp() override {
        DbTest::SetUp();
        dir_ = root() + "/dl";
        ASSERT_EQ(mkdir(dir_.c_str(), 0755), 0);
    }
    // Makes a file of that name, then asks for a free one.
    std::string taken(const std::string &name) {
        std::ofstream(dir_ + "/" + name) << "x";
        return free_name(name);
    }
    // The free name found for `name`, relative to the directory.
    std::string free_name(const std::string &name) {
        char out[4096] = "untouched";
        EXPECT_EQ(NAVODLValidateFilename(out, sizeof out, dir_.c_str(), name.c_str()), 0);
        std::string path = out;
        EXPECT_EQ(path.rfind(dir_ + "/", 0), 0u) << path;
        return path.substr(dir_.size() + 1);
    }
    std::string dir_;
};

using LinkKind = DbTest;

} // namespace

TEST_F(LinkKind, PrefixesIgnoreLetterCaseAndNothingElseCounts) {
    EXPECT_EQ(DownloadUtilsIsMagnetLink("MAGNET:?XT=urn:btih:abc"), 1);
    EXPECT_EQ(DownloadUtilsIsMagnetLink("magnet:?"), 1);
    EXPECT_EQ(DownloadUtilsIsFTPEncrptionLink("FtPs://host/file"), 1);
    EXPECT_EQ(DownloadUtilsIsFTPEncrptionLink("SFTP://HOST"), 2);
    const char *neither[] = {"magnet:xt=urn", " magnet:?xt", "ftp://host/file", "sftp", nullptr};
    for (const char *link : neither) {
        EXPECT_EQ(DownloadUtilsIsMagnetLink(link), 0) << link;
        EXPECT_EQ(DownloadUtilsIsFTPEncrptionLink(link), 0) << link;
    }
    EXPECT_EQ(logs(), std::vector<std::string>(2, "utilswithoutdb:# Bad parameter"));
}

TEST_F(FreeName, TakenNamesAreNumberedBeforeTheLastExtension) {
    EXPECT_EQ(free_name("it's \"ü\" 映画.mkv"), "it's \"ü\" 映画.mkv");
    EXPECT_EQ(taken("movie.avi"), "movie1.avi");
    EXPECT_EQ(taken("movie1.avi"), "movie11.avi");
    EXPECT_EQ(free_name("movie.avi"), "movie2.avi");
    EXPECT_EQ(taken("a.tar.gz"), "a.tar1.gz");
    EXPECT_EQ(taken("README"), "README1");
    EXPECT_EQ(taken(".hidden"), "1.hidden");
    // Anything of that name counts, directories too.
    ASSERT_EQ(mkdir((dir_ + "/folder").c_str(), 0755), 0);
    EXPECT_EQ(free_name("folder"), "folder1");
    EXPECT_EQ(free_name(std::string(1500, 'n')), std::string(1023, 'n'));
    EXPECT_TRUE(logs().empty());
}

TEST_F(FreeName, MissingArgumentsLeaveTheBufferAloneAndCandidatesThatDoNotFitAreRefused) {
    char out[256] = "untouched";
    EXPECT_EQ(NAVODLValidateFilename(out, sizeof out, nullptr, "a"), -1);
    EXPECT_EQ(NAVODLValidateFilename(out, sizeof out, dir_.c_str(), nullptr), -1);
    EXPECT_EQ(NAVODLValidateFilename(out, 0, dir_.c_str(), "a"), -1);
    EXPECT_STREQ(out, "untouched");
    EXPECT_EQ(logs(), std::vector<std::string>(3, "utilswithoutdb:# Bad parameter"));
    // Cut to "<root>/dl" every candidate would name the existing directory itself.
    int size = static_cast<int>(dir_.size() + 1);
    EXPECT_EQ(NAVODLValidateFilename(out, size, dir_.c_str(), "movie.avi"), -1);
    EXPECT_STREQ(out, "");
    // The numbered candidate is one byte longer than the plain one.
    EXPECT_EQ(taken("m.avi"), "m1.avi");
    size = static_cast<int>(dir_.size() + std::string("/m.avi").size() + 1);
    EXPECT_EQ(NAVODLValidateFilename(out, size, dir_.c_str(), "m.avi"), -1);
    EXPECT_EQ(logs().back(), "utilswithoutdb:# Buffer size too small, string length [" +
                                 std::to_string(size + 1) + "], buffer size [" +
                                 std::to_string(size) + "]");
}
