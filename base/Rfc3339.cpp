#include "base/Rfc3339.h"

#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdint>

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

/// A cursor over the text; whatever is missing leaves it failed.
class Cursor {
public:
    explicit Cursor(std::string_view text) noexcept : rest_(text) {}

    [[nodiscard]] bool completed() const noexcept { return good_ && rest_.empty(); }

    int digits(std::size_t count, int least, int most) noexcept {
        int number = 0;
        for (std::size_t i = 0; i < count; ++i) {
            const char digit = next();
            good_ = good_ && digit >= '0' && digit <= '9';
            number = good_ ? number * 10 + (digit - '0') : 0;
        }
        good_ = good_ && number >= least && number <= most;
        return number;
    }
    char oneOf(std::string_view characters) noexcept {
        const char character = next();
        good_ = good_ && characters.find(character) != std::string_view::npos;
        return character;
    }
    double fraction() noexcept {
        if (!rest_.starts_with('.')) {
            return 0;
        }
        std::size_t length = 1;
        while (length < rest_.size() && rest_[length] >= '0' && rest_[length] <= '9') {
            ++length;
        }
        double fraction = 0;
        const auto result = std::from_chars(rest_.data(), rest_.data() + length, fraction);
        good_ = good_ && length > 1 && result.ptr == rest_.data() + length;
        rest_.remove_prefix(length);
        return fraction;
    }

private:
    char next() noexcept {
        if (rest_.empty()) {
            good_ = false;
            return '\0';
        }
        const char character = rest_.front();
        rest_.remove_prefix(1);
        return character;
    }

    std::string_view rest_;
    bool good_ = true;
};

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

std::optional<double> parseRfc3339(std::string_view text) {
    Cursor cursor(text);
    const int year = cursor.digits(4, 0, 9999);
    cursor.oneOf("-");
    const int month = cursor.digits(2, 1, 12);
    cursor.oneOf("-");
    const int day = cursor.digits(2, 1, 31);
    cursor.oneOf("Tt");
    const int hour = cursor.digits(2, 0, 23);
    cursor.oneOf(":");
    const int minute = cursor.digits(2, 0, 59);
    cursor.oneOf(":");
    const int second = cursor.digits(2, 0, 60);
    const double fraction = cursor.fraction();
    const char zone = cursor.oneOf("Zz+-");
    std::int64_t offset = 0;
    if (zone == '+' || zone == '-') {
        offset = cursor.digits(2, 0, 23) * 60;
        cursor.oneOf(":");
        offset = (offset + cursor.digits(2, 0, 59)) * (zone == '-' ? -60 : 60);
    }
    const year_month_day date{std::chrono::year(year), std::chrono::month(static_cast<unsigned>(month)),
                              std::chrono::day(static_cast<unsigned>(day))};
    if (!cursor.completed() || !date.ok()) {
        return std::nullopt;
    }
    const std::int64_t seconds = sys_days(date).time_since_epoch().count() * kSecondsPerDay + hour * 3600 +
                                 minute * 60 + second - offset;
    // A leap second stands at the end of a day of UTC and is read as the second behind it.
    if (second == 60 && seconds % kSecondsPerDay != 0) {
        return std::nullopt;
    }
    return static_cast<double>(seconds) + fraction;
}

} // namespace tamblo
