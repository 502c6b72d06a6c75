// What the platform tests share: host accounts made for one test and removed after it
// (tests run as root), a scratch relocation root, and small text helpers.
#pragma once

#include <cctype>
#include <fstream>
#include <iterator>
#include <pwd.h>
#include <string>
#include <unistd.h>

#include "tests/fixture.h"

// A user without home directory or own group, named after this process and a counter;
// `group` makes that group its primary one.
class HostUser {
  public:
    explicit HostUser(const std::string &group = "") {
        static int counter = 0;
        name_ = "tvu" + std::to_string(getpid()) + "x" + std::to_string(++counter);
        std::string opts = group.empty() ? "-N " : "-g " + group + " ";
        EXPECT_EQ(run_shell("useradd -M " + opts + name_ + " >/dev/null 2>&1"), 0) << name_;
    }
    ~HostUser() { run_shell("userdel " + name_ + " >/dev/null 2>&1"); }
    const std::string &name() const { return name_; }
    const char *c_str() const { return name_.c_str(); }
    const passwd &entry() const { return *getpwnam(name_.c_str()); }

  private:
    std::string name_;
};

// A group made for the test when the host lacks it, removed after only if made here.
class HostGroup {
  public:
    explicit HostGroup(const std::string &name) : name_(name) {
        if ((created_ = run_shell("getent group " + name_ + " >/dev/null") != 0)) {
            EXPECT_EQ(run_shell("groupadd " + name_), 0);
        }
    }
    ~HostGroup() {
        if (created_)
            run_shell("groupdel " + name_);
    }
    void add(const HostUser &user) {
        EXPECT_EQ(run_shell("gpasswd -a " + user.name() + " " + name_ + " >/dev/null"), 0);
    }

  private:
    std::string name_;
    bool created_ = false;
};

// The database fixture's scratch TORVALE_ROOT, for tests of the platform layer.
class ScratchDir : public DbTest {
  protected:
    void SetUp() override {
        DbTest::SetUp();
        dir_ = root();
    }
    std::string dir_;
};

inline std::string read_all(const std::string &path) {
    std::ifstream in(path);
    return std::string(std::istreambuf_iterator<char>(in), {});
}

inline std::string upper(std::string s) {
    for (char &c : s)
        c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    return s;
}
