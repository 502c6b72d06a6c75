// What the platform tests share: host accounts made for one test and removed after it
// (tests run as root), and a scratch directory that is also the relocation root.
#pragma once

#include <cstdlib>
#include <gtest/gtest.h>
#include <pwd.h>
#include <string>
#include <unistd.h>

#include "tests/fixture.h"

// A fresh name no host account has: the prefix, this process and a counter.
inline std::string unique_account_name(const std::string &prefix) {
    static int counter = 0;
    return prefix + std::to_string(getpid()) + "x" + std::to_string(++counter);
}

// A user without home directory or own group; `group` makes it the primary group.
class HostUser {
  public:
    explicit HostUser(const std::string &group = "") : name_(unique_account_name("tvu")) {
        std::string opts = group.empty() ? "-N" : "-g " + group;
        EXPECT_EQ(run_shell("useradd -M " + opts + " " + name_ + " >/dev/null 2>&1"), 0) << name_;
    }
    ~HostUser() { run_shell("userdel " + name_ + " >/dev/null 2>&1"); }
    HostUser(const HostUser &) = delete;
    HostUser &operator=(const HostUser &) = delete;

    const std::string &name() const { return name_; }
    const char *c_str() const { return name_.c_str(); }
    uid_t uid() const {
        const passwd *pw = getpwnam(name_.c_str());
        return pw != nullptr ? pw->pw_uid : static_cast<uid_t>(-1);
    }
    gid_t gid() const {
        const passwd *pw = getpwnam(name_.c_str());
        return pw != nullptr ? pw->pw_gid : static_cast<gid_t>(-1);
    }

  private:
    std::string name_;
};

// A group made for the test when the host lacks it, removed after only if made here.
class HostGroup {
  public:
    explicit HostGroup(const std::string &name) : name_(name) {
        if (run_shell("getent group " + name_ + " >/dev/null") != 0) {
            EXPECT_EQ(run_shell("groupadd " + name_ + " >/dev/null 2>&1"), 0) << name_;
            created_ = true;
        }
    }
    ~HostGroup() {
        if (created_)
            run_shell("groupdel " + name_ + " >/dev/null 2>&1");
    }
    HostGroup(const HostGroup &) = delete;
    HostGroup &operator=(const HostGroup &) = delete;

    void add(const HostUser &user) {
        EXPECT_EQ(run_shell("gpasswd -a " + user.name() + " " + name_ + " >/dev/null 2>&1"), 0);
    }
    const std::string &name() const { return name_; }

  private:
    std::string name_;
    bool created_ = false;
};

// A directory made for the test and exported as TORVALE_ROOT, removed after it.
class ScratchDir : public ::testing::Test {
  protected:
    void SetUp() override {
        char tmpl[] = "/tmp/torvale-scratch.XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        dir_ = tmpl;
        setenv("TORVALE_ROOT", dir_.c_str(), 1);
    }
    void TearDown() override {
        unsetenv("TORVALE_ROOT");
        run_shell("rm -rf '" + dir_ + "'");
    }

    std::string dir_;
};
