#include "tools/KnownSettings.h"

#include <algorithm>
#include <array>

namespace tamblo::tools {

namespace {

constexpr std::string_view kAnalytics = "com.vandra.tamblo.analytics";
constexpr std::string_view kCallQuality = "com.vandra.tamblo.callquality";
constexpr std::string_view kSinks = "com.vandra.tamblo.sinks";
constexpr std::string_view kLimits = "com.vandra.tamblo.limits";
constexpr std::string_view kCaptures = "com.vandra.tamblo.zrreporting";
constexpr std::string_view kAccessories = "com.vandra.tamblo.accessories";
constexpr std::string_view kPipeWire = "com.vandra.tamblo.pipewire";
constexpr std::string_view kReporting = "com.vandra.tamblo";
constexpr std::string_view kDashlo = "com.vandra.dashlo";

using enum PreferenceKind;

constexpr auto kPreferences = std::to_array<KnownPreference>({
    {kAnalytics, "events_in_use", names,
     "which events are recorded, exact or with one trailing *; absent: all"},
    {kCallQuality, "backends", names, "the back ends of call quality; absent: [\"spool\"]; empty: none"},
    {kSinks, "file_mode", octalText, "permissions of the sinks' files besides the owner's"},
    {kSinks, "directory_mode", octalText, "the same of their directories"},
    {kReporting, "device_name", any, "reported as the device's name"},
    {kReporting, "disable_reporting", flag, "read, and nothing acts on it"},
    {kDashlo, "spatial-audio-accessory-feature", any, "reported as stored"},
    {kCaptures, "TalvixInvalidXyBackOffSeconds", number,
     "internal builds: seconds between drafts; absent: no drafts"},
    {kCaptures, "TalvixInvalidXyQLTlastRun", number, "the time of the last draft, which the service stores"},
    {kCaptures, "enable_stackburst", flag, "internal builds: stack captures are wanted"},
    {kCaptures, "io_buffer_size", number,
     "frames: the least smallest_buffer_frame_size of an overload (512)"},
    {kCaptures, "io_cycle", number, "the least io_cycle of an overload (0)"},
    {kCaptures, "wait_time", number, "microseconds from the message to the capture (0)"},
    {kAccessories, "registered", object, "the accessories known, which the service stores"},
    {kPipeWire, "service_types", object, "read by tamblo-pipewire: names of service types by role"},
    {kPipeWire, "service_types_of_applications", object, "the same by application, whatever the role"},
    {kLimits, "reporters_of_message", limit, "reporters that a message names (128)"},
    {kLimits, "entries_of_dictionary", limit, "entries of a payload or configuration (1024)"},
    {kLimits, "key_bytes", limit, "bytes of a key (1024)"},
    {kLimits, "bytes_of_keys", limit, "bytes of all keys of a frame (64 KiB)"},
    {kLimits, "decoded_bytes_of_frame", limit, "bytes of a frame's values (4 MiB)"},
    {kLimits, "delivered_bytes_of_message", limit, "those of a message, for each reporter (16 MiB)"},
    {kLimits, "application_name_bytes", limit, "bytes of an application's name (512)"},
    {kLimits, "configuration_bytes_of_session", limit, "bytes of a session's configuration (64 KiB)"},
    {kLimits, "configuration_bytes_of_user", limit, "those of all of a user's sessions (8 MiB)"},
    {kLimits, "previous_keys_of_session", limit, "keys whose previous values a session remembers (4096)"},
    {kLimits, "sessions_of_connection", limit, "sessions of a connection (12288)"},
    {kLimits, "sessions_of_user", limit, "sessions of a user (16384)"},
    {kLimits, "connections_of_user", limit, "connections of a user (6144)"},
    {kLimits, "retained_bytes_of_user", limit, "bytes that a user's sessions retain (64 MiB)"},
    {kLimits, "retained_bytes", limit, "bytes that all sessions retain (112 MiB)"},
    {kLimits, "waiting_requests", limit, "requests of a connection that wait (1024)"},
    {kLimits, "waiting_bytes", limit, "their bytes (4 MiB)"},
    {kLimits, "waiting_bytes_of_user", limit, "those of a user's requests (8 MiB)"},
    {kLimits, "unfinished_bytes_of_user", limit, "bytes of frames that have begun (8 MiB)"},
    {kLimits, "frame_seconds", limit, "seconds without progress of such a frame (10)"},
    {kLimits, "reply_bytes", limit, "bytes of replies that a socket has refused (4 MiB)"},
    {kLimits, "reply_bytes_of_user", limit, "those of all of a user's (16 MiB)"},
    {kLimits, "report_files", limit, "summary files, and performance files (256)"},
    {kLimits, "report_bytes", limit, "their bytes (256 MiB)"},
});

constexpr auto kNotifications = std::to_array<KnownNotification>({
    {"com.vandra.tamblo.reporting", "read: preferences of com.vandra.tamblo have changed"},
    {"com.vandra.dashlo.spatial-audio-accessory-feature.changed", "read: that preference has changed"},
    {"com.vandra.dashlo.ringerstate", "read: the ringer, 1 for on"},
    {"com.vandra.tamblo.dropped-stackburst", "posted: stacks have been captured (internal builds)"},
});

bool isOctal(std::string_view text) {
    constexpr std::size_t most = 4;
    return !text.empty() && text.size() <= most &&
           std::all_of(text.begin(), text.end(), [](char digit) { return digit >= '0' && digit <= '7'; }) &&
           (text.size() < most || text.front() == '0');
}

} // namespace

std::span<const KnownPreference> knownPreferences() noexcept {
    return kPreferences;
}

const KnownPreference* findKnownPreference(std::string_view domain, std::string_view key) noexcept {
    const auto found =
        std::find_if(kPreferences.begin(), kPreferences.end(), [&](const KnownPreference& known) {
            return known.domain == domain && known.key == key;
        });
    return found == kPreferences.end() ? nullptr : &*found;
}

bool isServiceDomain(std::string_view domain) noexcept {
    return domain == kReporting || domain.starts_with("com.vandra.tamblo.");
}

bool isOfKind(PreferenceKind kind, const Value& value) {
    const auto isName = [](const Value& element) { return !element.stringValue().empty(); };
    switch (kind) {
    case any:
        return true;
    case flag:
    case number:
        return value.isNumber();
    case limit:
        return value.isNumber() && value.integerValue() > 0;
    case names:
        return value.isArray() && std::all_of(value.arrayValue().begin(), value.arrayValue().end(), isName);
    case octalText:
        return value.isString() && isOctal(value.stringValue());
    case object:
        return value.isDictionary();
    }
    return false;
}

std::string_view describe(PreferenceKind kind) noexcept {
    switch (kind) {
    case any:
        return "any value";
    case flag:
        return "true or false";
    case number:
        return "a number";
    case limit:
        return "a number above 0";
    case names:
        return "an array of texts, such as '[\"a\",\"b.*\"]'";
    case octalText:
        return "an octal text from \"0\" to \"0777\", such as '\"0640\"'";
    case object:
        return "an object";
    }
    return "";
}

std::span<const KnownNotification> knownNotifications() noexcept {
    return kNotifications;
}

} // namespace tamblo::tools
