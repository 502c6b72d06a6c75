#include <dirent.h>
#include <fstream>
#include <sstream>
#include <string>
#include <sys/stat.h>
#include <sys/wait.h>
#include <vector>

#include "platform/navocore.h"
#include "tests/test_platform_support.h"

namespace {

constexpr char kLineFormat[] = "%s=\"%s\"\n";

class KeyValueFile : public ScratchDir {
  protected:
    void SetUp() override {
        ScratchDir::SetUp();
        file_ = dir_ + "/settings.conf";
    }
    void write(const std::string &text) { std::ofstream(file_) << text; }
    std::string text() const {
        std::stringstream ss;
        ss << std::ifstream(file_).rdbuf();
        return ss.str();
    }
    std::string get(const std::string &key) {
        char buf[256];
        int rc = NLIBCFileGetKeyValue(file_.c_str(), key.c_str(), buf, sizeof buf, 0);
        return rc > 0 ? buf : rc == 0 ? "<absent>" : "<failed>";
    }
    int set(const std::string &key, const std::string &value) {
        return NLIBCFileSetKeyValue(file_.c_str(), key.c_str(), value.c_str(), kLineFormat);
    }
    // What the directory holds besides dot files: no temporary file may stay behind.
    std::vector<std::string> entries() const {
        std::vector<std::string> out;
        DIR *d = opendir(dir_.c_str());
        while (const dirent *e = readdir(d))
            if (e->d_name[0] != '.')
                out.emplace_back(e->d_name);
        closedir(d);
        return out;
    }

    std::string file_;
};

using PlatformExec = ScratchDir;

// Runs `body` in a child process and returns its pid; the child exits 1 when body fails.
template <typename Body> pid_t spawn(Body body) {
    pid_t pid = fork();
    if (pid == 0)
        _exit(body() ? 0 : 1);
    return pid;
}

int exit_code(pid_t pid) {
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
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
    EXPECT_EQ(text(), "k=\"1\"\nname=\"it's \"映画\" = x\"\n");
    EXPECT_EQ(get("name"), "it's \"映画\" = x");
    EXPECT_EQ(get("nam"), "<absent>");
    EXPECT_EQ(NLIBCFileCheckKeyValue(file_.c_str(), "k", "1", 0), 1);
    ASSERT_EQ(set("k", "10"), 0);
    EXPECT_EQ(NLIBCFileCheckKeyValue(file_.c_str(), "k", "1", 0), 0);
    char small[4];
    EXPECT_EQ(NLIBCFileGetKeyValue(file_.c_str(), "name", small, sizeof small, 0), 1);
    EXPECT_STREQ(small, "it'");
}

TEST_F(KeyValueFile, AWriteReplacesTheFirstLineOfItsKeyAndKeepsEveryOtherLine) {
    write("# settings\nalpha=\"1\"\nbeta=plain\nalpha=\"stale\"\nalphabet=\"x\"\nlast=\"1\"");
    ASSERT_EQ(set("alpha", "2"), 0);
    EXPECT_EQ(text(), "# settings\nalpha=\"2\"\nbeta=plain\nalphabet=\"x\"\nlast=\"1\"");
    EXPECT_EQ(get("beta"), "plain");
    ASSERT_EQ(set("gamma", "3"), 0);
    EXPECT_EQ(text(),
              "# settings\nalpha=\"2\"\nbeta=plain\nalphabet=\"x\"\nlast=\"1\"\ngamma=\"3\"\n");
}

TEST_F(KeyValueFile, RefusedWritesLeaveTheFileAsItWasAndGoodOnesKeepItsMode) {
    write("a=\"1\"\n");
    ASSERT_EQ(chmod(file_.c_str(), 0600), 0);
    EXPECT_EQ(set("a", "1\nb=\"2\""), -1);
    EXPECT_EQ(set("a=b", "1"), -1);
    for (const char *format : {"%s=%d\n", "%s\n", "%s=%s\n%s", "%s\n=%s\n"})
        EXPECT_EQ(NLIBCFileSetKeyValue(file_.c_str(), "a", "2", format), -1) << format;
    EXPECT_EQ(NLIBCErrGet(), kNavoErrBadParam);
    EXPECT_EQ(text(), "a=\"1\"\n");

    EXPECT_EQ(NLIBCFileSetKeyValue(file_.c_str(), "a", "100", "%s=%s%%\n"), 0);
    EXPECT_EQ(get("a"), "100%");
    struct stat st;
    ASSERT_EQ(stat(file_.c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0600u);
    EXPECT_EQ(entries(), std::vector<std::string>{"settings.conf"});
}

TEST_F(KeyValueFile, ConcurrentWritersKeepEveryKeyAndReadersSeeWholeFiles) {
    write("keep=\"yes\"\npad=\"" + std::string(20000, 'p') + "\"\n");
    std::vector<pid_t> children;
    for (int w = 0; w < 3; ++w)
        children.push_back(spawn([&, w] {
            for (int i = 0; i < 60; ++i)
                if (set("w" + std::to_string(w) + "_" + std::to_string(i), "1") != 0)
                    return false;
            return true;
        }));
    children.push_back(spawn([&] {
        for (int i = 0; i < 2000; ++i)
            if (get("keep") != "yes")
                return false;
        return true;
    }));
    for (pid_t pid : children)
        EXPECT_EQ(exit_code(pid), 0);
    for (int w = 0; w < 3; ++w)
        for (int i = 0; i < 60; ++i)
            EXPECT_EQ(get("w" + std::to_string(w) + "_" + std::to_string(i)), "1");
    EXPECT_EQ(entries(), std::vector<std::string>{"settings.conf"});
}

TEST_F(PlatformExec, ProgramsGetTheirArgumentsAndNullStreamsAndReportTheirExit) {
    std::string out = dir_ + "/out";
    // Standard input is /dev/null: cat ends at once instead of waiting.
    ASSERT_EQ(NLIBCExec("/bin/sh", "-c", "cat; printf '%s|%s' \"$0\" \"$1\" > \"$1\"", "zero",
                        out.c_str(), nullptr),
              0);
    std::string got;
    std::getline(std::ifstream(out) >> std::ws, got);
    EXPECT_EQ(got, "zero|" + out);
    EXPECT_EQ(NLIBCExec("/bin/sh", "-c", "exit 3", nullptr), 3);
    EXPECT_EQ(NLIBCExec("/bin/sh", "-c", "kill -9 $$", nullptr), -1);
    EXPECT_EQ(NLIBCExec("/no/such/program", nullptr), -1);
    EXPECT_EQ(NLIBCErrGet(), kNavoErrChildFailed);
    // A fifth argument means the list was not ended.
    EXPECT_EQ(NLIBCExec("/bin/true", "1", "2", "3", "4", "5", nullptr), -1);
    EXPECT_EQ(NLIBCExec("/bin/true", "1", "2", "3", "4", nullptr), 0);
}

TEST_F(PlatformExec, ExecvWaitsOnlyWhenAsked) {
    std::string mark = dir_ + "/mark";
    const char *slow[] = {"/bin/sh", "-c", "sleep 0.3; touch \"$0\"", mark.c_str(), nullptr};
    ASSERT_EQ(NLIBCExecv("/bin/sh", slow, 0), 0);
    struct stat st;
    EXPECT_NE(stat(mark.c_str(), &st), 0);
    int status = 0;
    ASSERT_GT(wait(&status), 0);
    EXPECT_EQ(stat(mark.c_str(), &st), 0);
    const char *missing[] = {"/no/such/program", nullptr};
    EXPECT_EQ(NLIBCExecv("/no/such/program", missing, 1), -1);
}
