#pragma once

#include "base/Dictionary.h"
#include "base/TextBuffer.h"

#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// Appends an object of one key and the dictionary as JSON (RFC 8259) for people: two spaces for each level,
/// a key or an element on a line of its own, `"key": value`, keys in their order; `{}` and `[]` when empty;
/// no line end behind it. Numbers and texts are written as `appendJson` writes them.
///
/// Nothing stands in for a value without a JSON form (a date, a byte string, a number that is not finite):
/// then nothing is appended, and the answer says which kind it is and where, as a pointer (RFC 6901).
[[nodiscard]] std::optional<std::string> appendPrettyJson(TextBuffer& out, std::string_view key,
                                                          const Dictionary& dictionary);

} // namespace tamblo
