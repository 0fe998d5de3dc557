#include "platform/linux/sinks/AppendOnlyFile.h"
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

} // namespace
} // namespace tamblo
