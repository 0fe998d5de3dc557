#include "tools/StatusScreen.h"

#include "base/Format.h"
#include "base/Json.h"
#include "base/Rfc3339.h"
#include "tools/Table.h"

#include <algorithm>
#include <functional>
#include <map>
#include <ranges>
#include <utility>

namespace tamblo::tools {

namespace {

using Align = Table::Align;

const Value& member(const Value& object, std::string_view name) {
    return StatusDocument::member(object, name);
}

bool isPresent(const Value& object, std::string_view name) {
    return object.isDictionary() && object.dictionaryValue().contains(name);
}

double numberOf(const Value& object, std::string_view name) {
    return member(object, name).doubleValue();
}

void append(std::vector<std::string>& lines, const Table& table) {
    lines.emplace_back();
    for (std::string& line : table.lines()) {
        lines.push_back(std::move(line));
    }
}

/// The sum of a family's counters.
std::uint64_t sumOf(const StatusDocument& document, std::string_view family) {
    std::uint64_t sum = 0;
    for (const Value& row : member(document["counters"], family).arrayValue()) {
        sum += member(row, "value").unsignedValue();
    }
    return sum;
}

std::string fill(const Value& limit) {
    const double value = numberOf(limit, "value");
    return isPresent(limit, "used") && value > 0
               ? formatted("{} %", fixed(numberOf(limit, "used") / value * 100, 1))
               : "";
}

bool isOfInterest(const Value& limit) {
    return numberOf(limit, "used") > 0 || numberOf(limit, "hits") > 0 ||
           member(limit, "source").stringValue() != "default";
}

Table limitsTable(const StatusDocument& document) {
    Table table({{"LIMIT"},
                 {"VALUE", Align::right},
                 {"USED", Align::right},
                 {"FILL", Align::right},
                 {"HITS", Align::right},
                 {"FROM", Align::left, 60}});
    for (const Value& limit : document["limits"].arrayValue()) {
        if (isOfInterest(limit)) {
            table.add({textOf(limit, "name"), textOf(limit, "value"), textOf(limit, "used"), fill(limit),
                       textOf(limit, "hits"), textOf(limit, "source")});
        }
    }
    return table;
}

Table sinksTable(const StatusDocument& document) {
    Table table({{"SINK"},
                 {"STATE"},
                 {"SIZE", Align::right},
                 {"LINES", Align::right},
                 {"OUTAGES", Align::right},
                 {"LOST", Align::right}});
    for (const Value& sink : document["sinks"].arrayValue()) {
        table.add({textOf(sink, "name"), textOf(sink, "state"), bytesText(numberOf(sink, "size")),
                   textOf(sink, "lines"), textOf(sink, "outages"), textOf(sink, "lost_lines")});
    }
    return table;
}

/// The programs that are clients, those with the most processes first, as in ": player (3), tamblo-pipewire".
std::string programsText(const StatusDocument& clients) {
    constexpr std::size_t kMostPrograms = 8;
    std::map<std::string, std::size_t> counts;
    for (const Value& client : clients["clients"].arrayValue()) {
        ++counts[textOf(client, "process")];
    }
    std::vector<std::pair<std::string, std::size_t>> programs(counts.begin(), counts.end());
    std::ranges::stable_sort(programs, std::ranges::greater(), &std::pair<std::string, std::size_t>::second);
    std::string text;
    for (const auto& [name, number] : programs | std::views::take(kMostPrograms)) {
        text += formatted("{}{}", text.empty() ? ": " : ", ", harmless(name, 32));
        text += number > 1 ? formatted(" ({})", number) : "";
    }
    if (programs.size() > kMostPrograms) {
        text += formatted(" and {} other programs", programs.size() - kMostPrograms);
    }
    return text;
}

void appendHead(std::vector<std::string>& lines, const StatusDocument& document,
                const StatusDocument& clients) {
    const Value& all = document.value;
    lines.push_back(formatted("tamblod {}, up {} (pid {}, user {}), {} in memory", textOf(all, "version"),
                              durationText(numberOf(all, "uptime")), textOf(all, "pid"), textOf(all, "uid"),
                              bytesText(numberOf(all, "resident_bytes"))));
    lines.push_back(formatted("{} clients{}", textOf(all, "clients"), programsText(clients)));
    lines.push_back(formatted("{} sessions, {} retained", textOf(all, "sessions"),
                              bytesText(numberOf(all, "retained_bytes"))));
    lines.push_back(formatted(
        "messages: {} received, {} recorded, {} redundant, {} refused, {} lost; counted "
        "for {}",
        sumOf(document, "messages_received"), sumOf(document, "messages_recorded"),
        sumOf(document, "messages_redundant"), sumOf(document, "messages_refused"),
        sumOf(document, "messages_lost"),
        durationText(numberOf(all, "started") + numberOf(all, "uptime") - numberOf(all, "counters_began"))));
}

void appendErrors(std::vector<std::string>& lines, const StatusDocument& document) {
    const auto errors = document["last_errors"].arrayValue();
    lines.emplace_back();
    lines.emplace_back(errors.empty() ? "no errors since the start" : "last errors:");
    for (const Value& error : errors) {
        lines.push_back(formatted("  {} {} {}", formatRfc3339(numberOf(error, "time")),
                                  textOf(error, "category"),
                                  harmless(member(error, "text").stringValue(), 200)));
    }
}

/// Nothing for a session that was never started.
std::string lengthText(const Value& session) {
    return isPresent(session, "length") ? durationText(numberOf(session, "length")) : "";
}

} // namespace

std::string textOf(const Value& object, std::string_view name) {
    const Value* const found = object.isDictionary() ? object.dictionaryValue().find(name) : nullptr;
    if (found == nullptr) {
        return "";
    }
    return found->isString() ? std::string(found->stringValue()) : jsonText(*found);
}

std::vector<std::string> statusLines(const StatusDocument& document, const StatusDocument& clients) {
    std::vector<std::string> lines;
    appendHead(lines, document, clients);
    Table settings({{"SETTING"}, {"VALUE", Align::left, 60}, {"FROM", Align::left, 60}});
    for (const Value& setting : document["settings"].arrayValue()) {
        settings.add({textOf(setting, "name"), textOf(setting, "value"), textOf(setting, "source")});
    }
    append(lines, settings);
    append(lines, sinksTable(document));
    for (const Value& directory : document["directories_out"].arrayValue()) {
        lines.push_back(formatted("{} cannot be written", directory.stringValue()));
    }
    const Table limits = limitsTable(document);
    if (!limits.empty()) {
        append(lines, limits);
    }
    if (!document["is_complete"].boolValue()) {
        lines.emplace_back("the server queue did not answer: what users have of their limits is not known");
    }
    appendErrors(lines, document);
    return lines;
}

std::vector<std::string> clientLines(const StatusDocument& document) {
    Table table({{"PID", Align::right},
                 {"UID", Align::right},
                 {"PROCESS"},
                 {"SESSIONS", Align::right},
                 {"STARTED", Align::right},
                 {"MESSAGES", Align::right},
                 {"BYTES", Align::right},
                 {"SECONDS", Align::right},
                 {"RETAINED", Align::right}});
    for (const Value& client : document["clients"].arrayValue()) {
        table.add({textOf(client, "pid"), textOf(client, "uid"), textOf(client, "process"),
                   textOf(client, "sessions"), textOf(client, "started_sessions"), textOf(client, "messages"),
                   bytesText(numberOf(client, "bytes")),
                   formatted("{}", fixed(numberOf(client, "seconds"), 3)),
                   bytesText(numberOf(client, "retained_bytes"))});
    }
    return table.lines();
}

std::vector<std::string> sessionLines(const StatusDocument& document) {
    Table table({{"REPORTER", Align::right},
                 {"PID", Align::right},
                 {"PROCESS"},
                 {"APPLICATION"},
                 {"SERVICE"},
                 {"STATE"},
                 {"LENGTH", Align::right},
                 {"MESSAGES", Align::right},
                 {"RECORDED", Align::right},
                 {"BYTES", Align::right},
                 {"SECONDS", Align::right},
                 {"RETAINED", Align::right}});
    for (const Value& session : document["sessions"].arrayValue()) {
        table.add({textOf(session, "reporter"), textOf(session, "pid"), textOf(session, "process"),
                   textOf(session, "application"), textOf(session, "service"), textOf(session, "state"),
                   lengthText(session), textOf(session, "messages"), textOf(session, "recorded"),
                   bytesText(numberOf(session, "bytes")),
                   formatted("{}", fixed(numberOf(session, "seconds"), 3)),
                   bytesText(numberOf(session, "retained_bytes"))});
    }
    return table.lines();
}

std::vector<std::string> sessionDetailLines(const StatusDocument& document) {
    std::vector<std::string> lines;
    for (const Value& session : document["sessions"].arrayValue()) {
        if (!lines.empty()) {
            lines.emplace_back();
        }
        lines.push_back(formatted("reporter {} of {} (pid {}, user {}): {}, {}", textOf(session, "reporter"),
                                  harmless(textOf(session, "process"), 64), textOf(session, "pid"),
                                  textOf(session, "uid"), textOf(session, "service"),
                                  textOf(session, "state")));
        lines.push_back(
            formatted("messages: {}, of which {} are recorded since the last stop and {} of these "
                      "let go; {} retained",
                      textOf(session, "messages"), textOf(session, "recorded"), textOf(session, "dropped"),
                      bytesText(numberOf(session, "retained_bytes"))));
        std::string workers;
        for (const Value& worker : member(session, "workers").arrayValue()) {
            workers.append(workers.empty() ? "" : ", ").append(worker.stringValue());
        }
        lines.push_back(formatted("workers: {}", workers));
        if (isPresent(session, "start")) {
            lines.push_back(formatted("started: {}, for {}",
                                      formatRfc3339(numberOf(session, "start")).value_or("-"),
                                      lengthText(session)));
        }
        if (isPresent(session, "values_left_out")) {
            lines.push_back(
                formatted("{} values that take too much are not shown", textOf(session, "values_left_out")));
        }
        const std::pair<std::string_view, std::string_view> kParts[] = {
            {"CONFIGURATION", "configuration"}, {"LATEST VALUE OF", "previous_values"}};
        for (const auto& [title, name] : kParts) {
            const Dictionary& values = member(session, name).dictionaryValue();
            Table table({{title}, {"VALUE", Align::left, 100}});
            for (std::size_t i = 0; i != values.size(); ++i) {
                table.add({std::string(values.keyAt(i)), jsonText(values.valueAt(i))});
            }
            if (!table.empty()) {
                append(lines, table);
            }
        }
    }
    return lines;
}

} // namespace tamblo::tools
