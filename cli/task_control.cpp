// torvale task: choosing the next task, and the commands on existing tasks.
#include <cstdlib>
#include <cstring>
#include <optional>

#include "cli/cli.h"
#include "torvale/torvale.h"

namespace {

struct NextArgs {
    bool rotate = false;
    int ftp_limit = 0;
    std::optional<std::string> after;
};

struct IdsArgs {
    std::vector<int> ids;
};

struct SeedingArgs {
    int id = 0;
    DownloadTaskSetting setting{0, 0};
};

struct ScopeArgs {
    std::optional<std::string> user;
    bool yes = false;
};

void next(const NextArgs &args) {
    // A process starts with no cursor: --after places it, as a daemon's earlier call would.
    if (args.after)
        gszLastUser = strdup(args.after->c_str());
    int id = DownloadTaskGetNext(args.rotate ? 1 : 0, args.ftp_limit);
    if (id == -1)
        cli::fail("choosing the next task failed (see syslog)");
    Json::Value last = gszLastUser != nullptr ? Json::Value(gszLastUser) : Json::Value();
    cli::print_record({{"task_id", id}, {"last_user", last}});
}

void remove(const IdsArgs &args) {
    int deleted = DownloadTaskMultiDelete(args.ids.data(), static_cast<int>(args.ids.size()));
    if (deleted == -1)
        cli::fail("deleting the tasks failed (see syslog)");
    cli::print_record({{"deleted", deleted}});
}

// Pause or continue: `run` over the ids, which are echoed back.
void set_status(const char *verb, int (*run)(const int *, int), const IdsArgs &args) {
    if (run(args.ids.data(), static_cast<int>(args.ids.size())) == -1)
        cli::fail(std::string(verb) + " failed (see syslog)");
    // An array for scripts; people read the ids on one line.
    Json::Value ids(Json::arrayValue);
    std::string line;
    for (int id : args.ids) {
        ids.append(id);
        line += (line.empty() ? "" : " ") + std::to_string(id);
    }
    cli::print_record(
        {{"done", verb}, {"task_ids", cli::context().json ? ids : Json::Value(line)}});
}

void seeding(const SeedingArgs &args) {
    int changed = DownloadTaskSettingSet(args.id, &args.setting);
    if (changed == -1)
        cli::fail("storing the seeding settings failed (see syslog)");
    if (changed == 0)
        cli::fail("no task has the id " + std::to_string(args.id));
    cli::print_record({{"task_id", args.id},
                       {"seeding_ratio", args.setting.seeding_ratio},
                       {"seeding_interval", args.setting.seeding_interval}});
}

void add_status(CLI::App &task, const char *verb, const char *what, int (*run)(const int *, int)) {
    auto args = std::make_shared<IdsArgs>();
    CLI::App *cmd = task.add_subcommand(verb, what);
    cmd->add_option("ID", args->ids, "Task ids")->required()->check(CLI::NonNegativeNumber);
    cmd->callback([verb, run, args] { set_status(verb, run, *args); });
}

// The bulk commands: `run` with the user, or with null for everybody.
void bulk(const char *verb, int (*run)(const char *), const ScopeArgs &args) {
    if (run(args.user ? args.user->c_str() : nullptr) == -1)
        cli::fail(std::string(verb) + " failed (see syslog)");
    cli::print_record(
        {{"done", verb}, {"user", args.user ? Json::Value(*args.user) : Json::Value()}});
}

void add_bulk(CLI::App &task, const char *verb, const char *what, int (*run)(const char *)) {
    auto args = std::make_shared<ScopeArgs>();
    CLI::App *cmd = task.add_subcommand(verb, what);
    cmd->add_option("--user", args->user, "Only this user's tasks (letter case ignored)");
    if (std::strcmp(verb, "delete-all") == 0)
        cmd->add_flag("--yes", args->yes, "Confirm: the tasks are removed")->required();
    cmd->callback([verb, run, args] { bulk(verb, run, *args); });
}

void setup() {
    CLI::App &task = cli::family("task", "Download tasks");

    auto next_args = std::make_shared<NextArgs>();
    CLI::App *cmd = task.add_subcommand("next", "Show the waiting task to start next");
    cmd->add_flag("--rotate", next_args->rotate, "Take users in turn instead of oldest first");
    cmd->add_option("--ftp-limit", next_args->ftp_limit,
                    "Hold back ftp:// links to servers with this many downloads");
    cmd->add_option("--after", next_args->after, "With --rotate: start after this user");
    cmd->callback([next_args] { next(*next_args); });

    auto ids = std::make_shared<IdsArgs>();
    cmd = task.add_subcommand("delete", "Delete tasks, whatever their status");
    cmd->add_option("ID", ids->ids, "Task ids")->required()->check(CLI::NonNegativeNumber);
    cmd->callback([ids] { remove(*ids); });
    add_status(task, "pause", "Pause tasks", DownloadTaskMultiPause);
    add_status(task, "continue", "Put tasks back in the queue", DownloadTaskMultiContinue);

    auto seed = std::make_shared<SeedingArgs>();
    cmd = task.add_subcommand("seeding", "Set a task's seeding ratio and seeding time");
    cmd->add_option("ID", seed->id, "Task id")->required()->check(CLI::NonNegativeNumber);
    cmd->add_option("--ratio", seed->setting.seeding_ratio, "Seeding ratio")->required();
    cmd->add_option("--interval", seed->setting.seeding_interval, "Seeding time")->required();
    cmd->callback([seed] { seeding(*seed); });

    add_bulk(task, "clear", "Delete the finished tasks", DownloadTaskClear);
    add_bulk(task, "pause-all", "Pause the waiting, downloading and seeding tasks",
             DownloadTaskPauseAll);
    add_bulk(task, "resume-all", "Put paused and failed tasks back in the queue",
             DownloadTaskResumeAll);
    add_bulk(task, "delete-all", "Delete every task", DownloadTaskDeleteAll);
}

cli::Registration reg(setup);

} // namespace
