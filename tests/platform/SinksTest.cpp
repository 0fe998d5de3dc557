#include "platform/linux/sinks/AppendOnlyFile.h"
#include "platform/linux/sinks/LinuxAnalyticsEventService.h"
#include "platform/linux/sinks/LinuxReportFiles.h"
#include "tests/fakes/FakeWorkQueues.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <future>
#include <map>
#include <new>
#include <thread>

#include <sys/stat.h>

namespace tamblo {
namespace {

namespace fs = std::filesystem;
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
    const std::string large(30, 'L'); // has a file of its own
    write(file, "1234", "5678", "a", large, "b");
    EXPECT_THAT(files(), ElementsAre("1234\n5678\n", "a\n", large + "\n", "b\n"));
    for (const char* line : {"12345678", "123456789", "c"}) {
        write(file, line);
    }
    EXPECT_THAT(files(), ElementsAre(large + "\n", "b\n", "12345678\n", "123456789\n", "c\n"));
}

TEST_F(AppendOnlyFileTest, KeepsEarlierFilesWhenRenamingFailsAgainAndAgain) {
    AppendOnlyFile file = open({.fileSize = 4});
    write(file, "aaa", "bbb", "ccc", "ddd");
    ASSERT_THAT(files(), ElementsAre("aaa\n", "bbb\n", "ccc\n", "ddd\n"));
    operations_.renameError = EACCES;
    for (int attempt = 0; attempt < 3; ++attempt) {
        write(file, "lost");
    }
    operations_.renameError = 0;
    write(file, "eee");
    EXPECT_THAT(files(), ElementsAre("aaa\n", "bbb\n", "ccc\n", "ddd\n", "eee\n"));
    EXPECT_THAT(log_.take(),
                ElementsAre(HasSubstr("rename: Permission denied"), HasSubstr("; 3 records were lost")));
}

/// The disk fills up at every byte of a batch in turn; whether or not the torn line can be cut off at once,
/// and although every write is interrupted and takes a few bytes only.
TEST_F(AppendOnlyFileTest, TearsAndDoublesNothingWhenTheDiskFillsUp) {
    operations_.largestWrite = 3;
    operations_.interruptions = 10'000;
    for (const int truncateError : {0, EIO}) {
        for (std::size_t room = 0; room < 12; ++room) {
            fs::remove(directory_.path("sink.jsonl"));
            AppendOnlyFile file = open();
            operations_.room = room;
            operations_.truncateError = truncateError;
            write(file, "aaa", "bbb", "ccc");
            const std::string whole = std::string("aaa\nbbb\nccc\n").substr(0, room / 4 * 4);
            if (truncateError == 0) {
                EXPECT_EQ(content(), whole);
            }
            operations_.room = 0;
            write(file, "ddd");
            operations_.room.reset();
            operations_.truncateError = 0;
            write(file, "eee");
            EXPECT_EQ(content(), whole + "eee\n");
            const std::string lost = std::to_string(3 - room / 4 + 1);
            EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("No space left"),
                                                 HasSubstr("; " + lost + " records were lost")));
        }
    }
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
    std::map<std::string, int> lines;
    for (const std::string& content : files()) {
        EXPECT_LE(content.size(), 10'000U);
        std::istringstream text(content);
        for (std::string line; std::getline(text, line);) {
            ++lines[line];
        }
    }
    EXPECT_THAT(lines, ElementsAre(Pair("another's", kLines), Pair("from one", kLines)));
}

class LinuxAnalyticsEventServiceTest : public Test {
protected:
    void useEvents(const Value& patterns) {
        preferences_.setPreferenceValue("events_in_use", "com.vandra.tamblo.analytics", patterns);
    }

    TemporaryDirectory directory_;
    FakeLog log_;
    LinuxPreferences preferences_{directory_.path(), log_};
    FakeClock clock_;
    SinkFiles sinks_{directory_.path(), log_};
    LinuxAnalyticsEventService events_{sinks_, clock_, preferences_, log_};
};

TEST_F(LinuxAnalyticsEventServiceTest, AnswersWhichEventsAreInUse) {
    const struct {
        Value patterns;
        const char *inUse, *notInUse;
    } cases[] = {
        {Array{"a.b", "c.*"}, "a.b c. c.d", "a.bc a c cd"},
        {Array{"*"}, "a x", ""},
        {Array{}, "", "a.b c.d"},
        {Array{"a*", "a.b*c", "*d"}, "a a.b", "d xd"},
        {"a", "a zz", ""},
        {Array{1, "1x"}, "1x", "1 a"},
    };
    EXPECT_TRUE(events_.isEventInUse("a.b"));
    for (const auto& [patterns, inUse, notInUse] : cases) {
        useEvents(patterns);
        for (const auto& [names, isInUse] : {std::pair(inUse, true), {notInUse, false}}) {
            std::istringstream words(names);
            for (std::string name; words >> name;) {
                EXPECT_EQ(events_.isEventInUse(name), isInUse) << inUse << ": " << name;
            }
        }
    }
    preferences_.setPreferenceValue("k", "d", 1); // no news of these
    EXPECT_TRUE(events_.isEventInUse("1x"));
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("analytics.json: events_in_use is no array"),
                                         HasSubstr("analytics.json: events_in_use holds what is no name")));
}

