// torvale task add, add-file: new tasks from links and files.
#include <iostream>
#include <optional>
#include <pwd.h>
#include <unistd.h>

#include "cli/cli.h"
#include "torvale/torvale.h"

namespace {

struct AddArgs {
    std::vector<std::string> urls;
    std::string path;
    std::optional<std::string> user, dest, extra;
    int kind = 0;
};

// Tasks are added for the caller's login name unless --user says otherwise.
std::string user_of(const AddArgs &args) {
    if (args.user)
        return *args.user;
    const passwd *pw = getpwuid(getuid());
    return pw != nullptr ? pw->pw_name : "";
}

// The user's newest task as stored: creation does not return the id, so it is read
// back (another caller adding for the same user at the same moment could come first).
std::vector<std::string> newest_task(const std::string &user, const std::string &source) {
    int id = DownloadLastTaskIDGet(user.c_str());
    char name[4096] = "";
    char dest[4096] = "";
    DownloadTaskFilenameGet(id, name, sizeof name);
    DownloadTaskDestinationGet(id, dest, sizeof dest);
    return {std::to_string(id), source, name, std::to_string(DownloadTaskFlagsGet(id)), dest};
}

cli::Table added_table() {
    return {{"task_id", "source", "filename", "flags", "destination"}, {}};
}

void add(const AddArgs &args) {
    std::string user = user_of(args);
    cli::Table table = added_table();
    int failed = 0;
    for (const std::string &url : args.urls) {
        const char *dest = args.dest ? args.dest->c_str() : nullptr;
        if (DownloadTaskAddURLHandler(user.c_str(), url.c_str(), dest) == -1) {
            std::cerr << "torvale: adding " << url << " failed (see syslog)\n";
            ++failed;
            continue;
        }
        table.rows.push_back(newest_task(user, url));
    }
    if (!table.rows.empty() || cli::context().json)
        cli::print(table);
    if (failed > 0)
        cli::fail("");
}

void add_file(const AddArgs &args) {
    std::string user = user_of(args);
    int rc;
    if (!args.extra) {
        const char *dest = args.dest ? args.dest->c_str() : nullptr;
        rc = DownloadTaskAddFileHandler(user.c_str(), args.path.c_str(), dest, nullptr, args.kind);
    } else {
        // Extra information goes only with an explicit destination: take the share here.
        char share[4096] = "";
        if (!args.dest && DownloadUserShareGet(user.c_str(), share, sizeof share) != 1)
            cli::fail("user " + user + " has no enabled share folder; give --dest");
        const char *dest = args.dest ? args.dest->c_str() : share;
        rc = DownloadTaskAddFileEX(user.c_str(), args.path.c_str(), dest, nullptr, args.kind,
                                   args.extra->c_str());
    }
    if (rc == -1)
        cli::fail("adding " + args.path + " failed (see syslog)");
    cli::Table table = added_table();
    table.rows.push_back(newest_task(user, args.path));
    cli::print(table);
}

void setup() {
    CLI::App &task = cli::family("task", "Download tasks");
    auto args = std::make_shared<AddArgs>();
    CLI::App *cmd = task.add_subcommand(
        "add", "Add links (web, FTP, magnet); without --dest to the user's share folder");
    cmd->add_option("URL", args->urls, "Links to add")->required();
    cmd->add_option("--user", args->user, "Owner of the tasks (default: your login name)");
    cmd->add_option("--dest", args->dest, "Destination folder");
    cmd->callback([args] { add(*args); });

    auto file_args = std::make_shared<AddArgs>();
    cmd = task.add_subcommand("add-file",
                              "Add a torrent or other file (at most 100 MiB); its bytes are "
                              "stored with the task");
    cmd->add_option("PATH", file_args->path, "The file")->required();
    cmd->add_option("--user", file_args->user, "Owner of the task (default: your login name)");
    cmd->add_option("--dest", file_args->dest, "Destination folder (default: the share folder)");
    cmd->add_option("--kind", file_args->kind,
                    "0 for a torrent file (flag 4), anything else sets flag 2");
    cmd->add_option("--extra", file_args->extra, "Extra information stored with the task");
    cmd->callback([file_args] { add_file(*file_args); });
}

cli::Registration reg(setup);

} // namespace
