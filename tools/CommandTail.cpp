#include "base/Format.h"
#include "base/Json.h"
#include "base/NumberText.h"
#include "base/Rfc3339.h"
#include "os/FileDescriptor.h"
#include "tools/Command.h"
#include "tools/Decode.h"
#include "tools/ServiceConnection.h"
#include "tools/TimeText.h"
#include "tools/records/AccessFault.h"
#include "tools/records/Payload.h"
#include "tools/records/RecordFilter.h"
#include "tools/records/SinkFile.h"
#include "wire/Directories.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <deque>
#include <limits>
#include <map>

#include <poll.h>
#include <sys/inotify.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {
    {.name = "--lines",
     .value = "N",
     .help = "the last N lines that match (10; with --since or --until all)",
     .letter = 'n'},
    {.name = "--follow",
     .value = "",
     .help = "go on with what is written from now on, through the file's renaming",
     .letter = 'f',
     .excludes = "--summary --until"},
    {.name = "--event",
     .value = "NAME",
     .help = "only this event; a trailing * stands for anything; may be given several times",
     .letter = 'e',
     .isRepeatable = true},
    {.name = "--key",
     .value = "KEY[=VALUE]",
     .help = "only lines whose payload has the key, with the value; may be given several times",
     .letter = 'k',
     .isRepeatable = true},
    {.name = "--reporter",
     .value = "ID",
     .help = "only lines of this reporter's sessions; FILE is then call-quality, if none is given",
     .letter = 'r'},
    {.name = "--since", .value = "TIME", .help = "only lines of this time and later", .letter = 'S'},
    {.name = "--until", .value = "TIME", .help = "only lines of before this time", .letter = 'U'},
    {.name = "--summary",
     .value = "",
     .help = "print how often each event stands in the file and its predecessors, and end",
     .letter = 's',
     .excludes = "--lines --wide"},
    {.name = "--wide",
     .value = "",
     .help = "print each entry of a line on a line of its own",
     .letter = 'w',
     .excludes = "--json"},
    {.name = "--json",
     .value = "",
     .help = "print the lines as they stand in the file, or the summary as JSON",
     .letter = 'j'},
};

constexpr std::size_t kAllLines = std::numeric_limits<std::size_t>::max();

struct Plan {
    std::string path;
    RecordFilter filter;
    std::size_t lines = 10; ///< the most of what is there already
    bool follows = false;
    bool printsJson = false;
    bool isWide = false;
};

std::optional<std::string> takeFilter(RecordFilter& filter, const Arguments& arguments) {
    for (const std::string_view event : arguments.all("--event")) {
        filter.wantEvent(event);
    }
    for (const std::string_view key : arguments.all("--key")) {
        filter.wantKey(key);
    }
    if (const auto text = arguments.last("--reporter")) {
        const auto reporter = parseNumber<std::int64_t>(*text);
        if (!reporter) {
            return notAReporterID(*text);
        }
        filter.wantReporter(*reporter);
    }
    const double now = presentTime();
    for (const std::string_view option : {"--since", "--until"}) {
        const auto text = arguments.last(option);
        const auto moment = text ? parseMoment(*text, now) : std::nullopt;
        if (text && !moment) {
            return formatted("{} needs a time: 2026-03-01T12:00, 5m (so long ago), or seconds since 1970",
                             option);
        }
        if (moment && option == "--since") {
            filter.wantSince(*moment);
        } else if (moment) {
            filter.wantUntil(*moment);
        }
    }
    return std::nullopt;
}

/// What speaks against the file: a name that no sink has, or one whose lines name no reporter.
std::optional<std::string> faultOfFile(const Plan& plan, std::string_view typed) {
    const KnownSink* const sink = findKnownSink(plan.path);
    if (sink == nullptr && typed.find('/') == std::string_view::npos && filesOfSink(plan.path).empty() &&
        faultOfReading(plan.path) == ENOENT) {
        return formatted(
            "\"{}\" is no report sink; \"tambloctl list sinks\" has them, and a path has a slash", typed);
    }
    if (sink != nullptr && !sink->namesReporter && plan.filter.wantsReporter()) {
        return formatted(
            "the lines of {} name no reporter; those of call-quality do, and have every message of a "
            "session, and those of memory-log",
            sink->name);
    }
    return std::nullopt;
}

