#include <cstdlib>
#include <dirent.h>
#include <fstream>
#include <sstream>
#include <string>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

#include "platform/navocore.h"
#include "tests/test_platform_support.h"

namespace {

constexpr char kLineFormat[] = "%s=\"%s\"\n";

std::vector<std::string> items(const NLIBCSzList *list) {
    std::vector<std::string> out;
    for (int i = 0; i < NLIBCSzListCount(list); ++i)
        out.emplace_back(NLIBCSzListGet(list, i));
    return out;
}

class KeyValueFile : public ScratchDir {
  protected:
    void SetUp() override {
        ScratchDir::SetUp();
        file_ = dir_ + "/settings.conf";
    }

    void write(const std::string &text) { std::ofstream(file_) << text; }
    std::string text() const {
        std::ifstream in(file_);
        std::stringstream ss;
        ss << in.rdbuf();
        return ss.str();
    }
    std::string get(const char *key) {
        char buf[256];
        int rc = NLIBCFileGetKeyValue(file_.c_str(), key, buf, sizeof buf, 0);
        return rc > 0 ? buf : rc == 0 ? "<absent>" : "<failed>";
    }
    int set(const char *key, const char *value) {
        return NLIBCFileSetKeyValue(file_.c_str(), key, value, kLineFormat);
    }
    std::vector<std::string> entries() const {
        std::vector<std::string> out;
        if (DIR *d = opendir(dir_.c_str())) {
            while (const dirent *e = readdir(d))
                if (e->d_name[0] != '.')
                    out.emplace_back(e->d_name);
            closedir(d);
        }
        return out;
    }

