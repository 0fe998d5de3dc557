#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

namespace tamblo {

/// A report that is being written, a file of its own. Used on one thread; may block on the disk.
class ReportFile {
public:
    virtual ~ReportFile() = default;
    /// Appends text; answers what went wrong, or nothing.
    [[nodiscard]] virtual std::optional<std::string> write(std::string_view text) = 0;
    /// Answers what went wrong, or nothing. Nothing may be written afterwards.
    [[nodiscard]] virtual std::optional<std::string> close() = 0;
};

/// Where reports are kept that are a file each, the newest of each kind. A report's name begins as
/// `reportFileName` makes it: by that the old ones are known. Any thread; may block on the disk.
class ReportFiles {
public:
    virtual ~ReportFiles() = default;
    /// The directory of the reporting service's reports, an absolute path.
    [[nodiscard]] virtual std::string reportingLogsDirectory() const = 0;
    /// The directory of performance data, an absolute path.
    [[nodiscard]] virtual std::string performanceLogsDirectory() const = 0;
    /// Creates one of the two with its parents; answers what went wrong, or nothing.
    [[nodiscard]] virtual std::optional<std::string> createDirectory(const std::string& path) = 0;
    /// A new empty file in one of the two, in place of any that has the name, or what went wrong.
    [[nodiscard]] virtual std::variant<std::unique_ptr<ReportFile>, std::string>
    createFile(const std::string& path) = 0;
};

} // namespace tamblo
