#pragma once

#include "os/FileOperations.h"
#include "platform/ReportFiles.h"

#include <string>

namespace tamblo {

/// Reports as files below the logs directory.
///
/// What the directories that it makes may be used for is up to the logs directory, which lets nobody else in
/// unless an administrator opens it: they themselves are open to everybody (0777, whatever the process's mask
/// is), so that tools may collect the reports and clear them away. The logs directory itself is the service's
/// to make, not made here.
///
/// As others may put things there, a file is opened only where the name is a regular file or free, never
/// through a symbolic link. Any thread; a file is used by one at a time.
class LinuxReportFiles final : public ReportFiles {
public:
    /// The operations must outlive this object and its files.
    explicit LinuxReportFiles(const std::string& logsDirectory,
                              FileOperations& operations = FileOperations::system())
        : logsDirectory_(logsDirectory), operations_(operations) {}

    [[nodiscard]] std::string reportingLogsDirectory() const override {
        return logsDirectory_ + "/DiagnosticLogs/Audio/Reporting";
    }
    [[nodiscard]] std::string performanceLogsDirectory() const override {
        return logsDirectory_ + "/DiagnosticLogs/Audio/Performance";
    }
    [[nodiscard]] std::optional<std::string> createDirectory(const std::string& path) override;
    [[nodiscard]] std::variant<std::unique_ptr<ReportFile>, std::string>
    createFile(const std::string& path) override;

private:
    const std::string logsDirectory_;
    FileOperations& operations_;
};

} // namespace tamblo
