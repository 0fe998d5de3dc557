#include "tools/export/RecordFormat.h"
#include "tools/records/SinkFile.h"

#include <algorithm>
#include <array>
#include <cmath>

namespace tamblo::tools {

namespace {

constexpr double kLatestSeconds = 9e9; ///< what fits as nanoseconds
constexpr double kTicks = 1e7;
constexpr std::uint64_t kPerTick = 100;
constexpr std::uint64_t kPerSecond = 1'000'000'000;

std::string_view textIn(const Dictionary& record, std::string_view object, std::string_view key) {
    const Value* const inner = record.find(object);
    const Value* const found = inner == nullptr ? nullptr : inner->dictionaryValue().find(key);
    return found == nullptr ? std::string_view() : found->stringValue();
}

std::string_view textOf(const Dictionary& record, std::string_view key) {
    const Value* const found = record.find(key);
    return found == nullptr ? std::string_view() : found->stringValue();
}

/// com.vandra.SERVICE.CATEGORY.TYPE, but for what is of all services.
std::string_view serviceOfEvent(std::string_view event) {
    constexpr std::string_view maker = "com.vandra.";
    if (!event.starts_with(maker)) {
        return {};
    }
    event.remove_prefix(maker.size());
    const std::string_view service = event.substr(0, event.find('.'));
    return service == "tamblo" ? std::string_view() : service;
}

} // namespace

RecordColumns::RecordColumns(const Dictionary& record)
    : event(nameOfRecord(record)), session(textOf(record, "session")) {
    const Value* const time = record.find("time");
    const double seconds = time == nullptr ? 0 : time->doubleValue();
    if (seconds > 0 && seconds < kLatestSeconds) {
        // A double has no more digits for times of today than tenths of a microsecond.
        const double whole = std::floor(seconds);
        nanoseconds = static_cast<std::uint64_t>(whole) * kPerSecond +
                      static_cast<std::uint64_t>(std::llround((seconds - whole) * kTicks)) * kPerTick;
    }
    constexpr std::array<std::array<std::string_view, 2>, 4> kApplications{
        {{"payload", "HostApplicationDisplayID"},
         {"userInfo", "HostApplicationDisplayID"},
         {"payload", "ApplicationName"},
         {"payload", "processName"}}};
    for (const auto& [object, key] : kApplications) {
        if (application.empty()) {
            application = textIn(record, object, key);
        }
    }
    service = serviceOfEvent(textOf(record, "event"));
    if (service.empty()) {
        service = textIn(record, "userInfo", "ServiceName");
    }
}

} // namespace tamblo::tools
