#include "base/Format.h"
#include "base/Json.h"
#include "base/NumberText.h"
#include "base/Rfc3339.h"
#include "os/FileDescriptor.h"
#include "tools/Command.h"
#include "tools/Payload.h"
#include "tools/ServiceConnection.h"
#include "tools/SinkFile.h"
#include "wire/Directories.h"

#include <algorithm>
#include <cstdio>
#include <deque>
#include <map>

#include <poll.h>
#include <sys/inotify.h>
#include <unistd.h>

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {
    {.name = "--lines", .value = "N", .help = "the last N lines that match (10)", .letter = 'n'},
    {.name = "--follow",
     .value = "",
     .help = "go on with what is written from now on, through the file's renaming",
     .letter = 'f',
     .excludes = "--summary"},
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
     .help = "only lines that name this reporter (the key reporterid)",
     .letter = 'r'},
    {.name = "--summary",
     .value = "",
     .help = "print how often each event stands in the file and its predecessors, and end",
     .letter = 's',
     .excludes = "--lines"},
    {.name = "--json",
     .value = "",
     .help = "print the lines as they stand in the file, or the summary as JSON",
     .letter = 'j'},
};

struct Plan {
    std::string path;
    RecordFilter filter;
    std::size_t lines = 10;
    bool follows = false;
    bool printsJson = false;
};

std::variant<Plan, std::string> makePlan(const Arguments& arguments) {
    if (arguments.rest().size() > 1) {
        return std::string("tail takes one file");
    }
    Plan plan;
    const std::string_view typed = arguments.rest().empty() ? "analytics-events" : arguments.rest()[0];
    const auto directories = wire::Directories::ofThisProcess();
    if (directories.logs.empty()) {
        return std::string("the logs directory is not known: set LOGS_DIRECTORY");
    }
    plan.path = sinkPath(directories.logs, typed);
    if (const auto text = arguments.last("--lines")) {
        const auto lines = parseDecimalOrHex<std::uint64_t>(*text);
        if (!lines) {
            return std::string("--lines needs a number");
        }
        plan.lines = *lines;
    }
    for (const std::string_view event : arguments.all("--event")) {
        plan.filter.wantEvent(event);
    }
    for (const std::string_view key : arguments.all("--key")) {
        plan.filter.wantKey(key);
    }
    if (const auto text = arguments.last("--reporter")) {
        if (!parseNumber<std::int64_t>(*text)) {
            return formatted("\"{}\" is no reporter ID: it is a signed 64-bit number", *text);
        }
        plan.filter.wantKey("reporterid=" + std::string(*text));
    }
    plan.follows = arguments.has("--follow");
    plan.printsJson = arguments.has("--json");
    return plan;
}

/// The record in the line when it is one, and wanted.
std::optional<Dictionary> wantedRecord(const Plan& plan, std::string_view line) {
    auto record = parseJsonObject(line);
    if (auto* fields = std::get_if<Dictionary>(&record); fields != nullptr && plan.filter.accepts(*fields)) {
        return std::move(*fields);
    }
    return std::nullopt;
}

void printRecord(const Plan& plan, std::string_view line) {
    const auto record = wantedRecord(plan, line);
    if (!record) {
        return;
    }
    if (plan.printsJson) {
        printLine(line);
        return;
    }
    const Value* time = record->find("time");
    Dictionary rest = *record;
    rest.remove("time");
    rest.remove("event");
    const Value* payload = rest.find("payload");
    const bool isJustPayload = rest.size() == 1 && payload != nullptr;
    printLine(formatted("{} {} {}", formatRfc3339(time == nullptr ? 0 : time->doubleValue()).value_or("-"),
                        nameOfRecord(*record), isJustPayload ? jsonText(*payload) : jsonText(rest)));
}

/// The last lines that match, from as few of the files as have them. The follower reads the newest file, and
/// goes on right behind what was found.
std::deque<std::string> lastLines(const Plan& plan, SinkFollower& follower) {
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

ExitStatus follow(const Plan& plan) {
    const std::string directory = plan.path.substr(0, plan.path.find_last_of('/'));
    const FileDescriptor watch(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
    if (::inotify_add_watch(watch.get(), directory.c_str(), IN_MODIFY | IN_CREATE | IN_MOVED_TO) < 0) {
        return complain(ExitStatus::failed, formatted("cannot watch {}", directory));
    }
    SinkFollower follower(plan.path);
    LineFunction print = [&plan](std::string_view line) { printRecord(plan, line); };
    for (const std::string& line : lastLines(plan, follower)) {
        printRecord(plan, line);
    }
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

ExitStatus printSummary(const Plan& plan) {
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

ExitStatus run(const Arguments& arguments) {
    const auto made = makePlan(arguments);
    if (const auto* wrong = std::get_if<std::string>(&made)) {
        return complain(ExitStatus::usage, *wrong);
    }
    const Plan& plan = std::get<Plan>(made);
    if (filesOfSink(plan.path).empty() && !plan.follows) {
        return complain(
            ExitStatus::failed,
            formatted("there is no {}: nothing was reported yet, or LOGS_DIRECTORY is not the service's",
                      plan.path));
    }
    if (arguments.has("--summary")) {
        return printSummary(plan);
    }
    if (plan.follows) {
        return follow(plan);
    }
    SinkFollower newest(plan.path);
    for (const std::string& line : lastLines(plan, newest)) {
        printRecord(plan, line);
    }
    return ExitStatus::done;
}

} // namespace

constexpr Command kCommandTail{
    "tail",
    "print what the service reported",
    "[FILE] [--lines N] [--follow] [--event NAME]... [--key KEY[=VALUE]]... [--summary] [--json]",
    "FILE is a report sink by name (analytics-events, power-events, diagnostics-metrics, call-quality,\n"
    "bug-captures, bug-report-drafts, stack-captures, memory-log) or by path; analytics-events when there\n"
    "is none.",
    kOptions,
    run,
};

} // namespace tamblo::tools
