#pragma once

#include "base/Value.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

namespace tamblo::report {

/// What a message said that the timeline shows.
enum class FactKind : std::uint8_t {
    outputStarts,
    outputStops,
    inputStarts,
    inputStops,
    activityEnds, ///< a `session_duration`, which ends output and input
    volume,
    route,
    overload,
    issue,
};

struct Fact {
    double time = 0; ///< of the line
    double at = 0;   ///< when it happened, by the message's own timestamp where it has one
    Value value;     ///< the volume, the route, the issue
    FactKind kind = FactKind::issue;
};

enum class SummaryKind : std::uint8_t { output, group, input, session };

/// What a kind of summary is recognised by, and which of its keys a report shows.
struct SummaryRow {
    std::string_view name;  ///< in the page's data
    std::string_view tag;   ///< category and type together, as in `audiotag`
    std::string_view event; ///< what the analytics event's name ends with
    std::span<const std::string_view> keys;
};

namespace summary_keys {
inline constexpr std::array<std::string_view, 10> kOutput{
    "play_seconds",      "QVSessionVolume",         "QVSessionVolumeBucketed",
    "active_devices",    "session_selected_format", "mFormatID",
    "mChannelsPerFrame", "spatializationEnabled",   "spatial-audio-accessory-feature",
    "ringerstate"};
inline constexpr std::array<std::string_view, 5> kGroup{
    "play_seconds", "active_devices", "session_selected_format", "mFormatID", "mChannelsPerFrame"};
inline constexpr std::array<std::string_view, 5> kInput{
    "inputrunning_seconds", "active_devices", "vp_config_operation_mode", "vp_config_input_port", "vocoders"};
inline constexpr std::array<std::string_view, 13> kSession{
    "total_active_time",        "active_count",   "average_active_time",
    "overload_count",           "num_messages",   "num_unique_messages",
    "num_redundant_messages",   "thermal_state",  "low_power_enabled",
    "load_avg_1_min",           "load_avg_5_min", "load_avg_15_min",
    "vmInfo_phys_footprint_MiB"};
} // namespace summary_keys

/// At the numbers of `SummaryKind`.
inline constexpr std::array<SummaryRow, 4> kSummaryRows{{
    {"output", "VolumeSummary", ".Volume.Summary", summary_keys::kOutput},
    {"group", "KaleenSummary", ".Kaleen.Summary", summary_keys::kGroup},
    {"input", "InputSummary", ".Input.Summary", summary_keys::kInput},
    {"session", "Session_GenericSummary", ".Session_Generic.Summary", summary_keys::kSession},
}};

struct Summary {
    SummaryKind kind = SummaryKind::output;
    std::vector<std::optional<Value>> values; ///< in the order of the kind's keys
};

/// One run of a session, from its start to its stop, as far as the sinks tell of it.
struct Session {
    std::uint64_t serial = 0;
    Value name; ///< the call-quality file's; empty for one that was put together from events
    Value application;
    Value service;
    Value process;
    std::optional<std::int64_t> reporter;
    double began = 0; ///< its first line
    double ended = 0; ///< its last line
    bool hasStart = false;
    bool hasStop = false;
    bool isClockSetBack = false; ///< a line's time lies before that of the line before
    std::uint64_t messages = 0;
    std::vector<Fact> facts;
    std::vector<Summary> summaries;
    std::vector<std::uint64_t> keys; ///< a bit for each of the report's keys
    std::size_t bytes = 0;           ///< of memory, as far as it was counted

    void addKey(std::size_t key) {
        keys.resize(std::max(keys.size(), key / 64 + 1));
        keys[key / 64] |= std::uint64_t{1} << key % 64;
    }
};

/// Something that the device did of which no session is named.
struct DeviceEvent {
    enum class Kind : std::uint8_t { capture, cancelledCapture, stackCapture, draft };
    double time = 0;
    Kind kind = Kind::capture;
    Value text;
    Value capture; ///< its name, which its folder has, too
};

} // namespace tamblo::report
