#pragma once

#include "base/Dictionary.h"
#include "base/Value.h"

#include <span>
#include <string>
#include <string_view>
#include <variant>

namespace tamblo::tools {

/// A payload as it is typed: `key=value` words, or one word that is a JSON object; none is the empty payload.
/// Or a line that says what is wrong.
[[nodiscard]] std::variant<Dictionary, std::string> parsePayload(std::span<const std::string_view> words);
[[nodiscard]] std::variant<Dictionary, std::string> parseJsonObject(std::string_view text);

/// The JSON scalar that the text is, else the text itself: `5`, `0.5` and `true` are numbers, `"5"` and
/// `five` texts.
[[nodiscard]] Value parseScalar(std::string_view text);

} // namespace tamblo::tools
