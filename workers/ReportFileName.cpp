#include "workers/ReportFileName.h"

#include "base/Format.h"
#include "base/Utf8.h"
#include "util/Log.h"

#include <algorithm>
#include <chrono>

namespace tamblo {

namespace {

/// What a file system takes as a name, in bytes.
constexpr std::size_t kLongestFileName = 255;

void appendDigits(std::string& out, std::int64_t number, std::size_t width) {
    const std::string digits = std::to_string(number);
    out.append(width - std::min(width, digits.size()), '0');
    out += digits;
}

/// "yyyyMMdd-HHmmss" and the offset as hours and minutes.
std::string timeInFileName(WallTime time, std::chrono::seconds utcOffset) {
    const auto local = std::chrono::floor<std::chrono::seconds>(time + utcOffset);
    const auto day = std::chrono::floor<std::chrono::days>(local);
    const std::chrono::year_month_day date(day);
    const std::chrono::hh_mm_ss ofDay(local - day);
    std::string text;
    appendDigits(text, static_cast<int>(date.year()), 4);
    appendDigits(text, static_cast<unsigned>(date.month()), 2);
    appendDigits(text, static_cast<unsigned>(date.day()), 2);
    text += '-';
    appendDigits(text, ofDay.hours().count(), 2);
    appendDigits(text, ofDay.minutes().count(), 2);
    appendDigits(text, ofDay.seconds().count(), 2);
    const std::int64_t minutes =
        std::chrono::floor<std::chrono::minutes>(std::chrono::abs(utcOffset)).count();
    text += utcOffset < std::chrono::seconds(0) ? '-' : '+';
    appendDigits(text, minutes / 60 * 100 + minutes % 60, 4);
    return text;
}

/// What a client names so stays one part of one file name.
std::string asPartOfFileName(std::string name, std::size_t longest) {
    if (name.size() > longest) {
        while (longest > 0 && isUtf8Continuation(name[longest])) {
            --longest;
        }
        name.resize(longest);
    }
    std::replace_if(
        name.begin(), name.end(),
        [](char character) {
            return character == '/' || static_cast<unsigned char>(character) < 0x20 || character == 0x7F;
        },
        '_');
    return name;
}

} // namespace

std::string reportFileName(WallTime time, std::chrono::seconds utcOffset, std::int64_t reporterID,
                           const Value& applicationName, std::string_view serviceName) {
    const std::string before = formatted("{}-{}-", timeInFileName(time, utcOffset), reporterID);
    const std::string behind = formatted("-{}.json", serviceName);
    return before +
           asPartOfFileName(formatted("{}", applicationName),
                            kLongestFileName - before.size() - behind.size()) +
           behind;
}

} // namespace tamblo
