#include "base/Rfc3339.h"

#include <chrono>
#include <cmath>
#include <cstdint>
#include <string_view>

namespace tamblo {

namespace {

using std::chrono::days;
using std::chrono::sys_days;
using std::chrono::year_month_day;

constexpr std::int64_t kSecondsPerDay = 86'400;

constexpr std::int64_t daysSince1970(int year, unsigned month, unsigned day) {
    const year_month_day date{std::chrono::year(year), std::chrono::month(month), std::chrono::day(day)};
    return sys_days(date).time_since_epoch().count();
}

constexpr std::int64_t kFirstSecond = daysSince1970(0, 1, 1) * kSecondsPerDay;
constexpr std::int64_t kSecondBehindLast = daysSince1970(10'000, 1, 1) * kSecondsPerDay;

void writeDigits(char* at, std::size_t count, unsigned number) noexcept {
    for (; count != 0; number /= 10) {
        at[--count] = static_cast<char>('0' + number % 10);
    }
}

} // namespace

std::optional<std::string> formatRfc3339(double secondsSince1970) {
    if (!(secondsSince1970 >= static_cast<double>(kFirstSecond - 1) &&
          secondsSince1970 < static_cast<double>(kSecondBehindLast))) {
        return std::nullopt;
    }
    const double whole = std::floor(secondsSince1970);
    auto seconds = static_cast<std::int64_t>(whole);
    auto milliseconds = static_cast<unsigned>(std::lround((secondsSince1970 - whole) * 1000));
    if (milliseconds == 1000) {
        milliseconds = 0;
        ++seconds;
    }
    if (seconds < kFirstSecond || seconds >= kSecondBehindLast) {
        return std::nullopt;
    }
    const auto day = std::chrono::floor<days>(std::chrono::sys_seconds(std::chrono::seconds(seconds)));
    const year_month_day date(day);
    const auto ofDay = static_cast<unsigned>(seconds - day.time_since_epoch().count() * kSecondsPerDay);

    std::string text = "0000-00-00T00:00:00.000Z";
    writeDigits(&text[0], 4, static_cast<unsigned>(static_cast<int>(date.year())));
    writeDigits(&text[5], 2, static_cast<unsigned>(date.month()));
    writeDigits(&text[8], 2, static_cast<unsigned>(date.day()));
    writeDigits(&text[11], 2, ofDay / 3600);
    writeDigits(&text[14], 2, ofDay / 60 % 60);
    writeDigits(&text[17], 2, ofDay % 60);
    writeDigits(&text[20], 3, milliseconds);
    return text;
}

std::optional<std::string> formatRfc3339Date(double secondsSince1970) {
    constexpr std::string_view kFullDate = "0000-00-00";
    auto text = formatRfc3339(secondsSince1970);
    if (text) {
        text->resize(kFullDate.size());
    }
    return text;
}

} // namespace tamblo
