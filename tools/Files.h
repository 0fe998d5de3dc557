#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace tamblo::tools {

/// The whole file; nothing when it cannot be read, which `errno` then explains.
[[nodiscard]] std::optional<std::string> readFile(const std::string& path);

/// Replaces a file in one step, so that a reader sees the old content or the new: writes `temporary`, which
/// must lie in the same file system, and renames it. Otherwise a line that says what failed, and nothing is
/// changed.
[[nodiscard]] std::optional<std::string> replaceFile(const std::string& path, const std::string& temporary,
                                                     std::string_view content);

/// Creates the directory, and its parents, with mode 0700 where they are missing.
[[nodiscard]] std::optional<std::string> createDirectories(const std::string& path);

} // namespace tamblo::tools
