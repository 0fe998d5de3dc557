#pragma once

#include "platform/ReportFiles.h"

#include <string>

namespace tamblo {

/// Reports as files below the logs directory.
class LinuxReportFiles final : public ReportFiles {
public:
    explicit LinuxReportFiles(const std::string& logsDirectory)
        : directory_(logsDirectory + "/DiagnosticLogs/Audio/Reporting") {}

    [[nodiscard]] std::string reportingLogsDirectory() const override { return directory_; }
    [[nodiscard]] std::optional<std::string> createDirectory(const std::string&) override {
        return "not there";
    }
    [[nodiscard]] std::variant<std::unique_ptr<ReportFile>, std::string>
    createFile(const std::string&) override {
        return "not there";
    }

private:
    const std::string directory_;
};

} // namespace tamblo
