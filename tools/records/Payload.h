#pragma once

#include "base/Dictionary.h"
#include "base/Json.h"
#include "base/Value.h"

#include <span>
#include <string>
#include <string_view>
#include <variant>

namespace tamblo::tools {

/// A payload as it is typed: `key=value` words, or one word that is a JSON object; none is the empty payload.
/// Or a line that says what is wrong.
[[nodiscard]] std::variant<Dictionary, std::string> parsePayload(std::span<const std::string_view> words);
/// A text that is a JSON object, or what is wrong with it, to stand behind "is".
[[nodiscard]] std::variant<Dictionary, std::string> parseJsonObject(std::string_view text,
                                                                    JsonReadOptions options = {});
/// The options for what goes to the service, which refuses a `null` in it.
inline constexpr JsonReadOptions kForService{.refuseNull = true};

/// The JSON scalar that the text is, else the text itself: `5`, `0.5` and `true` are numbers, `"5"` and
/// `five` texts.
[[nodiscard]] Value parseScalar(std::string_view text);

/// As JSON, without the quotes of a text, so that no text can play tricks with the terminal.
[[nodiscard]] std::string plainText(const Value& value);

} // namespace tamblo::tools
