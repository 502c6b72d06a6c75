#include <cstdio>
#include <iostream>
#include <map>
#include <memory>

#include "cli/cli.h"

namespace cli {

namespace {

std::vector<void (*)()> &setups() {
    static std::vector<void (*)()> list;
    return list;
}

CLI::App &root() {
    static CLI::App app{"Torvale: the download manager's back end, for operators.", "torvale"};
    return app;
}

} // namespace

Context &context() {
    static Context ctx;
    return ctx;
}

CLI::App &family(const char *name, const char *description) {
    static std::map<std::string, CLI::App *> families;
    auto it = families.find(name);
    if (it != families.end())
        return *it->second;
    CLI::App *sub = root().add_subcommand(name, description);
    sub->require_subcommand(1);
    families.emplace(name, sub);
    return *sub;
}

Registration::Registration(void (*setup)()) {
    setups().push_back(setup);
}

void fail(const std::string &message) {
    throw CLI::RuntimeError(message, 1);
}

} // namespace cli

int main(int argc, char **argv) {
    CLI::App &app = cli::root();
    app.fallthrough();
    app.require_subcommand(1);
    app.add_flag("--json", cli::context().json, "Print JSON for scripts");
    for (auto setup : cli::setups())
        setup();
    try {
        app.parse(argc, argv);
    } catch (const CLI::RuntimeError &e) {
        if (e.what()[0] != '\0')
            std::cerr << "torvale: " << e.what() << "\n";
        return e.get_exit_code();
    } catch (const CLI::ParseError &e) {
        int rc = app.exit(e);
        return rc == 0 ? 0 : 2;
    }
    return 0;
}
