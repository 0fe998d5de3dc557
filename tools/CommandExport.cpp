#include "base/Format.h"
#include "base/NumberText.h"
#include "tools/Command.h"
#include "tools/TimeText.h"
#include "tools/export/DeviceIdentity.h"
#include "tools/export/Exporter.h"
#include "tools/records/SinkFile.h"
#include "wire/Directories.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdio>
#include <limits>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {
    {.name = "--format", .value = "json|otlp|protobuf|columns", .help = "how records are written (json)"},
    {.name = "--cursor",
     .value = "FILE",
     .help = "go on behind what this file says was exported, and note there what is",
     .letter = 'c'},
    {.name = "--follow", .value = "", .help = "go on with what is written from now on", .letter = 'f'},
    {.name = "--batch",
     .value = "N",
     .help = "after each N records at most, wait for a line on standard input which says that they are taken",
     .letter = 'n'},
    {.name = "--newest-first", .value = "", .help = "what is newest comes first, which --follow implies"},
    {.name = "--since", .value = "TIME", .help = "only records of this time and later", .letter = 'S'},
    {.name = "--only",
     .value = "EVENT",
     .help = "only this event; a trailing * stands for anything; may be given several times",
     .letter = 'e',
     .isRepeatable = true},
    {.name = "--drop",
     .value = "KEY",
     .help = "leave this key out, wherever in a record it stands; may be given several times",
     .isRepeatable = true},
    {.name = "--hash",
     .value = "KEY",
     .help = "write a hash of the device's own in place of the key's value; may be given several times",
     .isRepeatable = true},
    {.name = "--rate", .value = "BYTES", .help = "so many bytes a second at most; also 64K, 1M"},
    {.name = "--daily", .value = "BYTES", .help = "so many bytes a day (of UTC) at most; needs --cursor"},
};

/// Bytes as people type them: 4096, 64K, 10M, 1G.
std::optional<std::uint64_t> parseBytes(std::string_view text) {
    unsigned shift = 0;
    constexpr std::array<std::pair<char, unsigned>, 3> kUnits{{{'K', 10}, {'M', 20}, {'G', 30}}};
    for (const auto& [unit, bits] : kUnits) {
        if (!text.empty() && text.back() == unit) {
            text.remove_suffix(1);
            shift = bits;
            break;
        }
    }
    const auto number = parseNumber<std::uint64_t>(text);
    const bool fits = number && *number != 0 && *number <= std::numeric_limits<std::uint64_t>::max() >> shift;
    return fits ? std::optional(*number << shift) : std::nullopt;
}

/// Reads an option that is a number; what is wrong with it, or nothing.
std::optional<std::string> takeNumber(const Arguments& arguments, std::string_view option,
                                      std::uint64_t& number) {
    const auto text = arguments.last(option);
    const auto read = text ? parseBytes(*text) : std::nullopt;
    if (text && !read) {
        return formatted("{} needs a number above 0", option);
    }
    number = read.value_or(number);
    return std::nullopt;
}

std::optional<std::string> takeSelection(const Arguments& arguments, ExportPlan& plan) {
    for (const std::string_view event : arguments.all("--only")) {
        plan.filter.wantEvent(event);
    }
    for (const std::string_view key : arguments.all("--drop")) {
        plan.redaction.drop(key);
    }
    for (const std::string_view key : arguments.all("--hash")) {
        plan.redaction.hash(key);
    }
    if (const auto text = arguments.last("--since")) {
        const auto moment = parseMoment(*text, presentTime());
        if (!moment) {
            return std::string(
                "--since needs a time: 2026-03-01T12:00, 5m (so long ago), or seconds since 1970");
        }
        plan.filter.wantSince(*moment);
    }
    return std::nullopt;
}

std::optional<std::string> takeSinks(const Arguments& arguments, std::string_view logs, ExportPlan& plan) {
    std::set<std::string> paths;
    for (const std::string_view typed : arguments.rest()) {
        const bool isPath = typed.find('/') != std::string_view::npos;
        if (!isPath && findKnownSink(typed) == nullptr) {
            return formatted(
                "\"{}\" is no report sink; \"tambloctl list sinks\" has them, and a path has a slash", typed);
        }
        paths.insert(sinkPath(logs, typed));
    }
    for (const KnownSink& sink : knownSinks()) {
        if (arguments.rest().empty()) {
            paths.insert(sinkPath(logs, sink.name));
        }
    }
    for (const std::string& path : paths) {
        const std::string name(sinkName(path));
        if (std::ranges::find(plan.sinks, name, &ExportPlan::Sink::name) != plan.sinks.end()) {
            return formatted("two sinks are called {}; the cursor and the records know them by name", name);
        }
        plan.sinks.push_back({name, path, path == sinkPath(logs, name)});
    }
    return std::nullopt;
}

