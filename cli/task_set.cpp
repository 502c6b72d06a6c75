// torvale task set, progress: what the daemon records about a task, by hand.
#include <cstdlib>
#include <optional>

#include "cli/cli.h"
#include "torvale/torvale.h"

namespace {

struct SetArgs {
    int id = -1;
    std::optional<int> status, pid;
    std::optional<std::string> filename, destination, flags, extra;
    std::optional<long long> total_size;
    std::optional<long> started;
};

// Each write changes one row: -1 is a failure and 0 means there is no such task.
void check(int rc, const char *what, int id) {
    if (rc == -1)
        cli::fail(std::string("writing ") + what + " failed (see syslog)");
    if (rc == 0)
        cli::fail("no task " + std::to_string(id));
}

// "+N" sets the bits of N, "-N" clears them; N in decimal or 0x hex.
void change_flags(int id, const std::string &change) {
    char *end = nullptr;
    long mask = change.size() > 1 ? std::strtol(change.c_str() + 1, &end, 0) : 0;
    if (end == nullptr || *end != '\0' || (change[0] != '+' && change[0] != '-'))
        throw CLI::ValidationError("--flags", "expected +N or -N, got " + change);
    int bits = static_cast<int>(mask);
    check(change[0] == '+' ? DownloadTaskFlagsSet(id, bits) : DownloadTaskFlagsClear(id, bits),
          "the flags", id);
}

void set(const SetArgs &a) {
    int id = a.id;
    if (a.pid && a.status)
        check(DownloadTaskPidStatusSet(id, *a.pid, *a.status), "pid and status", id);
    else if (a.pid)
        check(DownloadTaskPidSet(id, *a.pid), "the pid", id);
    else if (a.status)
        check(DownloadTaskStatusSet(id, *a.status), "the status", id);
    if (a.filename)
        check(DownloadTaskFilenameSet(id, a.filename->c_str()), "the file name", id);
    if (a.destination)
        check(DownloadTaskDestinationSet(id, a.destination->c_str()), "the destination", id);
    if (a.flags)
        change_flags(id, *a.flags);
    if (a.extra)
        check(DownloadTaskExtraInfoSet(id, a.extra->c_str()), "the extra information", id);
    if (a.total_size)
        check(DownloadTaskTotalSizeSet(id, *a.total_size), "the total size", id);
    if (a.started)
        check(DownloadTaskStartedTimeSet(id, *a.started), "the start time", id);
    cli::print_record({{"task_id", id}, {"flags", DownloadTaskFlagsGet(id)}});
}

struct ProgressArgs {
    int id = -1;
    DownloadProgressInfo info{};
    bool force = false;
};

void progress(const ProgressArgs &a) {
    int rc = DownloadTaskProgressSet2(a.id, &a.info, a.force ? 1 : 0);
    check(rc, "the progress", a.id);
    // Unforced, 1 also stands for a write left out because nobody asked for progress.
    cli::print_record({{"task_id", a.id}, {"forced", a.force}, {"result", rc}});
}

void setup() {
    CLI::App &task = cli::family("task", "Download tasks");
    auto args = std::make_shared<SetArgs>();
    CLI::App *cmd = task.add_subcommand("set", "Change fields of a task, as the daemon would");
    cmd->add_option("ID", args->id, "Task id")->required();
    cmd->add_option("--status", args->status, "Status code");
    cmd->add_option("--pid", args->pid, "Worker process id (-1: none)");
    cmd->add_option("--filename", args->filename, "Shown file name");
    cmd->add_option("--destination", args->destination, "Destination folder");
    cmd->add_option("--flags", args->flags, "+N sets the bits of N, -N clears them");
    cmd->add_option("--extra", args->extra, "Extra information");
    cmd->add_option("--total-size", args->total_size, "Size of the whole download in bytes");
    cmd->add_option("--started", args->started, "Start time, seconds since the epoch (above 0)");
    cmd->callback([args] { set(*args); });

    auto p = std::make_shared<ProgressArgs>();
    cmd = task.add_subcommand("progress",
                              "Record progress figures (all of them: those not given are 0); "
                              "skipped unless somebody asked for progress or --force");
    cmd->add_option("ID", p->id, "Task id")->required();
    cmd->add_option("--size", p->info.current_size, "Bytes done");
    cmd->add_option("--rate", p->info.current_rate, "Download rate");
    cmd->add_option("--upload-rate", p->info.upload_rate, "Upload rate");
    cmd->add_option("--peers", p->info.total_peers, "Peers known");
    cmd->add_option("--connected", p->info.connected_peers, "Peers connected");
    cmd->add_option("--pieces", p->info.total_pieces, "Pieces in all");
    cmd->add_option("--downloaded", p->info.downloaded_pieces, "Pieces downloaded");
    cmd->add_option("--available", p->info.available_pieces, "Pieces available");
    cmd->add_option("--total-upload", p->info.total_upload, "Bytes uploaded");
    cmd->add_option("--seeding-elapsed", p->info.seeding_elapsed, "Seconds seeded");
    cmd->add_option("--seeders", p->info.seeders, "Seeders");
    cmd->add_option("--leechers", p->info.leechers, "Leechers");
    cmd->add_flag("--force", p->force, "Write even when nobody asked for progress");
    cmd->callback([p] { progress(*p); });
}

cli::Registration reg(setup);

} // namespace
