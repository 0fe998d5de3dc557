#include "base/NumberText.h"
#include "tools/export/RecordFormat.h"
#include "tools/records/SinkFile.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstddef>
#include <string>

namespace tamblo::tools {

namespace {

constexpr double kLatestSeconds = 9e9; ///< what fits as nanoseconds; earlier ones than 1 are no times

/// By the digits that the line has, and not by those of the double next to them.
std::uint64_t nanosecondsOf(double seconds) {
    if (!(seconds >= 1 && seconds < kLatestSeconds)) {
        return 0;
    }
    constexpr std::size_t kDigits = 9;
    std::array<char, 64> text{};
    const auto written =
        std::to_chars(text.data(), text.data() + text.size(), seconds, std::chars_format::fixed);
    const std::string_view number(text.data(), static_cast<std::size_t>(written.ptr - text.data()));
    const std::size_t point = std::min(number.find('.'), number.size());
    std::string digits(number.substr(0, point));
    if (point != number.size()) {
        digits += number.substr(point + 1, kDigits);
    }
    digits.append(point + kDigits - digits.size(), '0');
    return parseNumber<std::uint64_t>(digits).value_or(0);
}

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
    nanoseconds = nanosecondsOf(seconds);
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
