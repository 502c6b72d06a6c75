// torvale user: per-user settings.
#include <iostream>
#include <memory>

#include "cli/cli.h"
#include "torvale/torvale.h"

namespace {

constexpr int kFolderBytes = 4096;

struct WatchArgs {
    std::string user, folder;
    bool off = false, delete_torrent = false;
};

void show(const std::string &user) {
    char share[kFolderBytes] = "";
    int state = DownloadUserShareGet(user.c_str(), share, sizeof share);
    if (state == -1)
        cli::fail("reading the settings failed (see syslog)");
    int watch = 0, del = 0;
    char folder[kFolderBytes] = "";
    int found = DownloadUserWatchInfoGet(user.c_str(), &watch, &del, folder, sizeof folder);
    if (found == -1)
        cli::fail("reading the settings failed (see syslog)");
    if (state == 0 && found == 0)
        cli::fail("user " + user + " has no settings");
    cli::print_record({{"user", user},
                       {"share", share},
                       {"disabled", state == 2 ? 1 : 0},
                       {"watch_enabled", watch},
                       {"delete_torrent", del},
                       {"watch_folder", folder}});
}

void share_set(const std::string &user, const std::string &share) {
    if (DownloadUserShareSet(user.c_str(), share.c_str()) == -1)
        cli::fail("storing the share failed: unknown user or database error (see syslog)");
    show(user);
}

void watch_set(const WatchArgs &args) {
    if (args.off == !args.folder.empty())
        throw CLI::ValidationError("watch set", "give either FOLDER or --off");
    int rc = args.off ? DownloadUserWatchInfoSet(args.user.c_str(), 0, 0, nullptr)
                      : DownloadUserWatchInfoSet(args.user.c_str(), 1, args.delete_torrent ? 1 : 0,
                                                 args.folder.c_str());
    if (rc == -1)
        cli::fail("storing the watch folder failed: unknown user or database error (see syslog)");
    show(args.user);
}

void watch_check(const std::string &user, const std::string &folder) {
    int rc = DownloadCheckWatchfolder(user.c_str(), folder.c_str());
    if (rc == -1)
        cli::fail("checking the watch folder failed (see syslog)");
    cli::print_record({{"folder", folder}, {"free", rc == 1}});
}

void set_disabled(const std::string &user, int disabled) {
    if (DownloadUserDisable(user.c_str(), disabled) == -1)
        cli::fail("changing the user failed (see syslog)");
    if (cli::context().json)
        cli::print_json(Json::Value(Json::objectValue));
    else
        std::cout << "user " << user << (disabled != 0 ? " disabled" : " enabled") << "\n";
}

void setup() {
    CLI::App &user = cli::family("user", "Per-user download settings");

    auto name = std::make_shared<std::string>();
    user.add_subcommand("show", "Show a user's share, state and watch folder")
        ->callback([name] { show(*name); })
        ->add_option("USER", *name)
        ->required();

    CLI::App *share = user.add_subcommand("share", "The default destination share");
    share->require_subcommand(1);
    auto share_args = std::make_shared<std::pair<std::string, std::string>>();
    CLI::App *share_set_cmd = share->add_subcommand("set", "Store the user's default share");
    share_set_cmd->add_option("USER", share_args->first)->required();
    share_set_cmd->add_option("SHARE", share_args->second)->required();
    share_set_cmd->callback([share_args] { share_set(share_args->first, share_args->second); });

    CLI::App *watch = user.add_subcommand("watch", "The watch folder");
    watch->require_subcommand(1);
    auto watch_args = std::make_shared<WatchArgs>();
    CLI::App *set = watch->add_subcommand("set", "Switch the watch folder on (FOLDER) or --off");
    set->add_option("USER", watch_args->user)->required();
    CLI::Option *folder = set->add_option("FOLDER", watch_args->folder, "Folder to watch");
    CLI::Option *off = set->add_flag("--off", watch_args->off, "Switch watching off");
    off->excludes(folder);
    set->add_flag("--delete-torrent", watch_args->delete_torrent,
                  "Delete a torrent file once it is taken")
        ->excludes(off);
    set->callback([watch_args] { watch_set(*watch_args); });

    auto check_args = std::make_shared<std::pair<std::string, std::string>>();
    CLI::App *check = watch->add_subcommand("check", "Is FOLDER free for USER to watch?");
    check->add_option("USER", check_args->first)->required();
    check->add_option("FOLDER", check_args->second)->required();
    check->callback([check_args] { watch_check(check_args->first, check_args->second); });

    auto disable_name = std::make_shared<std::string>();
    user.add_subcommand("disable", "Disable the user (and switch watching off)")
        ->callback([disable_name] { set_disabled(*disable_name, 1); })
        ->add_option("USER", *disable_name)
        ->required();
    auto enable_name = std::make_shared<std::string>();
    user.add_subcommand("enable", "Enable the user again")
        ->callback([enable_name] { set_disabled(*enable_name, 0); })
        ->add_option("USER", *enable_name)
        ->required();
}

cli::Registration reg(setup);

} // namespace
