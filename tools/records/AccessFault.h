#pragma once

#include <string>

namespace tamblo::tools {

/// Why something could not be done with a path, in words for people. For a lack of permission it names the
/// file or directory that is in the way, its owner and its mode: `permission denied; /run/tamblo belongs to
/// tamblo:audio with mode 0700`.
[[nodiscard]] std::string describeFault(int error, const std::string& path);

/// 0 where the file can be opened for reading, else an `errno`.
[[nodiscard]] int faultOfReading(const std::string& path);

/// 0 where somebody answers at the socket, else an `errno`: `ENAMETOOLONG` for a path that no socket can
/// have.
[[nodiscard]] int faultOfConnecting(const std::string& path);

} // namespace tamblo::tools
