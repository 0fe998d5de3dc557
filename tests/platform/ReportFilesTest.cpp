#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/sinks/LinuxReportFiles.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <set>
#include <tuple>

#include <sys/stat.h>

namespace tamblo {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;
using namespace testing;

class LinuxReportFilesTest : public Test {
protected:
    static std::string nameOf(std::int64_t reporter) {
        return "20260301-120000+0100-" + std::to_string(reporter) + "-app-test.json";
    }
    std::string path(const std::string& name) const { return files->reportingLogsDirectory() + "/" + name; }
    std::unique_ptr<ReportFile> create(const std::string& name) {
        auto created = files->createFile(path(name));
        refusal = "";
        if (auto* const text = std::get_if<std::string>(&created)) {
            refusal = std::move(*text);
            return nullptr;
        }
        return std::get<std::unique_ptr<ReportFile>>(std::move(created));
    }
    void report(std::int64_t reporter, std::size_t bytes) {
        EXPECT_EQ(create(nameOf(reporter))->write(std::string(bytes, 'x')), std::nullopt);
        clock.advance(1s);
    }
    /// Of that age, in days.
    void leave(const std::string& name, int days, std::size_t bytes = 1) const {
        test::writeFile(path(name), std::string(bytes, 'x'));
        const auto time = clock.now() - std::chrono::days(days);
        fs::last_write_time(path(name), std::chrono::file_clock::from_sys(time));
    }
    std::set<std::string> names() const {
        std::set<std::string> found;
        for (const auto& entry : fs::directory_iterator(files->reportingLogsDirectory())) {
            found.insert(entry.path().filename());
        }
        return found;
    }
    static fs::perms modeOf(const std::string& path) { return fs::status(path).permissions(); }