    std::string file_;
};

// Runs `body` in a child process; returns a pid to wait for.
template <typename Body> pid_t spawn(Body body) {
    pid_t pid = fork();
    if (pid == 0) {
        body();
        _exit(0);
    }
    return pid;
}

int exit_code(pid_t pid) {
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

using PlatformExec = ScratchDir;

} // namespace

TEST(PlatformStrings, TokensAreTheNonEmptyPiecesInOrder) {
    torvale::platform::SzList list(NLIBCSzListAlloc(2));
    ASSERT_NE(list, nullptr);
    EXPECT_EQ(NLIBCStrTok("/volume1//vidéo/film/", "/", list.get()), 3);
    EXPECT_EQ(NLIBCStrTok("a,b;c", ",;", list.get()), 3);
    EXPECT_EQ(NLIBCStrTok("", "/", list.get()), 0);
    EXPECT_EQ(NLIBCStrTok("///", "/", list.get()), 0);
    EXPECT_EQ(items(list.get()),
              (std::vector<std::string>{"volume1", "vidéo", "film", "a", "b", "c"}));
    EXPECT_EQ(NLIBCSzListGet(list.get(), 6), nullptr);
    EXPECT_EQ(NLIBCSzListGet(list.get(), -1), nullptr);
    EXPECT_EQ(NLIBCStrTok(nullptr, "/", list.get()), -1);
    EXPECT_EQ(NLIBCStrTok("a", "/", nullptr), -1);
    EXPECT_EQ(NLIBCSzListCount(nullptr), 0);
}

TEST_F(KeyValueFile, AbsentFileAndKeyReadAsAbsentAndValuesRoundTrip) {
    EXPECT_EQ(get("k"), "<absent>");
    EXPECT_EQ(NLIBCFileCheckKeyValue(file_.c_str(), "k", "1", 0), 0);
    ASSERT_EQ(set("k", "1"), 0);
    ASSERT_EQ(set("name", "it's \"映画\" = x"), 0);
    EXPECT_EQ(text(), "k=\"1\"\nname=\"it's \"映画\" = x\"\n");
    EXPECT_EQ(get("name"), "it's \"映画\" = x");
    EXPECT_EQ(get("k"), "1");
    EXPECT_EQ(get("nam"), "<absent>");
    EXPECT_EQ(NLIBCFileCheckKeyValue(file_.c_str(), "k", "1", 0), 1);
    ASSERT_EQ(set("k", "10"), 0);
    EXPECT_EQ(NLIBCFileCheckKeyValue(file_.c_str(), "k", "1", 0), 0);
    ASSERT_EQ(set("empty", ""), 0);
    EXPECT_EQ(get("empty"), "");

    char small[4];
    EXPECT_EQ(NLIBCFileGetKeyValue(file_.c_str(), "name", small, sizeof small, 0), 1);
    EXPECT_STREQ(small, "it'");
}

TEST_F(KeyValueFile, AWriteReplacesTheFirstLineOfItsKeyAndKeepsEveryOtherLine) {
    write("# settings\nalpha=\"1\"\nbeta=plain\nalpha=\"stale\"\nalphabet=\"x\"\nlast=\"no "
          "newline\"");
    ASSERT_EQ(set("alpha", "2"), 0);
    EXPECT_EQ(text(), "# settings\nalpha=\"2\"\nbeta=plain\nalphabet=\"x\"\nlast=\"no newline\"");
    EXPECT_EQ(get("beta"), "plain");
    ASSERT_EQ(set("gamma", "3"), 0);
    EXPECT_EQ(text(), "# settings\nalpha=\"2\"\nbeta=plain\nalphabet=\"x\"\nlast=\"no newline\"\n"
                      "gamma=\"3\"\n");
}

TEST_F(KeyValueFile, RefusedWritesLeaveTheFileAsItWas) {
    write("a=\"1\"\n");
    ASSERT_EQ(chmod(file_.c_str(), 0600), 0);
    EXPECT_EQ(set("a", "1\nb=\"2\""), -1);
    EXPECT_EQ(set("a=b", "1"), -1);
    EXPECT_EQ(set("", "1"), -1);
    EXPECT_EQ(NLIBCFileSetKeyValue(file_.c_str(), "a", "2", "%s=%d\n"), -1);
    EXPECT_EQ(NLIBCFileSetKeyValue(file_.c_str(), "a", "2", "%s\n"), -1);
    EXPECT_EQ(NLIBCFileSetKeyValue(file_.c_str(), "a", "2", "%s=%s\n%s"), -1);
    EXPECT_EQ(NLIBCFileSetKeyValue(file_.c_str(), "a", "2", "%s\n=%s\n"), -1);
    EXPECT_EQ(NLIBCErrGet(), kNavoErrBadParam);
    EXPECT_EQ(text(), "a=\"1\"\n");
    EXPECT_EQ(NLIBCFileSetKeyValue((dir_ + "/missing/f.conf").c_str(), "a", "1", kLineFormat), -1);

    // A good write keeps the file's mode and leaves no temporary file behind.
    EXPECT_EQ(NLIBCFileSetKeyValue(file_.c_str(), "a", "100", "%s=%s%%\n"), 0);
    EXPECT_EQ(get("a"), "100%");
    struct stat st;
    ASSERT_EQ(stat(file_.c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0600u);
    EXPECT_EQ(entries(), std::vector<std::string>{"settings.conf"});
}

TEST_F(KeyValueFile, ReadersNeverSeeAPartialFileWhileOthersWrite) {
    std::string padding(20000, 'p');
    write("keep=\"yes\"\npad=\"" + padding + "\"\n");
    pid_t writer = spawn([&] {
        for (int i = 0; i < 300; ++i)
            if (set("counter", std::to_string(i).c_str()) != 0)
                _exit(1);
    });
    pid_t reader = spawn([&] {
        char buf[32];
        for (int i = 0; i < 3000; ++i)
            if (NLIBCFileGetKeyValue(file_.c_str(), "keep", buf, sizeof buf, 0) != 1)
                _exit(1);
    });
    EXPECT_EQ(exit_code(writer), 0);
    EXPECT_EQ(exit_code(reader), 0);
    EXPECT_EQ(get("counter"), "299");
}

TEST_F(KeyValueFile, ConcurrentWritersDoNotDropEachOthersKeys) {
    std::vector<pid_t> writers;
    for (int w = 0; w < 3; ++w)
        writers.push_back(spawn([&, w] {
            for (int i = 0; i < 60; ++i) {
                std::string key = "w" + std::to_string(w) + "_" + std::to_string(i);
                if (set(key.c_str(), "1") != 0)
                    _exit(1);
            }
        }));
    for (pid_t pid : writers)
        EXPECT_EQ(exit_code(pid), 0);
    for (int w = 0; w < 3; ++w)
        for (int i = 0; i < 60; ++i)
            EXPECT_EQ(get(("w" + std::to_string(w) + "_" + std::to_string(i)).c_str()), "1");
    EXPECT_EQ(entries(), std::vector<std::string>{"settings.conf"});
}

TEST_F(PlatformExec, ProgramsRunWithTheirArgumentsAndReportTheirExit) {
    std::string out = dir_ + "/out";
    ASSERT_EQ(NLIBCExec("/bin/sh", "-c", "printf '%s|%s' \"$0\" \"$1\" > \"$1\"", "zero",
                        out.c_str(), nullptr),
              0);
    std::ifstream in(out);
    std::string got;
    std::getline(in, got);
    EXPECT_EQ(got, "zero|" + out);

    EXPECT_EQ(NLIBCExec("/bin/sh", "-c", "exit 3", nullptr), 3);
    EXPECT_EQ(NLIBCExec("/bin/sh", "-c", "kill -9 $$", nullptr), -1);
    EXPECT_EQ(NLIBCExec("/no/such/program", nullptr), -1);
    EXPECT_EQ(NLIBCErrGet(), kNavoErrChildFailed);
    // Standard input is /dev/null: a reader ends at once instead of waiting.
    EXPECT_EQ(NLIBCExec("/bin/sh", "-c", "cat > \"$0\"", out.c_str(), nullptr), 0);
    struct stat st;
    ASSERT_EQ(stat(out.c_str(), &st), 0);
    EXPECT_EQ(st.st_size, 0);
    // More than four arguments is a list that was not ended.
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

    const char *fails[] = {"/bin/false", nullptr};
    EXPECT_EQ(NLIBCExecv("/bin/false", fails, 1), 1);
    const char *missing[] = {"/no/such/program", nullptr};
    EXPECT_EQ(NLIBCExecv("/no/such/program", missing, 1), -1);
    const char *empty[] = {nullptr};
    EXPECT_EQ(NLIBCExecv("/bin/true", empty, 1), -1);
}