std::variant<Plan, std::string> makePlan(const Arguments& arguments) {
    if (arguments.rest().size() > 1) {
        return std::string("tail takes one file");
    }
    Plan plan;
    if (auto wrong = takeFilter(plan.filter, arguments)) {
        return *std::move(wrong);
    }
    const std::string_view usual = plan.filter.wantsReporter() ? "call-quality" : "analytics-events";
    const std::string_view typed = arguments.rest().empty() ? usual : arguments.rest()[0];
    const auto directories = wire::Directories::ofThisProcess();
    if (directories.logs.empty()) {
        return std::string("the logs directory is not known: set LOGS_DIRECTORY");
    }
    plan.path = sinkPath(directories.logs, typed);
    if (auto wrong = faultOfFile(plan, typed)) {
        return *std::move(wrong);
    }
    if (const auto text = arguments.last("--lines")) {
        const auto lines = parseDecimalOrHex<std::uint64_t>(*text);
        if (!lines) {
            return std::string("--lines needs a number");
        }
        plan.lines = *lines;
    } else if (arguments.has("--since") || arguments.has("--until")) {
        plan.lines = kAllLines;
    }
    plan.follows = arguments.has("--follow");
    plan.printsJson = arguments.has("--json");
    plan.isWide = arguments.has("--wide");
    return plan;
}

/// The record in the line when it is one, and wanted.
std::optional<Dictionary> wantedRecord(Plan& plan, std::string_view line) {
    auto record = parseJsonObject(line);
    auto* const fields = std::get_if<Dictionary>(&record);
    if (fields == nullptr) {
        return std::nullopt;
    }
    plan.filter.noteSession(*fields);
    return plan.filter.accepts(*fields) ? std::optional(std::move(*fields)) : std::nullopt;
}

/// Finds the sessions of the reporter that is asked for, before the lines are read from the end.
void noteSessions(Plan& plan) {
    if (!plan.filter.wantsReporter()) {
        return;
    }
    LineFunction note = [&plan](std::string_view line) {
        if (line.find(R"("op":"open")") != std::string_view::npos) {
            (void)wantedRecord(plan, line);
        }
    };
    for (const std::string& file : filesOfSink(plan.path)) {
        readLines(file, note);
    }
}

void printRecord(Plan& plan, std::string_view line) {
    const auto record = wantedRecord(plan, line);
    if (!record) {
        return;
    }
    if (plan.printsJson) {
        printLine(line);
        return;
    }
    if (plan.isWide) {
        const std::string text = decode(line, EncodedKind::line).text;
        std::fwrite(text.data(), 1, text.size(), stdout);
        return;
    }
    const Value* time = record->find("time");
    Dictionary rest = *record;
    rest.remove("time");
    rest.remove("event");
    if (const auto fields = fieldsOfMetric(*record)) {
        rest.set("record", *fields);
    }
    const Value* payload = rest.find("payload");
    const bool isJustPayload = rest.size() == 1 && payload != nullptr;
    printLine(formatted("{} {} {}", formatRfc3339(time == nullptr ? 0 : time->doubleValue()).value_or("-"),
                        nameOfRecord(*record), isJustPayload ? jsonText(*payload) : jsonText(rest)));
}

/// The last lines that match, from as few of the files as have them. The follower reads the newest file, and
/// goes on right behind what was found.
std::deque<std::string> lastLines(Plan& plan, SinkFollower& follower) {
    std::deque<std::string> found;
    std::deque<std::string> ofFile;
    LineFunction take = [&](std::string_view line) {
        if (plan.filter.isEmpty() || wantedRecord(plan, line)) {
            ofFile.emplace_back(line);
        }
        if (ofFile.size() > plan.lines - found.size()) {
            ofFile.pop_front();
        }
    };
    const auto keep = [&] {
        found.insert(found.begin(), std::make_move_iterator(ofFile.begin()),
                     std::make_move_iterator(ofFile.end()));
        ofFile.clear();
    };
    follower.readNew(take);
    keep();
    std::vector<std::string> files = filesOfSink(plan.path);
    while (!files.empty() && found.size() < plan.lines) {
        if (files.back() != plan.path) {
            readLines(files.back(), take);
            keep();
        }
        files.pop_back();
    }
    return found;
}

/// What is there already and wanted. The follower goes on behind it.
void printPresent(Plan& plan, SinkFollower& follower) {
    if (plan.lines != kAllLines) {
        for (const std::string& line : lastLines(plan, follower)) {
            printRecord(plan, line);
        }
        return;
    }
    LineFunction print = [&plan](std::string_view line) { printRecord(plan, line); };
    for (const std::string& file : filesOfSink(plan.path)) {
        if (file != plan.path) {
            readLines(file, print);
        }
    }
    follower.readNew(print);
}

