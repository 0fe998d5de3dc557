#pragma once

#include "base/Dictionary.h"
#include "base/Value.h"

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace tamblo {

/// A payload in a log line: JSON.
void appendText(std::string& out, const Dictionary& dictionary);
/// A value in a log line: a string as it is, anything else as JSON.
void appendText(std::string& out, const Value& value);

/// Numbers in a log line: "[1, 2]".
struct NumberList {
    std::span<const std::int64_t> numbers;
};
void appendText(std::string& out, const NumberList& list);

[[nodiscard]] constexpr std::string_view yesOrNo(bool value) noexcept {
    return value ? "YES" : "NO";
}

} // namespace tamblo