TEST_F(LinuxAnalyticsEventServiceTest, WritesTheEventsThatAreInUse) {
    useEvents(Array{"e1", "e\"2"});
    Dictionary payload{{"k", 1}, {"t", "x\ny"}};
    const auto provider = [&] { // called for events in use only, or the times below are others
        clock_.advance(std::chrono::milliseconds(250));
        return payload;
    };
    clock_.set({});
    for (const char* name : {"e1", "e3", "e\"2"}) {
        events_.sendEventLazy(name, provider);
    }
    payload.set("k", 2); // the same dictionary, another payload
    events_.sendEventLazy("e1", provider);
    sinks_.flush();
    events_.sendEventLazy("e1", provider); // another message, though with the payload of the last
    sinks_.flush();
    EXPECT_THAT(test::linesOf(directory_.path("analytics-events.jsonl")),
                ElementsAre(R"({"time":0.25,"event":"e1","payload":{"k":1,"t":"x\ny"}})",
                            R"({"time":0.25,"event":"e\"2","payload":{"k":1,"t":"x\ny"}})",
                            R"({"time":0.75,"event":"e1","payload":{"k":2,"t":"x\ny"}})",
                            R"({"time":1.0,"event":"e1","payload":{"k":2,"t":"x\ny"}})"));
}

class LinuxReportFilesTest : public Test {
protected:
    /// The file's name, or why there is none.
    std::string create(const std::string& name) {
        auto created = files.createFile(directory.path(name));
        if (auto* const refusal = std::get_if<std::string>(&created)) {
            return *refusal;
        }
        file = std::get<std::unique_ptr<ReportFile>>(std::move(created));
        return name;
    }
    static fs::perms modeOf(const std::string& path) { return fs::status(path).permissions(); }

    TemporaryDirectory directory;
    FaultyOperations operations;
    LinuxReportFiles files{directory.path(), operations};
    std::unique_ptr<ReportFile> file;
};

TEST_F(LinuxReportFilesTest, DirectoriesAreForEverybodyWhateverTheMask) {
    const std::string reporting = files.reportingLogsDirectory();
    EXPECT_EQ(reporting, directory.path("DiagnosticLogs/Audio/Reporting"));
    const mode_t before = ::umask(0077);
    EXPECT_EQ(files.createDirectory(reporting), std::nullopt);
    ::umask(before);
    for (const char* name : {"DiagnosticLogs", "DiagnosticLogs/Audio", "DiagnosticLogs/Audio/Reporting"}) {
        EXPECT_EQ(modeOf(directory.path(name)), fs::perms::all) << name;
    }
    EXPECT_EQ(modeOf(directory.path()), fs::perms::owner_all);

    fs::remove_all(directory.path("DiagnosticLogs"));
    directory.write("DiagnosticLogs", "a file");
    EXPECT_EQ(files.createDirectory(reporting), "Not a directory");
}

TEST_F(LinuxReportFilesTest, AFileTakesThePlaceOfARegularOneOnly) {
    operations.largestWrite = 7;
    operations.interruptions = 1000;
    directory.write("report", "an old and longer report, of which nothing must be left");
    ASSERT_EQ(create("report"), "report");
    EXPECT_EQ(directory.read("report"), "");
    EXPECT_EQ(file->write("written in many pieces, most of them interrupted"), std::nullopt);
    operations.room = 2;
    EXPECT_EQ(file->write("; lost"), "No space left on device");
    operations.room.reset();
    EXPECT_EQ(file->write("."), std::nullopt);
    EXPECT_EQ(file->close(), std::nullopt);
    const std::string text = "written in many pieces, most of them interrupted; .";
    EXPECT_EQ(directory.read("report"), text);

    const mode_t before = ::umask(0);
    EXPECT_EQ(create("new"), "new");
    ::umask(before);
    EXPECT_EQ(modeOf(directory.path("new")), fs::perms{0644});

    fs::create_symlink(directory.path("report"), directory.path("link"));
    ::mkfifo(directory.path("pipe").c_str(), 0600);
    EXPECT_EQ(create("link"), "Too many levels of symbolic links");
    EXPECT_EQ(create("pipe"), "No such device or address");
    EXPECT_EQ(create("gone/report"), "No such file or directory");
    EXPECT_EQ(std::get<std::string>(files.createFile("/dev/full")), "not a regular file");
    EXPECT_EQ(directory.read("report"), text);
}

} // namespace
} // namespace tamblo
