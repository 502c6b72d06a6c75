// torvale task list | show | count | rate: the queue as operators see it.
#include <cinttypes>
#include <cstdio>
#include <iostream>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "cli/cli.h"
#include "torvale/torvale.h"

namespace {

// A listing is fetched a page at a time, so a long queue is never held whole.
constexpr int kPageRows = 200;
// Beyond this rate the library estimates a download's time left.
constexpr int kRateForEstimate = 512;

struct HandleClose {
    void operator()(DownloadQueueHandle *h) const noexcept { DownloadQueueClose(h); }
};
using Handle = std::unique_ptr<DownloadQueueHandle, HandleClose>;

enum class Order { Column, Progress, TimeLeft };

struct ListArgs {
    std::optional<std::string> user, where;
    std::string sort;
    bool asc = false, desc = false, by_progress = false, by_time_left = false;
    int limit = -1, offset = 0;
};

std::string status_name(int status) {
    switch (status) {
    case TASK_STATUS_WAITING:
        return "waiting";
    case TASK_STATUS_DOWNLOADING:
        return "downloading";
    case TASK_STATUS_PAUSED:
        return "paused";
    case TASK_STATUS_FINISHED:
        return "finished";
    case TASK_STATUS_DOWNLOAD_AUX:
        return "download-aux";
    case TASK_STATUS_SEED_AUX:
        return "seed-aux";
    case TASK_STATUS_SEEDING:
        return "seeding";
    default:
        return status >= TASK_STATUS_ERROR ? "error(" + std::to_string(status) + ")"
                                           : "unknown(" + std::to_string(status) + ")";
    }
}

double done_percent(const DownloadTaskInfo &t) {
    return t.total_size != 0
               ? 100.0 * static_cast<double>(t.current_size) / static_cast<double>(t.total_size)
               : 0.0;
}

// Seconds left as the time-left order estimates them; nothing when it does not.
std::optional<long long> seconds_left(const DownloadTaskInfo &t) {
    if (t.status != TASK_STATUS_DOWNLOADING || t.total_size == 0 ||
        t.current_rate <= kRateForEstimate)
        return std::nullopt;
    return (t.total_size - t.current_size) / t.current_rate;
}

std::string bytes(long long n, const char *suffix = "") {
    static const char *const units[] = {"B", "KiB", "MiB", "GiB", "TiB", "PiB"};
    double v = static_cast<double>(n);
    size_t u = 0;
    while ((v >= 1024.0 || v <= -1024.0) && u + 1 < std::size(units)) {
        v /= 1024.0;
        ++u;
    }
    char out[32];
    std::snprintf(out, sizeof out, u == 0 ? "%.0f %s%s" : "%.1f %s%s", v, units[u], suffix);
    return out;
}

std::string duration(std::optional<long long> seconds) {
    if (!seconds)
        return "-";
    char out[32];
    std::snprintf(out, sizeof out, "%lld:%02lld:%02lld", *seconds / 3600, *seconds / 60 % 60,
                  *seconds % 60);
    return out;
}

const char *text(const char *s) {
    return s != nullptr ? s : "";
}

// Conditions are in the library's condition language, where a quote doubles.
std::string quoted(const std::string &s) {
    std::string out = "'";
    for (char c : s) {
        if (c == '\'')
            out += '\'';
        out += c;
    }
    return out + "'";
}

std::optional<std::string> condition(const ListArgs &args) {
    std::optional<std::string> user;
    if (args.user)
        user = "lower(username)=lower(" + quoted(*args.user) + ")";
    if (user && args.where)
        return "(" + *user + ") and (" + *args.where + ")";
    return user ? user : args.where;
}

Handle open_page(const ListArgs &args, const char *where, int limit, int offset) {
    int ascending = args.desc ? 0 : 1;
    if (args.by_progress)
        return Handle(DownloadQueueOpenProgress(where, limit, offset, ascending));
    if (args.by_time_left)
        return Handle(DownloadQueueOpenTimeLeft(where, limit, offset, ascending));
    return Handle(DownloadQueueOpenCondition(where, limit, offset, args.sort.c_str(), ascending));
}

// Prints rows as they come: a table whose variable column (the file name) is last,
// or a JSON array written one task at a time.
class RowPrinter {
  public:
    RowPrinter() {
        if (cli::context().json)
            std::cout << "[";
        else
            line({"id", "user", "status", "size", "done", "rate", "time left", "file name"});
    }
    ~RowPrinter() {
        if (cli::context().json)
            std::cout << (rows_ > 0 ? "\n]\n" : "]\n");
    }
    void print(const DownloadTaskInfo &t) {
        if (!cli::context().json) {
            char done[16];
            std::snprintf(done, sizeof done, "%.1f%%", done_percent(t));
            line({std::to_string(t.task_id), text(t.username), status_name(t.status),
                  bytes(t.total_size), done, bytes(t.current_rate, "/s"), duration(seconds_left(t)),
                  text(t.filename)});
            return;
        }
        Json::Value row(Json::objectValue);
        row["id"] = t.task_id;
        row["user"] = text(t.username);
        row["status"] = t.status;
        row["status_name"] = status_name(t.status);
        row["filename"] = text(t.filename);
        row["total_size"] = Json::Int64(t.total_size);
        row["current_size"] = Json::Int64(t.current_size);
        row["done_percent"] = done_percent(t);
        row["rate"] = t.current_rate;
        std::optional<long long> left = seconds_left(t);
        row["time_left"] = left ? Json::Value(Json::Int64(*left)) : Json::Value();
        Json::StreamWriterBuilder compact;
        compact["indentation"] = "";
        std::cout << (rows_ > 0 ? ",\n" : "\n") << Json::writeString(compact, row);
        ++rows_;
    }

