#include <filesystem>
#include <string>
#include <sys/stat.h>
#include <sys/wait.h>
#include <vector>

#include "platform/navocore.h"
#include "tests/test_platform_support.h"

namespace {

class KeyValueFile : public ScratchDir {
  protected:
    std::string file() const { return dir_ + "/settings.conf"; }
    std::string get(const std::string &key) {
        char buf[256];
        int rc = NLIBCFileGetKeyValue(file().c_str(), key.c_str(), buf, sizeof buf, 0);
        return rc > 0 ? buf : rc == 0 ? "<absent>" : "<failed>";
    }
    int set(const std::string &key, const std::string &value, const char *format = "%s=\"%s\"\n") {
        return NLIBCFileSetKeyValue(file().c_str(), key.c_str(), value.c_str(), format);
    }
    // How many entries the directory holds: no temporary file may stay behind.
    long entries() const {
        using std::filesystem::directory_iterator;
        return std::distance(directory_iterator(dir_), directory_iterator());
    }
};

using PlatformExec = ScratchDir;

// Runs `step(0..times-1)` in a child process, which exits 1 at the first failing step.
template <typename Step> pid_t spawn(int times, Step step) {
    pid_t pid = fork();
    if (pid == 0) {
        for (int i = 0; i < times; ++i)
            if (!step(i))
                _exit(1);
        _exit(0);
    }
    return pid;
}

} // namespace

TEST(PlatformStrings, TokensAreTheNonEmptyPiecesInOrder) {
    torvale::platform::SzList list(NLIBCSzListAlloc(2));
    EXPECT_EQ(NLIBCStrTok("/volume1//vidéo/film/", "/", list.get()), 3);
    EXPECT_EQ(NLIBCStrTok("a,b;c", ",;", list.get()), 3);
    EXPECT_EQ(NLIBCStrTok("///", "/", list.get()), 0);
    std::vector<std::string> got;
    for (int i = 0; i < NLIBCSzListCount(list.get()); ++i)
        got.emplace_back(NLIBCSzListGet(list.get(), i));
    EXPECT_EQ(got, (std::vector<std::string>{"volume1", "vidéo", "film", "a", "b", "c"}));
    EXPECT_EQ(NLIBCSzListGet(list.get(), 6), nullptr);
    EXPECT_EQ(NLIBCStrTok(nullptr, "/", list.get()), -1);
}

TEST_F(KeyValueFile, ValuesRoundTripAndAbsentKeysOrFilesReadAsAbsent) {
    EXPECT_EQ(get("k"), "<absent>");
    ASSERT_EQ(set("k", "1"), 0);
    ASSERT_EQ(set("name", "it's \"映画\" = x"), 0);
    EXPECT_EQ(read_all(file()), "k=\"1\"\nname=\"it's \"映画\" = x\"\n");
    EXPECT_EQ(get("name"), "it's \"映画\" = x");
    EXPECT_EQ(NLIBCFileCheckKeyValue(file().c_str(), "k", "1", 0), 1);
    ASSERT_EQ(set("k", "10"), 0);
    EXPECT_EQ(NLIBCFileCheckKeyValue(file().c_str(), "k", "1", 0), 0);
    char small[4];
    EXPECT_EQ(NLIBCFileGetKeyValue(file().c_str(), "name", small, sizeof small, 0), 1);
    EXPECT_STREQ(small, "it'");
}

TEST_F(KeyValueFile, WritesReplaceTheKeysFirstLineKeepOtherLinesAndModeAndRefuseInjection) {
    const std::string old = "# settings\nalpha=\"1\"\nbeta=plain\nalpha=\"stale\"\nalphabet=\"x\"\n"
                            "last=\"1\"";
    std::ofstream(file()) << old;
    ASSERT_EQ(chmod(file().c_str(), 0600), 0);
    EXPECT_EQ(set("alpha", "1\rb=\"2\""), -1);
    EXPECT_EQ(set("a=b", "1"), -1);
    for (const char *format : {"%s=%d\n", "%s\n", "%s=%s\n%s", "%s\n=%s\n"})
        EXPECT_EQ(set("alpha", "2", format), -1) << format;
    EXPECT_EQ(NLIBCErrGet(), kNavoErrBadParam);
    EXPECT_EQ(read_all(file()), old);

    ASSERT_EQ(set("alpha", "2"), 0);
    ASSERT_EQ(set("gamma", "100", "%s=%s%%\n"), 0);
    EXPECT_EQ(read_all(file()),
              "# settings\nalpha=\"2\"\nbeta=plain\nalphabet=\"x\"\nlast=\"1\"\ngamma=100%\n");
    EXPECT_EQ(get("beta"), "plain");
    struct stat st;
    ASSERT_EQ(stat(file().c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0600u);
    EXPECT_EQ(entries(), 1);
}

TEST_F(KeyValueFile, ConcurrentWritersKeepEveryKeyAndReadersSeeWholeFiles) {
    std::ofstream(file()) << "keep=\"yes\"\npad=\"" + std::string(20000, 'p') + "\"\n";
    auto key = [](int w, int i) { return "w" + std::to_string(w) + "_" + std::to_string(i); };
    std::vector<pid_t> children;
    for (int w = 0; w < 3; ++w)
        children.push_back(spawn(60, [&, w](int i) { return set(key(w, i), "1") == 0; }));
    children.push_back(spawn(2000, [&](int) { return get("keep") == "yes"; }));
    for (pid_t pid : children) {
        int status = -1;
        EXPECT_EQ(waitpid(pid, &status, 0), pid);
        EXPECT_EQ(status, 0);
    }
    for (int w = 0; w < 3; ++w)
        for (int i = 0; i < 60; ++i)
            EXPECT_EQ(get(key(w, i)), "1");
    EXPECT_EQ(entries(), 1);
}

TEST_F(PlatformExec, ProgramsGetTheirArgumentsAndNullStreamsAndReportTheirExit) {
    std::string out = dir_ + "/out";
    // Standard input is /dev/null: cat ends at once instead of waiting.
    ASSERT_EQ(NLIBCExec("/bin/sh", "-c", "cat; printf '%s|%s' \"$0\" \"$1\" > \"$1\"", "zero",
                        out.c_str(), nullptr),
              0);
    EXPECT_EQ(read_all(out), "zero|" + out);
    EXPECT_EQ(NLIBCExec("/bin/sh", "-c", "exit 3", nullptr), 3);
    EXPECT_EQ(NLIBCExec("/bin/sh", "-c", "kill -9 $$", nullptr), -1);
    EXPECT_EQ(NLIBCExec("/no/such/program", nullptr), -1);
    EXPECT_EQ(NLIBCErrGet(), kNavoErrChildFailed);
    // A fifth argument means the list was not ended.
    EXPECT_EQ(NLIBCExec("/bin/true", "1", "2", "3", "4", "5", nullptr), -1);
    EXPECT_EQ(NLIBCExec("/bin/true", "1", "2", "3", "4", nullptr), 0);

    // Without waiting the call returns while the program still runs; the caller reaps it.
    std::string mark = dir_ + "/mark";
    const char *slow[] = {"/bin/sh", "-c", "sleep 0.3; touch \"$0\"", mark.c_str(), nullptr};
    ASSERT_EQ(NLIBCExecv("/bin/sh", slow, 0), 0);
    struct stat st;
    EXPECT_NE(stat(mark.c_str(), &st), 0);
    int status = 0;
    ASSERT_GT(wait(&status), 0);
    EXPECT_EQ(stat(mark.c_str(), &st), 0);
}
