#pragma once

#include "tools/Decode.h"

#include <string_view>

namespace tamblo::tools {

/// Frames of the client protocol, one behind another: bytes, or hexadecimal digits with white space anywhere.
/// Each becomes a line that is a JSON object.
[[nodiscard]] Decoded decodeFrames(std::string_view input);
/// Whether the text is hexadecimal digits, two for each byte, with white space anywhere.
[[nodiscard]] bool isHex(std::string_view text);

} // namespace tamblo::tools