  private:
    static void line(const std::vector<std::string> &cells) {
        static const size_t widths[] = {8, 14, 13, 11, 7, 13, 10};
        std::string out;
        for (size_t i = 0; i < cells.size(); ++i) {
            out += cells[i];
            if (i < std::size(widths))
                out +=
                    std::string(cells[i].size() < widths[i] ? widths[i] - cells[i].size() : 1, ' ');
        }
        std::cout << out << "\n";
    }
    long rows_ = 0;
};

void list(const ListArgs &args) {
    std::optional<std::string> where = condition(args);
    std::optional<RowPrinter> printer; // from the first page on, so a refusal prints nothing
    long long left = args.limit;       // negative: no limit
    int offset = args.offset;
    do {
        int want = left < 0 || left > kPageRows ? kPageRows : static_cast<int>(left);
        Handle page = open_page(args, where ? where->c_str() : nullptr, want, offset);
        if (page == nullptr)
            cli::fail("the listing failed: check --where and --sort (see syslog)");
        if (!printer)
            printer.emplace();
        int got = 0;
        while (const DownloadTaskInfo *task = DownloadQueueGet(page.get())) {
            printer->print(*task);
            ++got;
        }
        if (got < want)
            break;
        offset += got;
        if (left > 0)
            left -= got;
    } while (left != 0);
}

void show(int task_id) {
    Handle handle(DownloadQueueOpen(("task_id=" + std::to_string(task_id)).c_str()));
    const DownloadTaskInfo *t = handle != nullptr ? DownloadQueueGet(handle.get()) : nullptr;
    if (t == nullptr)
        cli::fail("no task " + std::to_string(task_id));
    char destination[4096] = "";
    DownloadTaskDestinationGet(task_id, destination, sizeof destination);
    std::string extra(static_cast<size_t>(DownloadTaskExtraInfoGet(task_id, nullptr, 0)) + 1, '\0');
    DownloadTaskExtraInfoGet(task_id, extra.data(), static_cast<int>(extra.size()));
    extra.resize(extra.size() - 1);
    cli::print_record({{"task_id", t->task_id},
                       {"username", text(t->username)},
                       {"pid", t->pid},
                       {"url", text(t->url)},
                       {"filename", text(t->filename)},
                       {"status", t->status},
                       {"status_name", status_name(t->status)},
                       {"created_time", t->created_time},
                       {"started_time", t->started_time},
                       {"total_size", Json::Int64(t->total_size)},
                       {"current_size", Json::Int64(t->current_size)},
                       {"done_percent", done_percent(*t)},
                       {"current_rate", t->current_rate},
                       {"total_peers", t->total_peers},
                       {"connected_peers", t->connected_peers},
                       {"total_pieces", t->total_pieces},
                       {"downloaded_pieces", t->downloaded_pieces},
                       {"available_pieces", t->available_pieces},
                       {"upload_rate", t->upload_rate},
                       {"total_upload", Json::Int64(t->total_upload)},
                       {"seeding_ratio", t->seeding_ratio},
                       {"seeding_interval", t->seeding_interval},
                       {"seeding_elapsed", t->seeding_elapsed},
                       {"seeders", t->seeders},
                       {"leechers", t->leechers},
                       {"task_flags", t->task_flags},
                       {"has_torrent", t->has_torrent},
                       {"destination", destination},
                       {"extra_info", extra}});
}

struct CountArgs {
    std::optional<std::string> user;
    bool downloading = false, seeding = false;
};

// All tasks (of a user), or the running ones: those count only with a live worker, and
// the count fails the tasks whose worker has gone.
void count(const CountArgs &args) {
    int n = args.downloading ? DownloadTaskDownloadingCount()
            : args.seeding   ? DownloadTaskSeedingCount()
                             : DownloadTaskCount(args.user ? args.user->c_str() : nullptr);
    if (n == -1)
        cli::fail("counting failed (see syslog)");
    cli::print_record({{"count", n}});
}

void rate(const std::string &user) {
    int download = 0, upload = 0;
    if (DownloadTotalRateGet(user.c_str(), &download, &upload) == -1)
        cli::fail("no rates for " + user + ": not a host user, or no database (see syslog)");
    cli::print_record({{"download_rate", download}, {"upload_rate", upload}});
}

void setup() {
    CLI::App &task = cli::family("task", "Download tasks");

    auto args = std::make_shared<ListArgs>();
    CLI::App *ls = task.add_subcommand("list", "List tasks, a page at a time from the database");
    ls->add_option("--user", args->user, "Only this user's tasks (letter case ignored)");
    ls->add_option("--where", args->where, "Only tasks matching this condition");
    CLI::Option *sort = ls->add_option("--sort", args->sort, "Order by this column (task_id)");
    CLI::Option *asc = ls->add_flag("--asc", args->asc, "Ascending (the default)");
    ls->add_flag("--desc", args->desc, "Descending")->excludes(asc);
    CLI::Option *progress =
        ls->add_flag("--by-progress", args->by_progress, "Order by percentage done, then task id");
    ls->add_flag("--by-time-left", args->by_time_left,
                 "Order by estimated time left, then status and task id")
        ->excludes(progress)
        ->excludes(sort);
    progress->excludes(sort);
    ls->add_option("--limit", args->limit, "At most this many tasks (all)")
        ->check(CLI::NonNegativeNumber);
    ls->add_option("--offset", args->offset, "Skip this many tasks first")
        ->check(CLI::NonNegativeNumber);
    ls->callback([args] { list(*args); });

    auto id = std::make_shared<int>(0);
    CLI::App *sh = task.add_subcommand("show", "Show every field of one task");
    sh->add_option("id", *id, "Task id")->required();
    sh->callback([id] { show(*id); });

    auto cargs = std::make_shared<CountArgs>();
    CLI::App *cnt = task.add_subcommand("count", "Count tasks");
    CLI::Option *user =
        cnt->add_option("--user", cargs->user, "Only this user's tasks (letter case ignored)");
    CLI::Option *downloading = cnt->add_flag("--downloading", cargs->downloading,
                                             "Downloading tasks whose worker is alive");
    cnt->add_flag("--seeding", cargs->seeding, "Seeding tasks whose worker is alive")
        ->excludes(downloading)
        ->excludes(user);
    downloading->excludes(user);
    cnt->callback([cargs] { count(*cargs); });

    auto name = std::make_shared<std::string>();
    CLI::App *rt = task.add_subcommand(
        "rate", "Summed rates of downloading and seeding tasks: all users' for an "
                "administrator, else the user's own");
    rt->add_option("user", *name, "Host user name")->required();
    rt->callback([name] { rate(*name); });
}

cli::Registration reg(setup);

} // namespace
