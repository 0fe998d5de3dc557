#include "platform/linux/sinks/LinuxReportFiles.h"

#include <algorithm>
#include <string_view>

namespace tamblo {

namespace {

constexpr const char* kElsewhere = "not a directory of reports";

} // namespace

LinuxReportFiles::LinuxReportFiles(const std::string& logsDirectory, const Clock& clock, StructuredLog& log,
                                   FileModes modes, ReportLimits limits, FileOperations& operations)
    : reporting_(logsDirectory, "DiagnosticLogs/Audio/Reporting", "zrrr", clock, log, modes, limits,
                 operations),
      performance_(logsDirectory, "DiagnosticLogs/Audio/Performance", "zrrt", clock, log, modes, limits,
                   operations) {}

ReportDirectory* LinuxReportFiles::directoryAt(std::string_view path) noexcept {
    return path == reporting_.path() ? &reporting_ : path == performance_.path() ? &performance_ : nullptr;
}

std::optional<std::string> LinuxReportFiles::createDirectory(const std::string& path) {
    ReportDirectory* const directory = directoryAt(path);
    return directory != nullptr ? directory->make() : kElsewhere;
}

std::variant<std::unique_ptr<ReportFile>, std::string> LinuxReportFiles::createFile(const std::string& path) {
    const std::size_t slash = std::min(path.rfind('/'), path.size());
    ReportDirectory* const directory = directoryAt(std::string_view(path).substr(0, slash));
    return directory != nullptr ? directory->create(path.substr(slash + 1))
                                : std::variant<std::unique_ptr<ReportFile>, std::string>(kElsewhere);
}

} // namespace tamblo
