#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/sinks/AppendOnlyFile.h"
#include "platform/linux/sinks/LinuxReportFiles.h"
#include "tests/fakes/FakeWorkQueues.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <future>
#include <map>
#include <new>
#include <random>
#include <set>
#include <thread>
#include <tuple>

#include <sys/stat.h>

namespace tamblo {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;
using namespace testing;

class AppendOnlyFileTest : public Test {
protected:
    AppendOnlyFile open(SinkFileLimits limits = {}) {
        return {sinks_, "sink.jsonl", "zrrs", AppendOnlyFile::Flushed::beforeReplies, limits};
    }
    template <typename... Lines> static void append(AppendOnlyFile& file, const Lines&... lines) {
        (file.append([&lines](TextBuffer& out) { out.append(lines); }), ...);
    }
    template <typename... Lines> static void write(AppendOnlyFile& file, const Lines&... lines) {
        append(file, lines...);
        file.flush();
    }
    std::string content() const { return directory_.read("sink.jsonl"); }
    /// What the files hold, oldest first.
    std::vector<std::string> files() const {
        std::vector<std::string> contents;
        for (int number = AppendOnlyFile::kKeptFiles + 1; number > 0; --number) {
            contents.push_back(directory_.read("sink.jsonl." + std::to_string(number)));
        }
        contents.push_back(content());
        std::erase(contents, "");
        return contents;
    }
    /// Of all of them; what follows the last end of a line is left out.
    std::vector<std::string> lines() const {
        std::string all;
        for (const std::string& content : files()) {
            all += content;
        }
        directory_.write("all", all);
        return test::linesOf(directory_.path("all"));
    }

