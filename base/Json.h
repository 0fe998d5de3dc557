#pragma once

#include "base/Dictionary.h"
#include "base/TextBuffer.h"
#include "base/Value.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace tamblo {

/// Appends a value as JSON (RFC 8259), without white space, keys in their order. Doubles print the shortest
/// text that reads back the same, with `.0` when integral; single-precision floats likewise in single
/// precision. Dates become RFC 3339 texts, byte strings Base64 texts, numbers that are not finite `null`.
void appendJson(TextBuffer& out, const Value& value);
/// The text of a dictionary, and where in it each of its members begins.
struct JsonObjectText {
    Dictionary dictionary;
    std::string_view text;
    std::vector<std::size_t> members;
};
/// Appends a dictionary as an object. `members` is given where each of its members begins in its text.
void appendJsonObject(TextBuffer& out, const Dictionary& dictionary, std::vector<std::size_t>& members);
/// The same for one that has the key set of `before`: the members whose values are the same are copied from
/// there.
void appendJsonObject(TextBuffer& out, const Dictionary& dictionary, std::vector<std::size_t>& members,
                      const JsonObjectText& before);
/// Appends a text in quotes, escaped.
void appendJsonString(TextBuffer& out, std::string_view text);
/// Appends a double by the rule above.
void appendJsonNumber(TextBuffer& out, double number);

[[nodiscard]] std::string jsonText(const Value& value);

/// Appends an object of one key and the dictionary for people: two spaces for each level, a key or an element
/// on a line of its own, `"key": value`; `{}` and `[]` when empty; no line end behind it.
///
/// Nothing stands in for a value without a JSON form (a date, a byte string, a number that is not finite):
/// then nothing is appended, and the answer says which kind it is and where, as a pointer (RFC 6901).
[[nodiscard]] std::optional<std::string> appendPrettyJson(TextBuffer& out, std::string_view key,
                                                          const Dictionary& dictionary);

/// Where and why a text is not JSON, for people: line and column count from 1.
struct JsonError {
    std::size_t line = 0;
    std::size_t column = 0;
    std::string message;
};

/// How strictly a JSON text is read.
struct JsonReadOptions {
    /// A `null` has no place among property-list values: members and elements that are null are left out, or,
    /// when refused, make the text an error.
    bool refuseNull = false;
    /// Of arrays and objects within one another; a payload has no more than these.
    int mostLevels = 32;
};

/// Reads one JSON value, with nothing but white space around it. Integers within 64 bits stay integers (the
/// unsigned range included), other numbers are doubles. An object that names a key twice, nesting deeper than
/// that and text that is not UTF-8 are errors. A bare `null` is an error.
[[nodiscard]] std::variant<Value, JsonError> readJson(std::string_view text, JsonReadOptions options = {});

} // namespace tamblo
