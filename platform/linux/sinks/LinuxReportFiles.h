#pragma once

#include "platform/linux/sinks/ReportDirectory.h"

#include <memory>
#include <optional>
#include <string>
#include <variant>

namespace tamblo {

/// Reports as files below the logs directory, in a directory for each kind. Directories and files are their
/// owner's alone, unless the modes say otherwise. Any thread; a file is used by one at a time.
class LinuxReportFiles final : public ReportFiles {
public:
    /// Clock, log and operations must outlive this object, as this must its files.
    LinuxReportFiles(const std::string& logsDirectory, const Clock& clock, StructuredLog& log,
                     FileModes modes = {}, ReportLimits limits = {},
                     FileOperations& operations = FileOperations::system());

    [[nodiscard]] std::string reportingLogsDirectory() const override { return reporting_.path(); }
    [[nodiscard]] std::string performanceLogsDirectory() const override { return performance_.path(); }
    [[nodiscard]] std::optional<std::string> createDirectory(const std::string& path) override;
    [[nodiscard]] std::variant<std::unique_ptr<ReportFile>, std::string>
    createFile(const std::string& path) override;
    /// Whether the last report of either kind could not be made or written.
    [[nodiscard]] bool isOut() const noexcept { return reporting_.isOut() || performance_.isOut(); }

private:
    /// Null for any other place.
    [[nodiscard]] ReportDirectory* directoryAt(std::string_view path) noexcept;

    ReportDirectory reporting_;
    ReportDirectory performance_;
};

} // namespace tamblo