    TemporaryDirectory directory_;
    FakeLog log_;
    FaultyOperations operations_;
    SinkFiles sinks_{directory_.path(), log_, operations_};
};

TEST_F(AppendOnlyFileTest, IsWrittenWithTheOthersUnlessItsOwnerDoesIt) {
    const auto contents = [this] {
        return directory_.read("first") + directory_.read("own") + directory_.read("second");
    };
    AppendOnlyFile first(sinks_, "first", "zrrs");
    AppendOnlyFile own(sinks_, "own", "zrrs", AppendOnlyFile::Flushed::byOwner);
    {
        AppendOnlyFile second(sinks_, "second", "zrrs");
        for (AppendOnlyFile* file : {&first, &own, &second}) {
            append(*file, "a");
        }
        sinks_.flush();
        sinks_.flush();
        EXPECT_EQ(operations_.writes, 2) << "one for each, and none where nothing waits";
        EXPECT_EQ(contents(), "a\na\n");
        append(second, "b");
    }
    append(first, "b");
    sinks_.flush();
    EXPECT_EQ(contents(), "a\nb\na\nb\n");
}

/// Who finds nothing waiting may let replies go: not before the lines of another thread are written.
TEST_F(AppendOnlyFileTest, AFlushWaitsForTheOneThatIsWriting) {
    AppendOnlyFile file = open();
    std::promise<void> isWriting, mayGoOn;
    operations_.beforeWrite = [&] {
        isWriting.set_value();
        mayGoOn.get_future().wait();
    };
    append(file, "one");
    const auto writer = std::async(std::launch::async, [&file] { file.flush(); });
    isWriting.get_future().wait();
    auto other = std::async(std::launch::async, [this] {
        sinks_.flush();
        return content();
    });
    EXPECT_EQ(other.wait_for(std::chrono::milliseconds(20)), std::future_status::timeout);
    mayGoOn.set_value();
    EXPECT_EQ(other.get(), "one\n");
}

TEST_F(AppendOnlyFileTest, WritesABatchWithOneCallAndALargeOneByItself) {
    AppendOnlyFile file = open({.waiting = 40});
    EXPECT_FALSE(fs::exists(file.path())) << "created with the first line only";
    const auto failing = [](TextBuffer& out) {
        out.append("a line that fails to format is taken back");
        throw std::bad_alloc();
    };
    append(file, "one");
    EXPECT_THROW(file.append(failing), std::bad_alloc);
    append(file, "two");
    EXPECT_EQ(content(), "");
    file.flush();
    EXPECT_EQ(content(), "one\ntwo\n");
    EXPECT_EQ(operations_.writes, 1);
    append(file, std::string(39, 'x'));
    EXPECT_EQ(content(), "one\ntwo\n" + std::string(39, 'x') + "\n");
    EXPECT_EQ(fs::status(file.path()).permissions(), fs::perms::owner_read | fs::perms::owner_write);
}

TEST_F(AppendOnlyFileTest, CutsATornLastLineOffWhenOpened) {
    const std::string longLine(150'000, 'x');
    const std::pair<std::string, std::string> cases[] = {
        {"one\ntwo\n", "one\ntwo\n"},
        {"one\ntw", "one\n"},
        {"one\n" + longLine, "one\n"},
        {longLine, ""},
        {longLine + "\n" + std::string(65'536, 'y'), longLine + "\n"},
        {longLine + "\n" + std::string(65'535, 'y'), longLine + "\n"},
    };
    for (const auto& [before, after] : cases) {
        directory_.write("sink.jsonl", before);
        AppendOnlyFile file = open();
        EXPECT_EQ(content(), after);
        write(file, "new");
        EXPECT_EQ(content(), after + "new\n");
    }
    EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(AppendOnlyFileTest, BeginsANewFileBeforeALineWouldMakeItTooLarge) {
    AppendOnlyFile file = open({.fileSize = 10});
    write(file, "1234", "5678", "a", "123456789", "b");
    EXPECT_THAT(files(), ElementsAre("1234\n5678\n", "a\n", "123456789\n", "b\n"));
    for (const char* line : {"12345678", "123456789", "c"}) {
        write(file, line);
    }
    EXPECT_THAT(files(), ElementsAre("123456789\n", "b\n", "12345678\n", "123456789\n", "c\n"));
    operations_.renameError = EACCES; // however often it is tried, no more than the oldest has to go
    write(file, "123456789");
    write(file, "123456789");
    operations_.renameError = 0;
    write(file, "123456789");
    EXPECT_THAT(files(), ElementsAre("b\n", "12345678\n", "123456789\n", "c\n", "123456789\n"));
    EXPECT_THAT(log_.take(),
                ElementsAre(HasSubstr("rename: Permission denied"), HasSubstr("; 2 records were lost")));
    directory_.write("sink.jsonl", std::string(20, 'x') + "\n");
    write(file, "d");
    EXPECT_THAT(files(), Contains("d\n")) << "others may have made it larger";
}

TEST_F(AppendOnlyFileTest, ALineThatIsTooLongIsLostAndCounted) {
    {
        AppendOnlyFile file = open({.fileSize = 100, .line = 10});
        for (int i = 0; i < 5; ++i) {
            write(file, "123456789", "1234567890", "abc");
        }
        EXPECT_EQ(open({.fileSize = 8, .line = 10}).longestLine(), 8U);
        EXPECT_THAT(sinks_.out(), IsEmpty());
    }
    EXPECT_THAT(lines(), ElementsAre("123456789", "abc", "123456789", "abc", "123456789", "abc", "123456789",
                                     "abc", "123456789", "abc"));
    EXPECT_EQ(sinks_.lostLines(), 5U);
    const std::string told = "sink.jsonl: records of more than 10 bytes are left out, ";
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr(told + "1 until now"), HasSubstr(told + "2 until"),
                                         HasSubstr(told + "4 until")));
}

/// Fails, fills up at any byte and recovers, again and again, while files rotate and writes take a few bytes
/// only: every line is there once, or counted.
TEST_F(AppendOnlyFileTest, OfADiskThatFailsAndRecoversEachLineIsThereOnceOrCounted) {
    std::vector<std::string> expected;
    std::size_t lost = 0;
    std::uint32_t random = 1;
    const auto next = [&random](std::uint32_t below) {
        random = random * 1664525 + 1013904223;
        return (random >> 8U) % below;
    };
    {
        AppendOnlyFile file = open({.fileSize = 5000, .waiting = 300});
        for (int i = 0; i < 1500; ++i) {
            operations_.room.reset();
            operations_.truncateError = operations_.renameError = 0;
            operations_.interruptions = static_cast<int>(next(3));
            operations_.largestWrite = 1 + next(30);
            if (next(3) == 0) {
                operations_.room = next(40);
                operations_.truncateError = next(2) == 0 ? EIO : 0;
                operations_.renameError = next(4) == 0 ? EIO : 0;
            }
            const std::uint64_t before = sinks_.lostLines();
            for (int line = 0; line < 3; ++line) {
                expected.push_back(std::to_string(i * 3 + line) + std::string(next(20), '.'));
                append(file, expected.back());
            }
            file.flush();
            EXPECT_TRUE(operations_.truncateError != 0 || ("\n" + content()).ends_with('\n')) << "torn";
            // What is lost of a batch are its last lines.
            const std::uint64_t ofBatch = sinks_.lostLines() - before;
            lost += ofBatch;
            expected.resize(expected.size() - ofBatch);
            EXPECT_EQ(!sinks_.out().empty(), ofBatch != 0);
            const std::string now = content();
            EXPECT_TRUE(now.empty() || now.back() == '\n' || operations_.truncateError != 0) << "torn";
            if (i % 100 == 99) {
                EXPECT_THAT(files(), Each(SizeIs(Le(5000U))));
                const std::vector<std::string> there = lines();
                ASSERT_THAT(there,
                            ElementsAreArray(expected.end() - static_cast<std::ptrdiff_t>(there.size()),
                                             expected.end()));
                EXPECT_GT(there.size(), 100U);
            }
        }
    }
    EXPECT_GT(lost, 100U);
    std::uint64_t told = 0;
    for (const std::string& line : log_.take()) {
        told += line.ends_with("records were lost") ? std::stoull(line.substr(line.rfind("; ") + 2)) : 0;
    }
    EXPECT_EQ(told, lost);
}

TEST_F(AppendOnlyFileTest, IsOutWhileItCannotBeWrittenAndFollowsItsDirectory) {
    AppendOnlyFile file = open();
    write(file, "one");
    EXPECT_THAT(sinks_.out(), IsEmpty());
    const std::string logs = directory_.path();
    fs::rename(logs, logs + ".away");
    test::writeFile(logs, "in the way");
    write(file, "lost", "lost");
    EXPECT_THAT(sinks_.out(), ElementsAre("sink.jsonl"));
    EXPECT_EQ(sinks_.lostLines(), 2U);
    fs::remove(logs);
    write(file, "two"); // makes it anew
    EXPECT_THAT(sinks_.out(), IsEmpty());
    EXPECT_EQ(content(), "two\n");
    EXPECT_EQ(fs::status(logs).permissions(), fs::perms::owner_all);
    fs::remove_all(logs);
    fs::rename(logs + ".away", logs);
    write(file, "three");
    EXPECT_EQ(content(), "one\nthree\n");
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("/sink.jsonl: cannot open its directory: Not a"),
                                         HasSubstr("; 2 records were lost")));
    fs::rename(file.path(), logs + "/elsewhere");
    fs::create_symlink("elsewhere", file.path());
    write(file, "four");
    EXPECT_EQ(content(), "one\nthree\n") << "not through a link";
}

TEST_F(AppendOnlyFileTest, FollowsThePathWhenOthersTouchTheFile) {
    AppendOnlyFile file = open({.fileSize = 24});
    write(file, "one");
    fs::remove(file.path());
    write(file, "two");
    EXPECT_EQ(content(), "two\n");
    fs::rename(file.path(), file.path() + ".shipped");
    directory_.write("sink.jsonl", "theirs\nto");
    write(file, "three");
    EXPECT_EQ(content(), "theirs\nthree\n");
    fs::resize_file(file.path(), 0); // and the size counts from there
    write(file, "0123456789");
    write(file, "0123456789");
    write(file, "four");
    EXPECT_THAT(files(), ElementsAre("0123456789\n0123456789\n", "four\n"));
}

TEST_F(AppendOnlyFileTest, RefusesWhatIsNoFileWithoutWaitingForAReader) {
    const std::string path = directory_.path("sink.jsonl");
    ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0);
    {
        AppendOnlyFile file = open();
        EXPECT_THAT(log_.take(), IsEmpty()) << "nothing is lost yet";
        write(file, "x", "y");
        write(file, "z");
    }
    EXPECT_THAT(log_.take(), ElementsAre("3 zrrs " + path +
                                             ": not a regular file; its records are lost "
                                             "until it can be written again",
                                         HasSubstr(": the service ends; 3 records were lost")));
}

TEST_F(AppendOnlyFileTest, KeepsLinesWholeWhenThreadsAppendAndFilesRotate) {
    constexpr int kLines = 2000;
    {
        AppendOnlyFile file = open({.fileSize = 10'000, .waiting = 512});
        const auto work = [&file](const char* line) {
            for (int number = 0; number < kLines; ++number) {
                append(file, line);
            }
        };
        const std::jthread other(work, "from one");
        work("another's");
    }
    std::map<std::string, int> counts;
    EXPECT_THAT(files(), Each(SizeIs(Le(10'000U))));
    for (const std::string& line : lines()) {
        ++counts[line];
    }
    EXPECT_THAT(counts, ElementsAre(Pair("another's", kLines), Pair("from one", kLines)));
}

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
