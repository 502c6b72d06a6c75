// torvale conf: the system download configuration.
#include <cstring>
#include <optional>

#include "cli/cli.h"
#include "torvale/torvale.h"

namespace {

struct SetArgs {
    std::optional<std::string> when;
    std::optional<int> order, ratio, interval;
};

void show(const DownloadConf &conf) {
    cli::print_record({{"enabled", conf.enabled},
                       {"download_when", conf.download_when},
                       {"download_order", conf.download_order},
                       {"seeding_ratio", conf.seeding_ratio},
                       {"seeding_interval", conf.seeding_interval}});
}

void get() {
    DownloadConf conf;
    std::memset(&conf, 0, sizeof conf);
    if (DownloadConfGet(&conf) == -1)
        cli::fail("no configuration could be read (see syslog)");
    show(conf);
}

void set(const SetArgs &args) {
    DownloadConf conf;
    std::memset(&conf, 0, sizeof conf);
    // Fields not given keep their stored values; the first store starts from zero.
    if (DownloadConfGet(&conf) == -1)
        std::memset(&conf, 0, sizeof conf);
    if (args.when) {
        if (args.when->size() >= sizeof conf.download_when)
            cli::fail("--when holds at most 11 characters");
        std::strcpy(conf.download_when, args.when->c_str());
    }
    if (args.order)
        conf.download_order = *args.order;
    if (args.ratio)
        conf.seeding_ratio = *args.ratio;
    if (args.interval)
        conf.seeding_interval = *args.interval;
    if (DownloadConfSet(&conf) == -1)
        cli::fail("storing the configuration failed (see syslog)");
    get();
}

void setup() {
    CLI::App &conf = cli::family("conf", "The system download configuration");
    conf.add_subcommand("get", "Show the configuration")->callback(get);
    auto args = std::make_shared<SetArgs>();
    CLI::App *cmd = conf.add_subcommand("set", "Store the configuration, then show it");
    cmd->add_option("--when", args->when, "Download schedule text (at most 11 characters)");
    cmd->add_option("--order", args->order, "Download order");
    cmd->add_option("--seeding-ratio", args->ratio, "Default seeding ratio of new tasks");
    cmd->add_option("--seeding-interval", args->interval, "Default seeding time of new tasks");
    cmd->callback([args] { set(*args); });
}

cli::Registration reg(setup);

} // namespace
