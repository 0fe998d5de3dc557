#pragma once

#include "os/FileDescriptor.h"
#include "tools/export/Progress.h"
#include "tools/export/WrittenLines.h"

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

namespace tamblo::tools {

/// What has been exported, of all sinks: a JSON file, which is replaced in one step and on the disk before
/// an export goes on. Without a file, an export begins at the beginning each time.
class Cursor {
public:
    /// Bytes that went out on a day, for the day's budget.
    struct Spent {
        std::int64_t day = 0; ///< since 1970, UTC
        std::uint64_t bytes = 0;
    };

    /// Takes the file for itself until the end. A missing one is as an empty one; or what is wrong.
    [[nodiscard]] static std::variant<Cursor, std::string> open(const std::string& path,
                                                                std::string_view device);
    Cursor() = default;

    /// It was written by another device, or by this one under another identity. What it says of files holds
    /// all the same: they are known by what is in them, so that a device that is given another identity does
    /// not export under both what it has exported.
    [[nodiscard]] bool wasOfOtherDevice() const noexcept { return wasOfOtherDevice_; }
    [[nodiscard]] SinkProgress progress(std::string_view sink) const;
    void set(std::string_view sink, const SinkProgress& progress);
    /// What the service had counted when the sink was last looked at, if that is known.
    [[nodiscard]] std::optional<WrittenLines> written(std::string_view sink) const;
    void setWritten(std::string_view sink, const WrittenLines& written);
    [[nodiscard]] const Spent& spent() const noexcept { return spent_; }
    void setSpent(Spent spent) noexcept { spent_ = spent; }
    /// What could not be done, or nothing.
    [[nodiscard]] std::optional<std::string> store() const;

private:
    std::string path_;
    FileDescriptor lock_;
    std::string device_;
    bool wasOfOtherDevice_ = false;
    std::map<std::string, SinkProgress, std::less<>> sinks_;
    std::map<std::string, WrittenLines, std::less<>> written_;
    Spent spent_;
};

} // namespace tamblo::tools
