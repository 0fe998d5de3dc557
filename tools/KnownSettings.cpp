#include "tools/KnownSettings.h"

#include "base/Format.h"
#include "platform/Limits.h"
#include "platform/PreferenceDomains.h"

#include <algorithm>
#include <array>
#include <utility>
#include <vector>

namespace tamblo::tools {

namespace {

using enum PreferenceKind;

/// What the service takes for a limit that no preference sets: "4096", and of bytes "64 KiB".
std::string defaultText(const LimitRow& row) {
    const std::size_t number = Limits{}.*row.member;
    if (row.name.find("bytes") != std::string_view::npos) {
        for (const auto& [size, unit] : {std::pair{1U << 20U, "MiB"}, {1U << 10U, "KiB"}}) {
            if (number % size == 0) {
                return formatted("{} {}", number / size, unit);
            }
        }
    }
    return formatted("{}", number);
}

std::vector<KnownPreference> makePreferences() {
    std::vector<KnownPreference> all{
        {kAnalyticsDomain, "events_in_use", names,
         "which events are recorded, exact or with one trailing *; absent: all"},
        {kCallQualityDomain, "backends", names,
         "the back ends of call quality; absent: [\"spool\"]; empty: none"},
        {kSinksDomain, "file_mode", octalText, "permissions of the sinks' files besides the owner's"},
        {kSinksDomain, "directory_mode", octalText, "the same of their directories"},
        {kReportingDomain, "device_name", any, "reported as the device's name"},
        {kReportingDomain, "disable_reporting", flag, "read, and nothing acts on it"},
        {ZRReportingMessageKeySpatialAudioAccessoryFeatureDomain, "spatial-audio-accessory-feature", any,
         "reported as stored"},
        {kCapturesDomain, "TalvixInvalidXyBackOffSeconds", number,
         "internal builds: seconds between drafts; absent: no drafts"},
        {kCapturesDomain, "TalvixInvalidXyQLTlastRun", number,
         "the time of the last draft, which the service stores"},
        {kCapturesDomain, "enable_stackburst", flag, "internal builds: stack captures are wanted"},
        {kCapturesDomain, "io_buffer_size", number,
         "frames: the least smallest_buffer_frame_size of an overload (512)"},
        {kCapturesDomain, "io_cycle", number, "the least io_cycle of an overload (0)"},
        {kCapturesDomain, "wait_time", number, "microseconds from the message to the capture (0)"},
        {kAccessoriesDomain, "registered", object, "the accessories known, which the service stores"},
        {kExportDomain, "device_salt", any,
         "read by tambloctl export: another gives the device another identity"},
        {kPipeWireDomain, "service_types", object, "read by tamblo-pipewire: names of service types by role"},
        {kPipeWireDomain, "service_types_of_applications", object,
         "the same by application, whatever the role"},
    };
    for (const LimitRow& row : kLimitRows) {
        all.push_back({kLimitsDomain, row.name, limit, formatted("{} ({})", row.what, defaultText(row))});
    }
    all.push_back({kLimitsDomain, "report_files", limit, "summary files, and performance files (256)"});
    all.push_back({kLimitsDomain, "report_bytes", limit, "bytes of these files (256 MiB)"});
    return all;
}

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

std::span<const KnownPreference> knownPreferences() {
    static const std::vector<KnownPreference> all = makePreferences();
    return all;
}

const KnownPreference* findKnownPreference(std::string_view domain, std::string_view key) {
    const auto all = knownPreferences();
    const auto found = std::find_if(all.begin(), all.end(), [&](const KnownPreference& known) {
        return known.domain == domain && known.key == key;
    });
    return found == all.end() ? nullptr : &*found;
}

bool isServiceDomain(std::string_view domain) noexcept {
    return domain == kReportingDomain || domain.starts_with("com.vandra.tamblo.");
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
