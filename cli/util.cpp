// torvale util: link and file-name utilities.
#include <memory>

#include "cli/cli.h"
#include "torvale/torvale.h"

namespace {

constexpr int kPathBytes = 4096;

void link_kind(const std::string &url) {
    const char *kind = "other";
    if (DownloadUtilsIsMagnetLink(url.c_str()) == 1)
        kind = "magnet";
    else if (int ftp = DownloadUtilsIsFTPEncrptionLink(url.c_str()); ftp != 0)
        kind = ftp == 1 ? "ftps" : "sftp";
    cli::print_record({{"kind", kind}});
}

void free_name(const std::string &dir, const std::string &name) {
    char path[kPathBytes];
    if (NAVODLValidateFilename(path, sizeof path, dir.c_str(), name.c_str()) == -1)
        cli::fail("no free name fits (see syslog)");
    cli::print_record({{"path", path}});
}

void setup() {
    CLI::App &util = cli::family("util", "Link and file-name utilities");

    auto url = std::make_shared<std::string>();
    util.add_subcommand("link-kind", "Classify a link: magnet, ftps, sftp or other")
        ->callback([url] { link_kind(*url); })
        ->add_option("URL", *url)
        ->required();

    auto args = std::make_shared<std::pair<std::string, std::string>>();
    CLI::App *free = util.add_subcommand("free-name", "The first free name for NAME in DIR");
    free->add_option("DIR", args->first)->required();
    free->add_option("NAME", args->second)->required();
    free->callback([args] { free_name(args->first, args->second); });
}

cli::Registration reg(setup);

} // namespace
