#pragma once

#include <string>
#include <string_view>

namespace tamblo::tools {

struct Command;

/// Manual pages of section 1 in man's own language, from what `--help` prints: of tambloctl as a whole, and
/// of one of its commands.
[[nodiscard]] std::string manualPage(std::string_view version);
[[nodiscard]] std::string manualPageOf(const Command& command, std::string_view version);

} // namespace tamblo::tools
