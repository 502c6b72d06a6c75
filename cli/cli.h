// The torvale command line: `torvale <family> <verb>`.
//
// Each cli/*.cpp adds the verbs of one family through a static Registration, using
// only the library's public headers. Output is a table for people, or JSON with --json.
// Exit status: 0 success, 1 failure, 2 usage.
#pragma once

#include <CLI/CLI.hpp>
#include <json/json.h>
#include <string>
#include <vector>

namespace cli {

struct Context {
    bool json = false;
};

// The shared context of the running command (flags given to the root apply to all).
Context &context();

// The family sub-command `name` of the root (created on first use).
CLI::App &family(const char *name, const char *description);

// Adds a family's verbs; runs before the command line is parsed.
struct Registration {
    explicit Registration(void (*setup)());
};

// Ends the command with exit status 1 after printing `message` to stderr.
[[noreturn]] void fail(const std::string &message);

struct Table {
    std::vector<std::string> headers;
    std::vector<std::vector<std::string>> rows;
};

// Prints aligned columns, or the rows as an array of objects keyed by header with --json.
void print(const Table &table);
// Prints fields as "name  value" lines, or one JSON object with --json.
void print_record(const std::vector<std::pair<std::string, Json::Value>> &fields);
void print_json(const Json::Value &value);

} // namespace cli
