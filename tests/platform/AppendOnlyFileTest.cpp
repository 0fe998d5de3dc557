#include "platform/linux/sinks/AppendOnlyFile.h"
#include "tests/platform/FaultyOperations.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <future>
#include <memory>
#include <new>
#include <thread>

#include <sys/stat.h>

namespace tamblo {
namespace {

using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class AppendOnlyFileTest : public testing::Test {
protected:
    [[nodiscard]] std::unique_ptr<AppendOnlyFile> open(SinkFileLimits limits = {}) {
        return std::make_unique<AppendOnlyFile>(sinks_, "sink.jsonl", "zrrs",
                                                AppendOnlyFile::Flushed::beforeReplies, limits);
    }
    static void append(AppendOnlyFile& file, std::string_view line) {
        file.append([line](TextBuffer& out) { out.append(line); });
    }
    static void appendAndFlush(AppendOnlyFile& file, std::string_view line) {
        append(file, line);
        file.flush();
    }
    /// What the files hold, oldest first.
    [[nodiscard]] std::vector<std::string> files() const {
        std::vector<std::string> contents;
        for (int number = AppendOnlyFile::kKeptFiles + 1; number > 0; --number) {
            const std::string name = "sink.jsonl." + std::to_string(number);
            if (std::filesystem::exists(directory_.path(name))) {
                contents.push_back(directory_.read(name));
            }
        }
        contents.push_back(directory_.read("sink.jsonl"));
        return contents;
    }

    TemporaryDirectory directory_;
    RecordingLog log_;
    FaultyOperations operations_;
    SinkFiles sinks_{directory_.path(), log_, operations_};
};

TEST_F(AppendOnlyFileTest, IsWrittenWithTheOthersUnlessItsOwnerDoesIt) {
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
        EXPECT_EQ(directory_.read("first") + directory_.read("own") + directory_.read("second"), "a\na\n");
        append(second, "b");
    }
    append(first, "b");
    sinks_.flush();
    EXPECT_EQ(directory_.read("first") + directory_.read("own") + directory_.read("second"), "a\nb\na\nb\n");
}

/// Who finds nothing waiting may let replies go: not before the lines of another thread are written.
TEST_F(AppendOnlyFileTest, AFlushWaitsForTheOneThatIsWriting) {
    const auto file = open();
    std::promise<void> isWriting, mayGoOn;
    operations_.beforeWrite = [&] {
        isWriting.set_value();
        mayGoOn.get_future().wait();
    };
    append(*file, "one");
    const auto writer = std::async(std::launch::async, [&file] { file->flush(); });
    isWriting.get_future().wait();
    auto other = std::async(std::launch::async, [this] {
        sinks_.flush();
        return directory_.read("sink.jsonl");
    });
    EXPECT_EQ(other.wait_for(std::chrono::milliseconds(20)), std::future_status::timeout);
    mayGoOn.set_value();
    EXPECT_EQ(other.get(), "one\n");
}

TEST_F(AppendOnlyFileTest, WritesABatchWithOneCallAndALargeOneByItself) {
    const auto file = open({.waiting = 40});
    EXPECT_FALSE(std::filesystem::exists(directory_.path("sink.jsonl")))
        << "created with the first line only";
    append(*file, "one");
    append(*file, "two");
    EXPECT_EQ(directory_.read("sink.jsonl"), "");
    file->flush();
    file->flush();
    EXPECT_EQ(directory_.read("sink.jsonl"), "one\ntwo\n");
    EXPECT_EQ(operations_.writes, 1);
    append(*file, std::string(39, 'x'));
    EXPECT_EQ(directory_.read("sink.jsonl"), "one\ntwo\n" + std::string(39, 'x') + "\n");
    const auto mode = std::filesystem::status(directory_.path("sink.jsonl")).permissions();
    EXPECT_EQ(mode, std::filesystem::perms::owner_read | std::filesystem::perms::owner_write);
}

TEST_F(AppendOnlyFileTest, TakesALineBackThatFailsToFormat) {
    const auto file = open();
    append(*file, "one");
    EXPECT_THROW(file->append([](TextBuffer& out) {
        out.append("tw");
        throw std::bad_alloc();
    }),
                 std::bad_alloc);
    appendAndFlush(*file, "three");
    EXPECT_EQ(directory_.read("sink.jsonl"), "one\nthree\n");
}

TEST_F(AppendOnlyFileTest, CutsATornLastLineOffWhenOpened) {
    const std::string longLine(150'000, 'x');
    const struct {
        std::string before, after;
    } cases[] = {
        {"one\ntwo\n", "one\ntwo\n"},
        {"one\ntw", "one\n"},
        {"torn", ""},
        {"\n", "\n"},
        {"", ""},
        {"one\n" + longLine, "one\n"},
        {longLine, ""},
        {longLine + "\n" + std::string(65'536, 'y'), longLine + "\n"},
        {longLine + "\n" + std::string(65'535, 'y'), longLine + "\n"},
    };
    for (const auto& [before, after] : cases) {
        directory_.write("sink.jsonl", before);
        const auto file = open();
        EXPECT_EQ(directory_.read("sink.jsonl"), after);
        appendAndFlush(*file, "new");
        EXPECT_EQ(directory_.read("sink.jsonl"), after + "new\n");
    }
    EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(AppendOnlyFileTest, BeginsANewFileBeforeALineWouldMakeItTooLarge) {
    const auto file = open({.fileSize = 10});
    append(*file, "1234"); // 5 bytes
    append(*file, "5678"); // exactly full
    append(*file, "a");
    append(*file, std::string(30, 'L')); // larger than a file: has one of its own
    appendAndFlush(*file, "b");
    EXPECT_THAT(files(), ElementsAre("1234\n5678\n", "a\n", std::string(30, 'L') + "\n", "b\n"));
    for (const char* line : {"12345678", "123456789", "c"}) {
        appendAndFlush(*file, line);
    }
    EXPECT_THAT(files(), ElementsAre(std::string(30, 'L') + "\n", "b\n", "12345678\n", "123456789\n", "c\n"));
}

TEST_F(AppendOnlyFileTest, KeepsEarlierFilesWhenRenamingFailsAgainAndAgain) {
    const auto file = open({.fileSize = 4});
    for (const char* line : {"aaa", "bbb", "ccc", "ddd"}) {
        append(*file, line);
    }
    file->flush();
    ASSERT_THAT(files(), ElementsAre("aaa\n", "bbb\n", "ccc\n", "ddd\n"));
    operations_.renameError = [](std::string_view from) { return from.ends_with("jsonl") ? EACCES : 0; };
    for (const char* line : {"lost", "lost", "lost"}) {
        appendAndFlush(*file, line);
    }
    operations_.renameError = [](std::string_view) { return 0; };
    appendAndFlush(*file, "eee");
    EXPECT_THAT(files(), ElementsAre("aaa\n", "bbb\n", "ccc\n", "ddd\n", "eee\n"));
    EXPECT_THAT(log_.take(), ElementsAre(AllOf(HasSubstr("3 zrrs"), HasSubstr("rename: Permission denied")),
                                         HasSubstr("; 3 records were lost")));
}

TEST_F(AppendOnlyFileTest, CarriesOnAfterShortAndInterruptedWrites) {
    operations_.largestWrite = 3;
    operations_.interruptions = 2;
    const auto file = open();
    append(*file, "first line");
    appendAndFlush(*file, "second line");
    EXPECT_EQ(directory_.read("sink.jsonl"), "first line\nsecond line\n");
    EXPECT_THAT(log_.take(), IsEmpty());
}

/// The disk fills up at every byte of a batch in turn; whether or not the torn line can be cut off at once.
TEST_F(AppendOnlyFileTest, TearsAndDoublesNothingWhenTheDiskFillsUp) {
    for (const int truncateError : {0, EIO}) {
        for (std::size_t room = 0; room < 12; ++room) {
            std::filesystem::remove(directory_.path("sink.jsonl"));
            const auto file = open();
            operations_.room = room;
            operations_.truncateError = truncateError;
            for (const char* line : {"aaa", "bbb", "ccc"}) {
                append(*file, line);
            }
            file->flush();
            const std::string whole = std::string("aaa\nbbb\nccc\n").substr(0, room / 4 * 4);
            if (truncateError == 0) {
                EXPECT_EQ(directory_.read("sink.jsonl"), whole);
            }
            operations_.room = 0;
            appendAndFlush(*file, "ddd");
            operations_.room.reset();
            operations_.truncateError = 0;
            appendAndFlush(*file, "eee");
            EXPECT_EQ(directory_.read("sink.jsonl"), whole + "eee\n");
            const std::string lost = std::to_string(3 - room / 4 + 1);
            EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("No space left"),
                                                 HasSubstr("; " + lost + " records were lost")));
        }
    }
}

TEST_F(AppendOnlyFileTest, TellsAnOutageOnceAtItsBeginAndOnceAtItsEnd) {
    operations_.openError = EACCES;
    auto file = open();
    EXPECT_THAT(log_.take(), IsEmpty()) << "nothing is lost yet";
    for (int flush = 0; flush < 3; ++flush) {
        append(*file, "x");
        appendAndFlush(*file, "y");
    }
    EXPECT_THAT(log_.take(),
                ElementsAre(AllOf(HasSubstr(file->path()), HasSubstr("open: Permission denied"))));
    operations_.openError = 0;
    appendAndFlush(*file, "z");
    EXPECT_EQ(directory_.read("sink.jsonl"), "z\n");
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("it can be written again; 6 records were lost")));

    operations_.room = 0;
    append(*file, "x");
    file.reset();
    EXPECT_THAT(log_.take(),
                ElementsAre(HasSubstr("No space left"), HasSubstr("the service ends; 1 records")));
}

TEST_F(AppendOnlyFileTest, FollowsThePathWhenOthersTouchTheFile) {
    const auto file = open({.fileSize = 24});
    const std::string path = directory_.path("sink.jsonl");
    appendAndFlush(*file, "one");
    std::filesystem::remove(path);
    appendAndFlush(*file, "two");
    EXPECT_EQ(directory_.read("sink.jsonl"), "two\n");
    std::filesystem::rename(path, path + ".shipped");
    directory_.write("sink.jsonl", "theirs\nto");
    appendAndFlush(*file, "three");
    EXPECT_EQ(directory_.read("sink.jsonl.shipped"), "two\n");
    EXPECT_EQ(directory_.read("sink.jsonl"), "theirs\nthree\n");
    std::filesystem::resize_file(path, 0); // and the size counts from there
    appendAndFlush(*file, "0123456789");
    appendAndFlush(*file, "0123456789");
    EXPECT_THAT(files(), ElementsAre("0123456789\n0123456789\n"));

    std::filesystem::rename(directory_.path(), directory_.path() + ".away");
    appendAndFlush(*file, "lost");
    std::filesystem::rename(directory_.path() + ".away", directory_.path());
    appendAndFlush(*file, "four");
    EXPECT_THAT(files(), ElementsAre("0123456789\n0123456789\n", "four\n"));
    EXPECT_THAT(log_.take(),
                ElementsAre(HasSubstr("No such file or directory"), HasSubstr("1 records were lost")));
}

TEST_F(AppendOnlyFileTest, RefusesWhatIsNoFileWithoutWaitingForAReader) {
    ASSERT_EQ(::mkfifo(directory_.path("sink.jsonl").c_str(), 0600), 0);
    const auto file = open();
    appendAndFlush(*file, "x");
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("not a regular file")));
}

TEST_F(AppendOnlyFileTest, KeepsLinesWholeWhenThreadsAppendAndFilesRotate) {
    constexpr int kLines = 2000;
    {
        const auto file = open({.fileSize = 30'000, .waiting = 512});
        const auto work = [&file](char name) {
            for (int number = 0; number < kLines; ++number) {
                append(*file, name + std::to_string(number));
                if (number % 7 == 0) {
                    file->flush();
                }
            }
        };
        std::thread other(work, 'b');
        work('a');
        other.join();
    }
    std::string text;
    for (const std::string& content : files()) {
        EXPECT_LE(content.size(), 30'000U);
        text += content;
    }
    std::istringstream lines(text);
    int next[2] = {0, 0};
    for (std::string line; std::getline(lines, line);) {
        ASSERT_THAT(line.front(), testing::AnyOf('a', 'b'));
        EXPECT_EQ(line.substr(1), std::to_string(next[line.front() - 'a']++));
    }
    EXPECT_EQ(next[0], kLines);
    EXPECT_EQ(next[1], kLines);
}

} // namespace
} // namespace tamblo
