#include "tools/TimeText.h"

#include "base/NumberText.h"

#include <array>
#include <chrono>
#include <utility>

namespace tamblo::tools {

namespace {

constexpr double kSecondsOfMinute = 60;
constexpr double kSecondsOfHour = 3600;
constexpr double kSecondsOfDay = 86400;

bool take(std::string_view& text, char character) noexcept {
    if (!text.starts_with(character)) {
        return false;
    }
    text.remove_prefix(1);
    return true;
}

/// A number of so many digits, from 0 to `most`, off the front.
std::optional<unsigned> takeDigits(std::string_view& text, std::size_t digits, unsigned most) noexcept {
    const std::string_view front = text.substr(0, digits);
    const auto number = parseNumber<unsigned>(front);
    if (front.size() != digits || !number || *number > most) {
        return std::nullopt;
    }
    text.remove_prefix(digits);
    return number;
}

std::optional<double> takeDay(std::string_view& text) noexcept {
    const auto year = takeDigits(text, 4, 9999);
    const bool hasMonth = year && take(text, '-');
    const auto month = hasMonth ? takeDigits(text, 2, 12) : std::nullopt;
    const bool hasDay = month && take(text, '-');
    const auto day = hasDay ? takeDigits(text, 2, 31) : std::nullopt;
    if (!day) {
        return std::nullopt;
    }
    const std::chrono::year_month_day date(std::chrono::year(static_cast<int>(*year)),
                                           std::chrono::month(*month), std::chrono::day(*day));
    if (!date.ok()) {
        return std::nullopt;
    }
    return static_cast<double>(std::chrono::sys_days(date).time_since_epoch().count()) * kSecondsOfDay;
}

/// `12:00`, `12:00:30` or `12:00:30.25`, in seconds.
std::optional<double> takeTimeOfDay(std::string_view& text) noexcept {
    const auto hour = takeDigits(text, 2, 23);
    const bool hasMinute = hour && take(text, ':');
    const auto minute = hasMinute ? takeDigits(text, 2, 59) : std::nullopt;
    if (!minute) {
        return std::nullopt;
    }
    double seconds = *hour * kSecondsOfHour + *minute * kSecondsOfMinute;
    if (!take(text, ':')) {
        return seconds;
    }
    const auto second = takeDigits(text, 2, 60);
    if (!second) {
        return std::nullopt;
    }
    seconds += *second;
    if (text.starts_with('.')) {
        std::size_t end = 1;
        while (end < text.size() && text[end] >= '0' && text[end] <= '9') {
            ++end;
        }
        if (end == 1) {
            return std::nullopt;
        }
        seconds += nearestDouble(text.substr(0, end));
        text.remove_prefix(end);
    }
    return seconds;
}

/// `Z`, `+02:00` or nothing, in seconds ahead of UTC.
std::optional<double> takeZone(std::string_view& text) noexcept {
    if (text.empty() || take(text, 'Z') || take(text, 'z')) {
        return 0;
    }
    const double sign = text.starts_with('-') ? -1 : 1;
    if (!take(text, '+') && !take(text, '-')) {
        return std::nullopt;
    }
    const auto hour = takeDigits(text, 2, 23);
    (void)take(text, ':');
    const auto minute = hour ? takeDigits(text, 2, 59) : std::nullopt;
    return minute ? std::optional(sign * (*hour * kSecondsOfHour + *minute * kSecondsOfMinute))
                  : std::nullopt;
}

std::optional<double> parseDateAndTime(std::string_view text) noexcept {
    const auto day = takeDay(text);
    if (!day || text.empty()) {
        return day;
    }
    const bool hasTime = take(text, 'T') || take(text, 't') || take(text, ' ');
    const auto time = hasTime ? takeTimeOfDay(text) : std::nullopt;
    const auto ahead = time ? takeZone(text) : std::nullopt;
    return ahead && text.empty() ? std::optional(*day + *time - *ahead) : std::nullopt;
}

std::optional<double> parseAge(std::string_view text) noexcept {
    constexpr std::array<std::pair<char, double>, 4> units{
        {{'s', 1}, {'m', kSecondsOfMinute}, {'h', kSecondsOfHour}, {'d', kSecondsOfDay}}};
    for (const auto& [letter, seconds] : units) {
        if (text.ends_with(letter)) {
            const auto number = parseNumber<double>(text.substr(0, text.size() - 1));
            return number && *number >= 0 ? std::optional(*number * seconds) : std::nullopt;
        }
    }
    return std::nullopt;
}

} // namespace

double presentTime() {
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

std::optional<double> parseMoment(std::string_view text, double now) {
    if (const auto age = parseAge(text)) {
        return now - *age;
    }
    if (const auto moment = parseDateAndTime(text)) {
        return moment;
    }
    const auto seconds = parseNumber<double>(text);
    return seconds && *seconds >= 0 ? seconds : std::nullopt;
}

} // namespace tamblo::tools
