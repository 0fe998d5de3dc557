#pragma once

#include "base/Dictionary.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::tools {

/// What `decode` takes. A text may hold several of one kind.
enum class EncodedKind : std::uint8_t {
    record, ///< metric records in Base64, one a line
    line,   ///< lines of a report sink
    frame,  ///< frames of the client protocol one behind another, as they travel or as hexadecimal digits
};

[[nodiscard]] std::optional<EncodedKind> encodedKindNamed(std::string_view name) noexcept;
[[nodiscard]] std::string_view nameOf(EncodedKind kind) noexcept;
/// What the input looks like: a JSON object is a line; hexadecimal digits, and bytes with a 0 among them, are
/// frames; anything else is a record. Neither can be the other: the length of a frame has a 0 in it, and the
/// Base64 of a record has letters that are no digits.
[[nodiscard]] EncodedKind guessEncodedKind(std::string_view input);

/// The input as text for people, and one line for each part of it that is not what it should be. Takes bytes
/// that nobody vouches for.
struct Decoded {
    std::string text;
    std::vector<std::string> problems;
};
[[nodiscard]] Decoded decode(std::string_view input, EncodedKind kind);

/// The fields of a line's metric record; nothing for a line without one, or with one that is not whole.
[[nodiscard]] std::optional<Dictionary> fieldsOfMetric(const Dictionary& line);

/// The same for frames, of which each becomes a line that is a JSON object.
[[nodiscard]] Decoded decodeFrames(std::string_view input);
/// Whether the text is hexadecimal digits, two for each byte, with white space anywhere.
[[nodiscard]] bool isHex(std::string_view text);

} // namespace tamblo::tools
