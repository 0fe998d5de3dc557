#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo::tools {

/// What the service has counted of a sink.
struct WrittenLines {
    /// When it began to count, in nanoseconds since 1970; by this it is the same count.
    std::uint64_t began = 0;
    std::uint64_t lines = 0;

    /// The lines that came after an earlier reading; nothing where that was of another count.
    [[nodiscard]] std::optional<std::uint64_t> since(const WrittenLines& earlier) const noexcept {
        return began == earlier.began && lines >= earlier.lines ? std::optional(lines - earlier.lines)
                                                                : std::nullopt;
    }
};

/// The service's own count of the lines of its sinks, which tells how many there were in files that nobody
/// has seen. It is in the file of its counters, which lasts until the machine is switched off.
class ServiceCount {
public:
    explicit ServiceCount(std::string_view runtimeDirectory);

    /// Nothing without such a file, or with one of another version's.
    [[nodiscard]] std::optional<WrittenLines> of(std::string_view sink) const;

private:
    std::string path_;
};

} // namespace tamblo::tools
