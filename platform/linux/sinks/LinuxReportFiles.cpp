#include "platform/linux/sinks/LinuxReportFiles.h"

#include "os/Directory.h"

#include <cerrno>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tamblo {

namespace {

constexpr mode_t kDirectoryMode = S_IRWXU | S_IRWXG | S_IRWXO;
constexpr mode_t kFileMode = S_IRUSR | S_IWUSR | S_IRGRP | S_IROTH;

std::string textOf(int error) {
    return std::generic_category().message(error);
}

class LinuxReportFile final : public ReportFile {
public:
    LinuxReportFile(int descriptor, FileOperations& operations) noexcept
        : descriptor_(descriptor), operations_(operations) {}
    ~LinuxReportFile() override {
        if (descriptor_ >= 0) {
            operations_.close(descriptor_);
        }
    }
    LinuxReportFile(const LinuxReportFile&) = delete;
    LinuxReportFile& operator=(const LinuxReportFile&) = delete;

    std::optional<std::string> write(std::string_view text) override {
        return operations_.writeAll(descriptor_, text) ? std::nullopt : std::optional(textOf(errno));
    }

    std::optional<std::string> close() override {
        // Closed also when it fails: the descriptor may already be somebody else's.
        if (operations_.close(std::exchange(descriptor_, -1)) != 0 && errno != EINTR) {
            return textOf(errno);
        }
        return std::nullopt;
    }

private:
    int descriptor_;
    FileOperations& operations_;
};

} // namespace

std::optional<std::string> LinuxReportFiles::createDirectory(const std::string& path) {
    const int failure = makeDirectories(path, kDirectoryMode, logsDirectory_);
    return failure != 0 ? std::optional(textOf(failure)) : std::nullopt;
}

std::variant<std::unique_ptr<ReportFile>, std::string> LinuxReportFiles::createFile(const std::string& path) {
    // Emptied first when it is known to be a regular file; opening what is none must not wait either.
    const int flags = O_WRONLY | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
    const int descriptor = operations_.open(path.c_str(), flags, kFileMode);
    if (descriptor < 0) {
        return textOf(errno);
    }
    auto file = std::make_unique<LinuxReportFile>(descriptor, operations_);
    struct stat status {};
    if (operations_.status(descriptor, status) != 0) {
        return textOf(errno);
    }
    if (!S_ISREG(status.st_mode)) {
        return "not a regular file";
    }
    if (operations_.truncate(descriptor, 0) != 0) {
        return textOf(errno);
    }
    return file;
}

} // namespace tamblo