ExitStatus follow(Plan& plan) {
    const std::string directory = plan.path.substr(0, plan.path.find_last_of('/'));
    const FileDescriptor watch(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
    if (::inotify_add_watch(watch.get(), directory.c_str(), IN_MODIFY | IN_CREATE | IN_MOVED_TO) < 0) {
        const int fault = errno;
        return complain(ExitStatus::failed,
                        formatted("cannot watch {}: {}", directory, describeFault(fault, directory)));
    }
    if (filesOfSink(plan.path).empty()) {
        complain(ExitStatus::done, formatted("note: there is no {} yet", plan.path));
    }
    SinkFollower follower(plan.path);
    LineFunction print = [&plan](std::string_view line) { printRecord(plan, line); };
    printPresent(plan, follower);
    while (std::fflush(stdout) == 0 && std::ferror(stdout) == 0) {
        pollfd watched[2] = {{.fd = watch.get(), .events = POLLIN, .revents = 0},
                             {.fd = STDOUT_FILENO, .events = 0, .revents = 0}};
        if (::poll(watched, 2, -1) > 0 && watched[1].revents != 0) {
            break; // nobody reads what is printed any more
        }
        char events[16 * 1024];
        while (::read(watch.get(), events, sizeof events) > 0) {
        }
        follower.readNew(print);
    }
    return ExitStatus::done;
}

ExitStatus printSummary(Plan& plan) {
    std::map<std::string, std::uint64_t> counts;
    std::uint64_t total = 0;
    LineFunction count = [&](std::string_view line) {
        if (const auto record = wantedRecord(plan, line)) {
            ++counts[nameOfRecord(*record)];
            ++total;
        }
    };
    for (const std::string& file : filesOfSink(plan.path)) {
        readLines(file, count);
    }
    if (plan.printsJson) {
        Dictionary summary;
        for (const auto& [name, number] : counts) {
            summary.set(name, number);
        }
        printLine(jsonText(summary));
        return ExitStatus::done;
    }
    std::vector<std::pair<std::string, std::uint64_t>> rows(counts.begin(), counts.end());
    std::stable_sort(rows.begin(), rows.end(),
                     [](const auto& a, const auto& b) { return a.second > b.second; });
    for (const auto& [name, number] : rows) {
        std::printf("%8llu  %s\n", static_cast<unsigned long long>(number), name.c_str());
    }
    std::printf("%8llu  in all\n", static_cast<unsigned long long>(total));
    return ExitStatus::done;
}

/// The status to exit with where the sink cannot be read.
std::optional<ExitStatus> complainOfSink(const Plan& plan) {
    const std::vector<std::string> files = filesOfSink(plan.path);
    for (const std::string& file : files.empty() ? std::vector{plan.path} : files) {
        const int fault = faultOfReading(file);
        if (fault == ENOENT && !plan.follows) {
            return complain(
                ExitStatus::failed,
                formatted("there is no {}: nothing was reported yet, or LOGS_DIRECTORY is not the service's",
                          file));
        }
        if (fault != 0 && fault != ENOENT) {
            return complain(ExitStatus::failed,
                            formatted("cannot read {}: {}", file, describeFault(fault, file)));
        }
    }
    return std::nullopt;
}

ExitStatus run(const Arguments& arguments) {
    auto made = makePlan(arguments);
    if (const auto* wrong = std::get_if<std::string>(&made)) {
        return complain(ExitStatus::usage, *wrong);
    }
    Plan& plan = std::get<Plan>(made);
    if (const auto failure = complainOfSink(plan)) {
        return *failure;
    }
    noteSessions(plan);
    if (arguments.has("--summary")) {
        return printSummary(plan);
    }
    if (plan.follows) {
        return follow(plan);
    }
    SinkFollower newest(plan.path);
    printPresent(plan, newest);
    return ExitStatus::done;
}

} // namespace

constexpr Command kCommandTail{
    "tail",
    "print what the service reported",
    "[FILE] [--lines N] [--follow] [--since TIME] [--until TIME] [--event NAME]... [--key KEY[=VALUE]]... "
    "[--reporter ID] [--summary] [--wide | --json]",
    "FILE is a report sink by name (\"tambloctl list sinks\") or by path; analytics-events when there is "
    "none.\n"
    "Metric records are shown decoded. TIME is 2026-03-01, 2026-03-01T12:00:30 (UTC, unless +02:00 "
    "follows),\n"
    "5m (so long ago; s, m, h or d), or seconds since 1970.",
    kOptions,
    run,
};

} // namespace tamblo::tools
