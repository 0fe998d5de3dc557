#pragma once

#include <concepts>
#include <cstdint>
#include <source_location>
#include <string>
#include <string_view>
#include <type_traits>

namespace tamblo {

/// Text formatting with `{}` placeholders, the number of which is checked when the code is compiled.
///
/// What can stand for a placeholder: integers, booleans ("1" or "0"), texts, and every type for which an
/// `appendText(std::string&, const T&)` is found in its own namespace; pointers and optionals, which stand
/// for what they hold or are "(null)". Floating numbers are written with six digits after the point; `fixed`
/// chooses another number of them.
struct FixedPoint {
    double value;
    int digits;
};
[[nodiscard]] inline FixedPoint fixed(double value, int digits) {
    return {value, digits};
}

/// The last so many hexadecimal digits of a number, up to 16.
struct Hexadecimal {
    std::uint64_t value;
    unsigned digits;
};
[[nodiscard]] inline Hexadecimal hexadecimal(std::uint64_t value, unsigned digits) {
    return {value, digits};
}

void appendText(std::string& out, std::string_view text);
void appendText(std::string& out, std::int64_t number);
void appendText(std::string& out, std::uint64_t number);
void appendText(std::string& out, FixedPoint number);
void appendText(std::string& out, Hexadecimal number);

namespace format_detail {

template <typename T> void appendArgument(std::string& out, const T& argument) {
    if constexpr (std::is_same_v<T, bool>) {
        out += argument ? '1' : '0';
    } else if constexpr (std::signed_integral<T>) {
        appendText(out, static_cast<std::int64_t>(argument));
    } else if constexpr (std::unsigned_integral<T>) {
        appendText(out, static_cast<std::uint64_t>(argument));
    } else if constexpr (std::floating_point<T>) {
        appendText(out, FixedPoint{static_cast<double>(argument), 6});
    } else if constexpr (std::is_convertible_v<const T&, std::string_view>) {
        appendText(out, std::string_view(argument));
    } else if constexpr (requires { *argument; }) {
        if (argument) {
            appendArgument(out, *argument);
        } else {
            appendText(out, "(null)");
        }
    } else {
        appendText(out, argument);
    }
}

/// Appends the text up to the next placeholder and steps behind it.
void appendUpToPlaceholder(std::string& out, std::string_view& format);

consteval std::size_t countPlaceholders(std::string_view format) {
    std::size_t count = 0;
    for (std::size_t i = 0; i + 1 < format.size(); ++i) {
        if (format[i] == '{' && format[i + 1] == '}') {
            ++count;
        }
    }
    return count;
}

} // namespace format_detail

/// A format text for exactly these arguments, and the place where it stands.
template <typename... Arguments> struct FormatString {
    template <typename Text>
        requires std::convertible_to<const Text&, std::string_view>
    consteval FormatString(const Text& text, std::source_location place = std::source_location::current())
        : format(text), location(place) {
        if (format_detail::countPlaceholders(format) != sizeof...(Arguments)) {
            throw "the number of placeholders is not the number of arguments";
        }
    }

    std::string_view format;
    std::source_location location;
};

template <typename... Arguments>
void appendFormatted(std::string& out, std::string_view format, const Arguments&... arguments) {
    ((format_detail::appendUpToPlaceholder(out, format), format_detail::appendArgument(out, arguments)), ...);
    out += format;
}

template <typename... Arguments>
[[nodiscard]] std::string formatted(FormatString<std::type_identity_t<Arguments>...> format,
                                    const Arguments&... arguments) {
    std::string out;
    appendFormatted(out, format.format, arguments...);
    return out;
}

} // namespace tamblo
