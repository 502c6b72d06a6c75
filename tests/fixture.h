// The fixture of every database test: a raw libpq connection for arranging and
// checking, tables truncated before each test, the library's log lines captured, and
// a scratch TORVALE_ROOT.
#pragma once

#include <gtest/gtest.h>
#include <libpq-fe.h>
#include <string>
#include <vector>

class DbTest : public ::testing::Test {
  protected:
    void SetUp() override;
    void TearDown() override;

    // Runs a statement on the raw connection; fails the test when it fails.
    void exec(const std::string &sql);
    // The first field of the first row ("" when NULL, "<none>" when no row).
    std::string value(const std::string &sql);
    // Number of rows a query returns.
    int count(const std::string &sql);

    // The library's log lines so far, with the line number replaced by '#':
    // "sysconf (#) Bad parameters.", "rss_feed:# Bad parameter".
    const std::vector<std::string> &logs() const;
    bool logged(const std::string &masked) const;
    void clear_logs();

    // A directory made for this test and exported as TORVALE_ROOT.
    const std::string &root() const { return root_; }

    PGconn *raw_ = nullptr;

  private:
    std::string root_;
};

// Runs a shell command; returns its exit status.
int run_shell(const std::string &cmd);
