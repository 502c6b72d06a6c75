// torvale trigger: wake the download daemon, or ask it for progress figures.
#include "cli/cli.h"
#include "torvale/torvale.h"

namespace {

// Whether the daemon's segment is there; the signals themselves never say.
bool segment_present(int key, size_t size) {
    void *addr = NAVODownloadShmAttach(key, size, 0);
    if (addr == nullptr)
        return false;
    NAVODownloadShmDetach(addr);
    return true;
}

void trigger(bool progress) {
    if (progress) {
        int was = DownloadTriggerProgress();
        cli::print_record({{"daemon_segment",
                            segment_present(DOWNLOAD_SHM_PROGRESS_KEY, DOWNLOAD_SHM_PROGRESS_SIZE)},
                           {"progress_already_requested", was != 0}});
        return;
    }
    NAVODownloadTrigger();
    cli::print_record(
        {{"daemon_segment", segment_present(DOWNLOAD_SHM_TRIGGER_KEY, DOWNLOAD_SHM_TRIGGER_SIZE)}});
}

void setup() {
    CLI::App &cmd = cli::family("trigger", "Wake the download daemon (a no-op when it is not "
                                           "running)");
    cmd.require_subcommand(0, 0);
    auto progress = std::make_shared<bool>(false);
    cmd.add_flag("--progress", *progress, "Ask the daemon for progress figures instead");
    cmd.callback([progress] { trigger(*progress); });
}

cli::Registration reg(setup);

} // namespace
