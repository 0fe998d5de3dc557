#include "platform/linux/sinks/LinuxReportFiles.h"
#include "tests/platform/FaultyOperations.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <sys/stat.h>

namespace tamblo {
namespace {

namespace fs = std::filesystem;

class LinuxReportFilesTest : public testing::Test {
protected:
    LinuxReportFilesTest() {
        operations.largestWrite = 7;
        operations.interruptions = 1000;
    }
    [[nodiscard]] std::unique_ptr<ReportFile> create(const std::string& name) {
        auto created = files.createFile(directory.path(name));
        if (const auto* failure = std::get_if<std::string>(&created)) {
            ADD_FAILURE() << *failure;
            return nullptr;
        }
        return std::get<std::unique_ptr<ReportFile>>(std::move(created));
    }
    [[nodiscard]] unsigned modeOf(const std::string& path) {
        return static_cast<unsigned>(fs::status(path).permissions());
    }

    TemporaryDirectory directory;
    FaultyOperations operations;
    LinuxReportFiles files{directory.path(), operations};
};

TEST_F(LinuxReportFilesTest, DirectoriesAreForEverybodyWhateverTheMask) {
    EXPECT_EQ(files.reportingLogsDirectory(), directory.path("DiagnosticLogs/Audio/Reporting"));
    for (const mode_t mask : {mode_t{0022}, mode_t{0077}}) {
        fs::remove_all(directory.path("DiagnosticLogs"));
        const mode_t before = ::umask(mask);
        EXPECT_EQ(files.createDirectory(files.reportingLogsDirectory()), std::nullopt);
        ::umask(before);
        for (const char* name :
             {"DiagnosticLogs", "DiagnosticLogs/Audio", "DiagnosticLogs/Audio/Reporting"}) {
            EXPECT_EQ(modeOf(directory.path(name)), 0777U) << name << " with " << mask;
        }
    }
    EXPECT_EQ(modeOf(directory.path()), 0700U);
    // What is there stays as it is.
    ::chmod(files.reportingLogsDirectory().c_str(), 0750);
    EXPECT_EQ(files.createDirectory(files.reportingLogsDirectory()), std::nullopt);
    EXPECT_EQ(modeOf(files.reportingLogsDirectory()), 0750U);
}

TEST_F(LinuxReportFilesTest, ADirectoryThatCannotBeIsToldWhy) {
    directory.write("DiagnosticLogs", "a file");
    EXPECT_EQ(files.createDirectory(files.reportingLogsDirectory()), "Not a directory");
    LinuxReportFiles nowhere(directory.path("gone"));
    EXPECT_EQ(nowhere.createDirectory(nowhere.reportingLogsDirectory()), "No such file or directory");
    EXPECT_FALSE(fs::exists(directory.path("gone"))) << "the service's own to make";
}

TEST_F(LinuxReportFilesTest, AFileTakesThePlaceOfARegularOneOnly) {
    directory.write("report", "an old and longer report");
    const auto file = create("report");
    ASSERT_NE(file, nullptr);
    EXPECT_EQ(directory.read("report"), "");
    const std::string text = "written in many pieces, most of them interrupted";
    EXPECT_EQ(file->write(text), std::nullopt);
    EXPECT_EQ(file->write(""), std::nullopt);
    EXPECT_EQ(file->close(), std::nullopt);
    EXPECT_EQ(directory.read("report"), text);

    const mode_t before = ::umask(0);
    EXPECT_NE(create("new"), nullptr);
    ::umask(before);
    EXPECT_EQ(modeOf(directory.path("new")), 0644U);

    fs::create_symlink(directory.path("report"), directory.path("link"));
    ::mkfifo(directory.path("pipe").c_str(), 0600);
    const struct {
        const char* name;
        const char* says;
    } refused[] = {{"link", "Too many levels of symbolic links"},
                   {"pipe", "No such device or address"},
                   {".", "Is a directory"},
                   {"gone/report", "No such file or directory"}};
    for (const auto& c : refused) {
        const auto created = files.createFile(directory.path(c.name));
        ASSERT_TRUE(std::holds_alternative<std::string>(created)) << c.name;
        EXPECT_EQ(std::get<std::string>(created), c.says) << c.name;
    }
    const auto device = files.createFile("/dev/full");
    ASSERT_TRUE(std::holds_alternative<std::string>(device));
    EXPECT_EQ(std::get<std::string>(device), "not a regular file");
    EXPECT_EQ(directory.read("report"), text);
}

TEST_F(LinuxReportFilesTest, ADiskThatFillsUpIsToldAndMayEmptyAgain) {
    const auto file = create("report");
    ASSERT_NE(file, nullptr);
    operations.room = 10;
    EXPECT_EQ(file->write("0123456789"), std::nullopt);
    EXPECT_EQ(file->write("lost"), "No space left on device");
    operations.room.reset();
    EXPECT_EQ(file->write(", more"), std::nullopt);
    operations.closeError = EIO;
    EXPECT_EQ(file->close(), "Input/output error");
    EXPECT_EQ(directory.read("report"), "0123456789, more");
}

} // namespace
} // namespace tamblo
