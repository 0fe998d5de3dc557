#include "base/NumberText.h"

#include <algorithm>
#include <limits>

namespace tamblo {

namespace {

/// Whether a number that no double can hold is too small for one, not too large: what counts is the power of
/// ten in front of which its first digit that is not 0 stands.
bool isTiny(std::string_view number) noexcept {
    const std::size_t exponentAt = std::min(number.find_first_of("eE"), number.size());
    const std::string_view digits = number.substr(0, exponentAt);
    const std::size_t point = std::min(digits.find('.'), digits.size());
    const std::size_t first = digits.find_first_of("123456789");
    if (first == std::string_view::npos) {
        return true;
    }
    number.remove_prefix(exponentAt);
    number.remove_prefix(number.empty() ? 0 : 1);
    const bool isNegative = number.starts_with('-');
    number.remove_prefix(isNegative || number.starts_with('+') ? 1 : 0);
    std::int64_t exponent = 0;
    if (std::from_chars(number.data(), number.data() + number.size(), exponent).ec ==
        std::errc::result_out_of_range) {
        return isNegative;
    }
    return (isNegative ? -exponent : exponent) + static_cast<std::int64_t>(point) -
               static_cast<std::int64_t>(first) <
           0;
}

} // namespace

double nearestDouble(std::string_view decimal) noexcept {
    double number = 0;
    const auto [end, error] = std::from_chars(decimal.data(), decimal.data() + decimal.size(), number);
    if (error == std::errc::result_out_of_range) {
        const std::string_view read(decimal.data(), static_cast<std::size_t>(end - decimal.data()));
        return isTiny(read) ? 0.0 : std::numeric_limits<double>::infinity();
    }
    return number;
}

} // namespace tamblo
