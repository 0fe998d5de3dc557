#include "base/Format.h"
#include "base/Json.h"
#include "tools/Command.h"
#include "tools/KnownSettings.h"
#include "tools/ServiceConnection.h"
#include "tools/Table.h"
#include "tools/records/SinkFile.h"
#include "wire/LogCodes.h"
#include "wire/Vocabulary.h"

#include <algorithm>
#include <string>
#include <vector>

namespace tamblo::tools {

namespace {

constexpr Option kOptions[] = {kJsonOption};

/// What is listed, as rows of a table with a heading for each column.
struct Listing {
    std::vector<std::string_view> columns;
    std::vector<std::vector<Value>> rows{};
};

std::string asHexadecimal(std::uint32_t number) {
    constexpr unsigned digits = 8;
    return formatted("0x{}", hexadecimal(number, digits));
}

Listing categories() {
    Listing listing{{"name", "number", "hexadecimal"}};
    const auto add = [&listing](wire::Subsystem subsystem) {
        for (std::uint32_t kind = 1; kind < wire::kKindNames.size(); ++kind) {
            const auto category = client::category(subsystem, static_cast<wire::EventKind>(kind));
            const auto number = static_cast<std::uint32_t>(category);
            listing.rows.push_back({client::categoryName(category), number, asHexadecimal(number)});
        }
    };
    add(wire::Subsystem::none);
    for (const auto& [subsystem, name] : wire::kSubsystemNames) {
        add(subsystem);
    }
    return listing;
}

Listing numbered(std::span<const std::string_view> names) {
    Listing listing{{"name", "number"}};
    for (std::size_t i = 0; i < names.size(); ++i) {
        listing.rows.push_back({names[i], i});
    }
    return listing;
}

Listing types() {
    return numbered(wire::kTypeNames);
}

Listing serviceTypes() {
    return numbered(wire::kServiceNames);
}

Listing sinks() {
    Listing listing{{"name", "reporters", "what"}};
    for (const KnownSink& sink : knownSinks()) {
        listing.rows.push_back({sink.name, sink.namesReporter ? "named" : "-", sink.what});
    }
    return listing;
}

Listing preferences() {
    Listing listing{{"domain", "key", "value", "what"}};
    for (const KnownPreference& known : knownPreferences()) {
        listing.rows.push_back({known.domain, known.key, describe(known.kind), known.what});
    }
    return listing;
}

Listing notifications() {
    Listing listing{{"name", "what"}};
    for (const KnownNotification& known : knownNotifications()) {
        listing.rows.push_back({known.name, known.what});
    }
    return listing;
}

Listing logCodes() {
    Listing listing{{"code", "what"}};
    for (const wire::LogCode& row : wire::kLogCodes) {
        listing.rows.push_back({row.code, row.what});
    }
    return listing;
}

struct Subject {
    std::string_view name;
    Listing (*list)();
};

constexpr Subject kSubjects[] = {
    {"categories", categories},      {"types", types},
    {"service-types", serviceTypes}, {"sinks", sinks},
    {"preferences", preferences},    {"notifications", notifications},
    {"log-codes", logCodes},
};

std::string cellText(const Value& value) {
    return value.isString() ? std::string(value.stringValue()) : jsonText(value);
}

void printTable(const Listing& listing) {
    std::vector<Table::Column> columns;
    columns.reserve(listing.columns.size());
    for (const std::string_view name : listing.columns) {
        columns.push_back({.name = name, .most = std::string::npos});
    }
    Table table(std::move(columns));
    for (const auto& row : listing.rows) {
        std::vector<std::string> cells;
        std::transform(row.begin(), row.end(), std::back_inserter(cells), cellText);
        table.add(std::move(cells));
    }
    for (const std::string& line : table.lines()) {
        printLine(line);
    }
}

void printJson(const Listing& listing) {
    Array array;
    for (const auto& row : listing.rows) {
        Dictionary object;
        for (std::size_t i = 0; i < row.size(); ++i) {
            object.set(listing.columns[i], row[i]);
        }
        array.emplace_back(std::move(object));
    }
    printLine(jsonText(Value(std::move(array))));
}

ExitStatus run(const Arguments& arguments) {
    const auto& words = arguments.rest();
    const auto* const subject =
        words.size() != 1 ? std::end(kSubjects)
                          : std::find_if(std::begin(kSubjects), std::end(kSubjects),
                                         [&](const Subject& known) { return known.name == words[0]; });
    if (subject == std::end(kSubjects)) {
        std::string names;
        for (const Subject& known : kSubjects) {
            names.append(names.empty() ? "" : ", ").append(known.name);
        }
        return complain(ExitStatus::usage, formatted("list needs one of: {}", names));
    }
    const Listing listing = subject->list();
    if (arguments.has("--json")) {
        printJson(listing);
    } else {
        printTable(listing);
    }
    return ExitStatus::done;
}

} // namespace

constexpr Command kCommandList{
    "list",
    "list the words and numbers that the service knows",
    "categories | types | service-types | sinks | preferences | notifications | log-codes",
    "Needs no service. The number of a category is its subsystem's (0x08000000 for Session) and its kind's.",
    kOptions,
    run,
};

} // namespace tamblo::tools
