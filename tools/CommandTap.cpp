#include "base/Format.h"
#include "base/Json.h"
#include "base/NumberText.h"
#include "base/Rfc3339.h"
#include "client/Vocabulary.h"
#include "os/FileDescriptor.h"
#include "tools/Command.h"
#include "tools/ServiceConnection.h"
#include "tools/StatusConnection.h"
#include "tools/TapLines.h"
#include "tools/records/Payload.h"

#include <array>
#include <csignal>
#include <cstdio>
#include <map>
#include <string>
#include <utility>

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {
    {.name = "--reporter",
     .value = "ID",
     .help = "only messages to this reporter",
     .letter = 'r',
     .isRepeatable = true},
    {.name = "--category",
     .value = "CATEGORY",
     .help = "only of this category, by name or number",
     .letter = 'c',
     .isRepeatable = true},
    {.name = "--type",
     .value = "TYPE",
     .help = "only of this type, by name or number",
     .letter = 't',
     .isRepeatable = true},
    {.name = "--event",
     .value = "NAME",
     .help = "only of this analytics event; a trailing * stands for anything",
     .letter = 'e',
     .isRepeatable = true},
    {.name = "--key",
     .value = "KEY[=VALUE]",
     .help = "only with this key, with the value",
     .letter = 'k',
     .isRepeatable = true},
    {.name = "--limit", .value = "N", .help = "end after so many messages", .letter = 'n'},
    {.name = "--sample", .value = "1/N", .help = "only the first of each N that match", .letter = 's'},
    kJsonOption,
    kStatusSocketOption,
};

/// The filter that the options ask for, as the service takes it; or a line that says what is wrong.
std::variant<Dictionary, std::string> makeFilter(const Arguments& arguments) {
    std::map<std::string_view, Array> lists;
    for (const std::string_view text : arguments.all("--reporter")) {
        const auto reporter = parseNumber<std::int64_t>(text);
        if (!reporter) {
            return notAReporterID(text);
        }
        lists["reporter"].emplace_back(*reporter);
    }
    for (const std::string_view text : arguments.all("--category")) {
        const auto category = client::parseCategory(text);
        if (!category) {
            return formatted("\"{}\" is no category's name or number", text);
        }
        lists["category"].emplace_back(static_cast<std::uint32_t>(*category));
    }
    for (const std::string_view text : arguments.all("--type")) {
        const auto type = client::parseType(text);
        if (!type) {
            return formatted("\"{}\" is no type's name or number", text);
        }
        lists["type"].emplace_back(static_cast<std::uint32_t>(*type));
    }
    for (const std::string_view text : arguments.all("--event")) {
        lists["event"].emplace_back(text);
    }
    Dictionary keys;
    for (const std::string_view text : arguments.all("--key")) {
        const std::size_t equals = text.find('=');
        const std::string_view key = text.substr(0, equals);
        if (equals == std::string_view::npos) {
            lists["has"].emplace_back(key);
        } else {
            const std::string_view value = text.substr(equals + 1);
            keys.set(key, Array{parseScalar(value), Value(value)});
        }
    }
    Dictionary filter;
    for (auto& [name, list] : lists) {
        filter.set(name, std::move(list));
    }
    if (!keys.empty()) {
        filter.set("keys", std::move(keys));
    }
    for (const auto& [option, name, prefix] :
         {std::array<std::string_view, 3>{"--limit", "limit", ""}, {"--sample", "sample", "1/"}}) {
        if (const auto text = arguments.last(option)) {
            const bool isPrefixed = text->starts_with(prefix);
            const auto number =
                parseNumber<std::uint64_t>(isPrefixed ? text->substr(prefix.size()) : std::string_view());
            if (!number || *number == 0) {
                return formatted("{} needs {}N, a number above 0", option, prefix);
            }
            filter.set(name, *number);
        }
    }
    return filter;
}

/// Prints the lines of a tap, for people or as they come.
class TapPrinter {
public:
    explicit TapPrinter(bool printsJson) : printsJson_(printsJson) {}

    void print(std::string_view line) {
        const auto parsed = parseJsonObject(line);
        const auto* const record = std::get_if<Dictionary>(&parsed);
        if (record == nullptr) {
            return;
        }
        if (const Value* error = record->find("error")) {
            error_ = plainText(*error);
        } else if (const Value* leftOut = record->find("left_out")) {
            leftOut_ += leftOut->unsignedValue();
            if (!printsJson_) {
                printLine(formatted("... {} messages left out", leftOut->unsignedValue()));
            }
        } else if (!printsJson_) {
            printLine(lineOf(*record));
        }
        if (printsJson_ && error_.empty()) {
            printLine(line);
        }
    }
    [[nodiscard]] const std::string& error() const noexcept { return error_; }
    [[nodiscard]] std::uint64_t leftOut() const noexcept { return leftOut_; }

private:
    [[nodiscard]] static std::string textAt(const Dictionary& record, std::string_view key) {
        const Value* const value = record.find(key);
        return value != nullptr ? plainText(*value) : std::string("-");
    }
    [[nodiscard]] static std::string lineOf(const Dictionary& record) {
        const Value* const time = record.find("time");
        const std::string origin = textAt(record, "origin");
        const std::string payload =
            record.contains("payload")
                ? textAt(record, "payload")
                : formatted("({} bytes of payload are not shown)", textAt(record, "payload_left_out"));
        return formatted(
            "{} {} {} {}{}{}", formatRfc3339(time != nullptr ? time->doubleValue() : 0).value_or("-"),
            textAt(record, "reporter"), textAt(record, "event"), origin == "message" ? std::string() : origin,
            origin == "message" ? "" : " ", payload);
    }

    const bool printsJson_;
    std::string error_;
    std::uint64_t leftOut_ = 0;
};

ExitStatus run(const Arguments& arguments) {
    const auto filter = makeFilter(arguments);
    if (const auto* wrong = std::get_if<std::string>(&filter)) {
        return complain(ExitStatus::usage, *wrong);
    }
    if (!arguments.rest().empty()) {
        return complain(ExitStatus::usage, "tap takes no arguments but options");
    }
    std::signal(SIGPIPE, SIG_IGN);
    auto connection =
        StatusConnection(arguments).send("tap " + jsonText(Value(std::get<Dictionary>(filter))));
    if (const auto* failure = std::get_if<Unreachable>(&connection)) {
        return complain(failure->status, failure->text);
    }
    TapPrinter printer(arguments.has("--json"));
    TapLineFunction print = [&printer](std::string_view line) {
        printer.print(line);
        return true;
    };
    readTap(std::get<FileDescriptor>(connection), stdout, print);
    if (!printer.error().empty()) {
        return complain(ExitStatus::failed, printer.error());
    }
    if (printer.leftOut() != 0) {
        std::fprintf(stderr, "%llu messages were left out\n",
                     static_cast<unsigned long long>(printer.leftOut()));
    }
    return ExitStatus::done;
}

} // namespace

constexpr Command kCommandTap{
    "tap",
    "print messages while they are recorded",
    "[--reporter ID]... [--category CATEGORY]... [--type TYPE]... [--event NAME]... [--key KEY[=VALUE]]... "
    "[--limit N] [--sample 1/N] [--json]",
    "The service filters, and never waits for who reads: what comes faster than it is read is left out, and "
    "how many\n"
    "messages that were is shown where they would have stood. Of several values of one option one has to "
    "match, of keys\n"
    "all. Repeats are not recorded, and not shown. Ends with Ctrl-C, and when the service ends.",
    kOptions,
    run,
};

} // namespace tamblo::tools