    TemporaryDirectory directory;
    FakeLog log;
    FakeClock clock;
    FaultyOperations operations;
    FileModes modes;
    ReportLimits limits{.files = 4, .bytes = 1000, .fileBytes = 600};
    std::optional<LinuxReportFiles> files{std::in_place, directory.path(), clock,     log,
                                          modes,         limits,           operations};
    std::string refusal;
};

TEST_F(LinuxReportFilesTest, DirectoriesAndFilesAreTheirOwnersAloneUnlessTheMakerSaysOtherwise) {
    LinuxPreferences preferences(directory.path("preferences"), log);
    const mode_t before = ::umask(0027);
    for (const auto& [file, folder, fileMode, folderMode] :
         {std::tuple<Value, Value, int, int>(4, "x", 0600, 0700), {"0666", "775", 0666, 0775}}) {
        fs::remove_all(directory.path("DiagnosticLogs"));
        preferences.setPreferenceValue("file_mode", "com.vandra.tamblo.sinks", file);
        preferences.setPreferenceValue("directory_mode", "com.vandra.tamblo.sinks", folder);
        files.emplace(directory.path(), clock, log, FileModes::read(preferences, log), limits, operations);
        EXPECT_EQ(files->createDirectory(files->reportingLogsDirectory()), std::nullopt);
        report(1, 1);
        for (const char* name :
             {"DiagnosticLogs", "DiagnosticLogs/Audio", "DiagnosticLogs/Audio/Reporting"}) {
            EXPECT_EQ(modeOf(directory.path(name)), fs::perms(folderMode)) << name;
        }
        EXPECT_EQ(modeOf(path(nameOf(1))), fs::perms(fileMode));
    }
    ::umask(before);
    EXPECT_EQ(modeOf(directory.path()), fs::perms::owner_all);
    EXPECT_THAT(log.take(), Contains(HasSubstr("com.vandra.tamblo.sinks: file_mode is no octal text")));

    EXPECT_EQ(files->createDirectory(directory.path()), "not a directory of reports");
    fs::remove_all(directory.path("DiagnosticLogs"));
    directory.write("DiagnosticLogs", "a file");
    EXPECT_EQ(files->createDirectory(files->performanceLogsDirectory()), "Not a directory");
}

TEST_F(LinuxReportFilesTest, AFileTakesThePlaceOfARegularOneOnlyAndIsReachedThroughNoLink) {
    operations.largestWrite = 7;
    operations.interruptions = 1000;
    leave(nameOf(1), 0, 100);
    auto file = create(nameOf(1));
    EXPECT_EQ(test::contentOf(path(nameOf(1))), "");
    EXPECT_EQ(file->write("written in many pieces, most of them interrupted"), std::nullopt);
    operations.room = 2;
    EXPECT_EQ(file->write("; lost"), "No space left on device");
    operations.room.reset();
    EXPECT_EQ(file->write("."), std::nullopt);
    EXPECT_EQ(file->write(std::string(600, 'x')), "File too large");
    EXPECT_EQ(file->close(), std::nullopt);
    EXPECT_EQ(test::contentOf(path(nameOf(1))), "written in many pieces, most of them interrupted; .");

    directory.write("elsewhere/kept", "text");
    fs::create_symlink(directory.path("elsewhere/kept"), path("link"));
    ::mkfifo(path("pipe").c_str(), 0600);
    for (const char* name : {"link", "pipe"}) {
        EXPECT_EQ(create(name), nullptr);
        EXPECT_EQ(refusal, "File exists");
    }
    for (const char* part : {"DiagnosticLogs/Audio/Reporting", "DiagnosticLogs"}) {
        fs::remove_all(directory.path(part));
        fs::create_directories(directory.path("elsewhere/Audio/Reporting"));
        fs::create_symlink(directory.path("elsewhere"), directory.path(part));
        EXPECT_EQ(create(nameOf(2)), nullptr) << part;
        EXPECT_EQ(refusal, "Not a directory");
        fs::remove(directory.path(part));
        report(3, 1);
    }
    EXPECT_EQ(test::entriesOf(directory.path("elsewhere")) +
                  test::entriesOf(directory.path("elsewhere/Audio/Reporting")),
              2);
    EXPECT_EQ(directory.read("elsewhere/kept"), "text");
}

TEST_F(LinuxReportFilesTest, OfTwoThatAreWrittenUnderOneNameTheSecondIsWholeAndAloneCounts) {
    auto first = create(nameOf(1));
    EXPECT_EQ(first->write(std::string(500, 'a')), std::nullopt);
    auto second = create(nameOf(1));
    EXPECT_EQ(first->write(std::string(100, 'a')), std::nullopt);
    EXPECT_EQ(second->write("b"), std::nullopt);
    report(2, 600);
    first.reset();
    report(3, 399); // there is room for all, and the second is not taken for one that is over
    EXPECT_EQ(test::contentOf(path(nameOf(1))), "b");
    EXPECT_THAT(names(), UnorderedElementsAre(nameOf(1), nameOf(2), nameOf(3)));
    report(4, 399);
    EXPECT_THAT(names(), UnorderedElementsAre(nameOf(1), nameOf(3), nameOf(4)));
}

TEST_F(LinuxReportFilesTest, WhatAFullDiskDoesNotTakeIsNotCounted) {
    report(1, 400);
    auto file = create(nameOf(2));
    operations.room = 3;
    for (int i = 0; i < 10; ++i) {
        EXPECT_EQ(file->write(std::string(100, 'x')), "No space left on device");
    }
    EXPECT_TRUE(files->isOut());
    operations.room.reset();
    EXPECT_EQ(file->write(std::string(597, 'x')), std::nullopt);
    EXPECT_FALSE(files->isOut());
    EXPECT_THAT(names(), UnorderedElementsAre(nameOf(1), nameOf(2)));
}

TEST_F(LinuxReportFilesTest, TheNewestAreKeptAndNothingElseIsRemoved) {
    const std::string strange[] = {"notes.json", nameOf(8) + ".tmp", "20260301-120000+0100-x-app-test.json",
                                   "20260301-1200000100-7-app-test.json"};
    for (const std::string& name : strange) {
        leave(name, 100, 5000);
    }
    fs::create_directory(path(nameOf(9))); // no file
    leave(nameOf(1), 15);
    leave(nameOf(-2), 13);
    leave(nameOf(3), -2); // of a time that is still to come
    const auto kept = [&] {
        std::set<std::string> found = names();
        for (const std::string& name : strange) {
            EXPECT_EQ(found.erase(name), 1U) << name;
        }
        EXPECT_EQ(found.erase(nameOf(9)), 1U);
        return found;
    };
    report(4, 1);
    EXPECT_THAT(kept(), UnorderedElementsAre(nameOf(-2), nameOf(3), nameOf(4))) << "by age";
    report(5, 1);
    report(6, 1);
    EXPECT_THAT(kept(), UnorderedElementsAre(nameOf(-2), nameOf(4), nameOf(5), nameOf(6))) << "by number";
    report(6, 500);
    report(7, 499);
    EXPECT_THAT(kept(), UnorderedElementsAre(nameOf(5), nameOf(6), nameOf(7)));
    // One that grows makes room, and is never removed for others.
    auto growing = create(nameOf(10));
    EXPECT_EQ(growing->write(std::string(400, 'x')), std::nullopt);
    EXPECT_THAT(kept(), UnorderedElementsAre(nameOf(7), nameOf(10)));
    clock.advance(24h * 30);
    report(11, 600);
    EXPECT_THAT(kept(), UnorderedElementsAre(nameOf(10), nameOf(11)));
    growing.reset();
    // What others have taken away is not counted.
    fs::remove(path(nameOf(11)));
    report(12, 500);
    EXPECT_THAT(kept(), UnorderedElementsAre(nameOf(10), nameOf(12)));
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(LinuxReportFilesTest, ADirectoryFullOfOtherFilesIsLearntLittleByLittle) {
    constexpr int kStrange = 2000;
    for (int i = 0; i < kStrange; ++i) {
        leave("strange" + std::to_string(i), 0);
        if (i % 100 == 0) {
            leave(nameOf(1000 + i), 20);
        }
    }
    const auto reports = [this] { return test::entriesOf(files->reportingLogsDirectory()) - kStrange; };
    std::ptrdiff_t before = reports();
    operations.refusedDirectories = 1; // and with the next report it is read after all
    report(0, 1);
    EXPECT_EQ(reports(), ++before);
    for (int i = 0; i < 5; ++i) {
        report(i, 1);
        EXPECT_GT(reports(), before - 15) << "no more than a share of them";
        before = reports();
    }
    EXPECT_EQ(before, 4);
}

} // namespace
} // namespace tamblo
