#include "tools/SessionSummaries.h"

#include "base/Format.h"
#include "tools/Table.h"
#include "tools/records/AccessFault.h"
#include "tools/records/Payload.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <optional>
#include <utility>

namespace tamblo::tools {

namespace {

constexpr std::string_view kNothing = "-";

/// How a value stands in a table.
enum class Style : std::uint8_t { text, number, seconds, yesOrNo, place };

struct Column {
    std::string_view heading;
    std::string_view key;
    Style style;
    std::size_t widest = 12;
};

constexpr Column kOutputColumns[] = {
    {"#", "msgidx", Style::place},
    {"seconds", "play_seconds", Style::seconds},
    {"class", "play_secondsBucketed", Style::number},
    {"volume", "QVSessionVolume", Style::number},
    {"class", "QVSessionVolumeBucketed", Style::number},
    {"format", "session_selected_format", Style::text, 24},
    {"id", "mFormatID", Style::text, 7},
    {"ch", "mChannelsPerFrame", Style::number},
    {"devices", "active_devices", Style::text, 29},
    {"spat.", "spatializationEnabled", Style::yesOrNo},
    {"acc.", "spatial-audio-accessory-feature", Style::yesOrNo},
    {"ring", "ringerstate", Style::yesOrNo},
};

constexpr Column kGroupColumns[] = {
    {"#", "msgidx", Style::place},
    {"seconds", "play_seconds", Style::seconds},
    {"class", "play_secondsBucketed", Style::number},
    {"format", "session_selected_format", Style::text, 32},
    {"id", "mFormatID", Style::text, 8},
    {"ch", "mChannelsPerFrame", Style::number},
    {"devices", "active_devices", Style::text, 32},
};

constexpr Column kInputColumns[] = {
    {"#", "msgidx", Style::place},
    {"seconds", "inputrunning_seconds", Style::seconds},
    {"class", "inputrunning_secondsBucketed", Style::number},
    {"devices", "active_devices", Style::text, 29},
    {"mode", "vp_config_operation_mode", Style::text, 18},
    {"port", "vp_config_input_port", Style::text, 27},
    {"vocoders", "vocoders", Style::text, 32},
};

/// What the session's own summary says, in lines of a few values each.
struct Entry {
    std::string_view line; ///< the heading of the line that begins here
    Column value;
};

constexpr Entry kSessionEntries[] = {
    {"reported", {"by", "HostApplicationDisplayID", Style::text, 48}},
    {"", {"process", "clientProcessName", Style::text, 16}},
    {"", {"as", "summaryServiceName", Style::text, 24}},
    {"", {"single-message", "singleMessageSession", Style::yesOrNo}},
    {"messages", {"all", "num_messages", Style::number}},
    {"", {"unique", "num_unique_messages", Style::number}},
    {"", {"redundant", "num_redundant_messages", Style::number}},
    {"activity", {"seconds", "total_active_time", Style::seconds}},
    {"", {"periods", "active_count", Style::number}},
    {"", {"average", "average_active_time", Style::seconds}},
    {"", {"overloads", "overload_count", Style::number}},
    {"device", {"thermal state", "thermal_state", Style::text, 16}},
    {"", {"low power", "low_power_enabled", Style::yesOrNo}},
    {"service", {"memory MiB", "vmInfo_phys_footprint_MiB", Style::number}},
    {"load", {"1 min", "load_avg_1_min", Style::seconds}},
    {"", {"5 min", "load_avg_5_min", Style::seconds}},
    {"", {"15 min", "load_avg_15_min", Style::seconds}},
};

/// The kinds, in the order in which a stop writes them.
struct Kind {
    std::string_view event;
    std::string_view title;
    std::span<const Column> columns; ///< none: the session's own summary, of which a stop writes one
};

constexpr Kind kKinds[] = {
    {"com.vandra.tamblo.Volume.Summary", "output", kOutputColumns},
    {"com.vandra.tamblo.Kaleen.Summary", "group session", kGroupColumns},
    {"com.vandra.tamblo.Session_Generic.Summary", "session", {}},
    {"com.vandra.tamblo.Input.Summary", "input", kInputColumns},
};

const Kind* kindOf(std::string_view event) noexcept {
    const auto* const found = std::ranges::find(kKinds, event, &Kind::event);
    return found != std::end(kKinds) ? found : nullptr;
}

const Value& valueOf(const Dictionary& payload, std::string_view key) {
    static const Value nothing(kNothing);
    const Value* value = payload.find(key);
    return value != nullptr ? *value : nothing;
}

std::string cellOf(const Dictionary& payload, const Column& column) {
    const Value* value = payload.find(column.key);
    if (value == nullptr) {
        return std::string(kNothing);
    }
    if (column.style == Style::seconds && value->isNumber()) {
        return formatted("{}", fixed(value->doubleValue(), 2));
    }
    if (column.style == Style::yesOrNo && value->isNumber()) {
        return value->boolValue() ? "yes" : "no";
    }
    if (column.style == Style::place) {
        return plainText(*value) + "/" + plainText(valueOf(payload, "msgcnt"));
    }
    return harmless(plainText(*value), column.widest);
}

void appendTable(std::string& out, std::span<const Column> columns,
                 const std::vector<const Dictionary*>& payloads) {
    std::vector<Table::Column> headings;
    for (const Column& column : columns) {
        const bool isToTheLeft = column.style == Style::text || column.style == Style::yesOrNo;
        headings.push_back({column.heading, isToTheLeft ? Table::Align::left : Table::Align::right});
    }
    Table table(std::move(headings));
    for (const Dictionary* payload : payloads) {
        std::vector<std::string> cells;
        for (const Column& column : columns) {
            cells.push_back(cellOf(*payload, column));
        }
        table.add(std::move(cells));
    }
    for (const std::string& line : table.lines()) {
        out.append("  ").append(line, 0, line.find_last_not_of(' ') + 1).append("\n");
    }
}

void appendEntries(std::string& out, const Dictionary& payload) {
    constexpr std::size_t kHeadingWidth = 8;
    std::string line;
    for (const auto& [heading, value] : kSessionEntries) {
        if (!heading.empty() && !line.empty()) {
            out.append(line).append("\n");
            line.clear();
        }
        if (!heading.empty()) {
            line.append("  ").append(heading).append(kHeadingWidth - heading.size(), ' ');
        }
        line.append("  ").append(value.heading).append(" ").append(cellOf(payload, value));
    }
    out.append(line).append("\n");
}

/// Whether the summary cannot be of the stop whose last one was `last`.
bool beginsNextStop(const SessionSummary& last, const SessionSummary& summary) {
    const Kind* const before = kindOf(last.event);
    const Kind* const kind = kindOf(summary.event);
    if (kind != before) {
        return kind < before;
    }
    return kind->columns.empty() || valueOf(summary.payload, "msgidx") == Value(1);
}

std::vector<std::span<const SessionSummary>> stopsOf(std::span<const SessionSummary> written) {
    std::vector<std::span<const SessionSummary>> stops;
    std::size_t begin = 0;
    for (std::size_t i = 1; i <= written.size(); ++i) {
        if (i == written.size() || beginsNextStop(written[i - 1], written[i])) {
            stops.push_back(written.subspan(begin, i - begin));
            begin = i;
        }
    }
    return stops;
}

bool isOf(const StoppedSession& session, std::span<const SessionSummary> stop) {
    return std::ranges::any_of(stop, [&session](const SessionSummary& summary) {
        const Dictionary& payload = summary.payload;
        return kindOf(summary.event)->columns.empty() &&
               valueOf(payload, "HostApplicationDisplayID") == session.application &&
               valueOf(payload, "summaryServiceName") == Value(session.serviceName) &&
               valueOf(payload, "num_messages").doubleValue() >= static_cast<double>(session.messages);
    });
}

std::optional<SessionSummary> summaryIn(std::string_view line) {
    // A sink has many lines that are none; they are told apart without being read.
    if (line.find(".Summary\"") == std::string_view::npos) {
        return std::nullopt;
    }
    const auto record = parseJsonObject(line);
    const auto* fields = std::get_if<Dictionary>(&record);
    const Value* event = fields != nullptr ? fields->find("event") : nullptr;
    const Value* payload = fields != nullptr ? fields->find("payload") : nullptr;
    if (event == nullptr || payload == nullptr || !payload->isDictionary() ||
        kindOf(event->stringValue()) == nullptr) {
        return std::nullopt;
    }
    return SessionSummary{std::string(event->stringValue()), payload->dictionaryValue()};
}

} // namespace

std::vector<SessionSummary> summariesOf(const StoppedSession& session,
                                        std::span<const SessionSummary> written) {
    const auto stops = stopsOf(written);
    if (stops.empty()) {
        return {};
    }
    const auto found = std::find_if(stops.rbegin(), stops.rend(),
                                    [&session](const auto& stop) { return isOf(session, stop); });
    const auto& chosen = found != stops.rend() ? *found : stops.back();
    return {chosen.begin(), chosen.end()};
}

std::string summaryTables(std::span<const SessionSummary> summaries) {
    std::string text;
    for (const Kind& kind : kKinds) {
        std::vector<const Dictionary*> payloads;
        for (const SessionSummary& summary : summaries) {
            if (summary.event == kind.event) {
                payloads.push_back(&summary.payload);
            }
        }
        if (payloads.empty()) {
            continue;
        }
        appendFormatted(text, "\n{}  ({})\n", kind.title, kind.event);
        if (kind.columns.empty()) {
            appendEntries(text, *payloads[0]);
        } else {
            appendTable(text, kind.columns, payloads);
        }
    }
    text.resize(text.find_last_not_of('\n') + 1);
    return text;
}

SummaryReader::SummaryReader(const std::string& logsDirectory)
    : path_(logsDirectory + "/analytics-events.jsonl"), sink_(path_) {
    sink_.skipToEnd();
}

std::variant<std::vector<SessionSummary>, std::string> SummaryReader::read(const StoppedSession& session) {
    std::vector<SessionSummary> written;
    LineFunction take = [&written](std::string_view line) {
        if (auto summary = summaryIn(line)) {
            written.push_back(*std::move(summary));
        }
    };
    sink_.readNew(take);
    if (!written.empty()) {
        return summariesOf(session, written);
    }
    if (const int fault = faultOfReading(path_)) {
        return formatted("no summaries: cannot read {}: {}", path_, describeFault(fault, path_));
    }
    return formatted("no summaries: none came to {}; the preference events_in_use leaves them out, or the "
                     "service writes elsewhere",
                     path_);
}

} // namespace tamblo::tools