std::optional<std::string> makePlan(const Arguments& arguments, std::string_view logs, ExportPlan& plan,
                                    std::uint64_t& rate) {
    const std::string_view name = arguments.last("--format").value_or("json");
    const auto format = std::ranges::find(recordFormats(), name, &FormatRow::name);
    if (format == recordFormats().end()) {
        return formatted("there is no format \"{}\": json, otlp, protobuf, columns", name);
    }
    plan.format = format->make(plan.device);
    plan.follows = arguments.has("--follow");
    plan.order = plan.follows || arguments.has("--newest-first") ? Order::newestFirst : Order::oldestFirst;
    if (arguments.has("--daily") && !arguments.has("--cursor")) {
        return std::string("--daily needs --cursor, where it is kept what went out today");
    }
    for (const auto& [option, number] :
         {std::pair{"--batch", &plan.batch}, {"--daily", &plan.bytesPerDay}, {"--rate", &rate}}) {
        if (auto wrong = takeNumber(arguments, option, *number)) {
            return wrong;
        }
    }
    if (auto wrong = takeSelection(arguments, plan)) {
        return wrong;
    }
    return takeSinks(arguments, logs, plan);
}

/// A sink that was never written to is no error, and may be a mistyped path.
void noteAbsent(const ExportPlan& plan) {
    for (const auto& sink : plan.sinks) {
        if (!sink.isOfService && filesOfSink(sink.path).empty()) {
            complain(ExitStatus::done, formatted("note: there is no {} yet", sink.path));
        }
    }
}

void tell(const Exporter::Counts& counts) {
    std::string text = formatted("{} records", counts.records);
    for (const auto& [number, what] : {std::pair{counts.unreadable, "lines that are no records"},
                                       {counts.tooLarge, "lines that are too large"},
                                       {counts.missed, "lines that are in no file any more"},
                                       {counts.left, "lines that have to wait for another day"}}) {
        if (number != 0) {
            text += formatted(", without {} {}", number, what);
        }
    }
    std::fprintf(stderr, "%s\n", text.c_str());
}

ExitStatus run(const Arguments& arguments) {
    const auto directories = wire::Directories::ofThisProcess();
    if (directories.logs.empty()) {
        return complain(ExitStatus::usage, "the logs directory is not known: set LOGS_DIRECTORY");
    }
    auto identity = DeviceIdentity::read(directories);
    if (const auto* const wrong = std::get_if<std::string>(&identity)) {
        return complain(ExitStatus::failed, *wrong);
    }
    auto& device = std::get<DeviceIdentity>(identity);
    ExportPlan plan;
    plan.device = {.name = device.name, .version = TAMBLO_VERSION};
    plan.secret = device.secret;
    plan.runtimeDirectory = directories.runtime;
    plan.redaction.setSecret(device.secret);
    std::uint64_t rate = 0;
    if (const auto wrong = makePlan(arguments, directories.logs, plan, rate)) {
        return complain(ExitStatus::usage, *wrong);
    }
    if (plan.redaction.hashes() && !device.hasSecret) {
        return complain(ExitStatus::failed,
                        "--hash needs a secret: make /etc/machine-id, or set device_salt");
    }
    Cursor cursor;
    if (const auto path = arguments.last("--cursor")) {
        auto opened = Cursor::open(std::string(*path), device.name);
        if (const auto* const wrong = std::get_if<std::string>(&opened)) {
            return complain(ExitStatus::failed, *wrong);
        }
        cursor = std::get<Cursor>(std::move(opened));
        if (cursor.wasOfOtherDevice()) {
            complain(ExitStatus::done,
                     formatted("note: {} is another device's, or of another identity of this one; what it "
                               "says of files that are here holds",
                               *path));
        }
    }
    noteAbsent(plan);
    ExportOutput output(rate);
    Exporter exporter(std::move(plan), std::move(cursor), output);
    const auto problem = exporter.run();
    tell(exporter.counts());
    return problem ? complain(ExitStatus::failed, *problem) : ExitStatus::done;
}

} // namespace

constexpr Command kCommandExport{
    "export",
    "write the sinks' lines as records for an engine, each once",
    "[SINK...] [--format json|otlp|protobuf|columns] [--cursor FILE] [--follow] [--batch N] [OPTION...]",
    "Without a sink, all are exported, their earlier files among them. Each record has an identifier, the\n"
    "same whenever it is exported. The cursor moves when the reader has taken the records: with --batch "
    "when\n"
    "it answers the empty line (of protobuf the empty message) that ends each batch with a line; else at "
    "the\n"
    "end, when the output was closed without an error. A kill loses nothing; it repeats the batch, or "
    "without\n"
    "--batch all, that was not taken. Exits with 1 when something could not be read or written.",
    kOptions,
    run,
};

} // namespace tamblo::tools
