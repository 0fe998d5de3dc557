#include "base/Format.h"
#include "tests/Files.h"
#include "tools/export/Cursor.h"
#include "tools/export/SinkBacklog.h"

#include <gmock/gmock.h>

#include <random>
#include <set>

// What an export finds in a sink's files, whatever becomes of them meanwhile.

namespace tamblo::tools {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

std::string numberedLine(int number, std::size_t filling = 0) {
    return formatted("{\"time\":{}.5,\"n\":{},\"filling\":\"{}\"}\n", 1'795'271'169 + number, number,
                     std::string(filling, 'x'));
}

/// A sink of a service that is not there.
class WrittenSink {
public:
    [[nodiscard]] std::string path(int file = 0) const {
        return directory_.path(file == 0 ? "sink.jsonl" : formatted("sink.jsonl.{}", file));
    }
    void append(std::string_view text) const { test::writeFile(path(), text, std::ios::app); }
    void write(int first, int behindLast) const {
        for (int number = first; number != behindLast; ++number) {
            append(numberedLine(number));
        }
    }
    void rotate() const {
        for (int file = 4; file > 0; --file) {
            if (std::filesystem::exists(path(file - 1))) {
                std::filesystem::rename(path(file - 1), path(file));
            }
        }
    }

private:
    TemporaryDirectory directory_;
};

/// The numbers of the lines of all pieces, of so many lines each, in their order.
std::vector<int> takeAll(SinkBacklog& backlog, Order order, std::uint64_t lines = 1000) {
    std::vector<int> numbers;
    for (Piece piece = backlog.next(order, lines); piece.lines != 0; piece = backlog.next(order, lines)) {
        EXPECT_LE(piece.lines, lines);
        for (std::size_t at = piece.text.find("\"n\":"); at != piece.text.npos;
             at = piece.text.find("\"n\":", at + 1)) {
            numbers.push_back(std::stoi(piece.text.substr(at + 4)));
        }
        backlog.take(piece);
    }
    return numbers;
}

std::vector<int> takeAll(const std::string& path, SinkProgress& progress, MissedLines* missed = nullptr) {
    SinkBacklog backlog(path, progress);
    const MissedLines found = backlog.look();
    if (missed != nullptr) {
        *missed = found;
    }
    const auto numbers = takeAll(backlog, Order::oldestFirst);
    progress = backlog.progress();
    return numbers;
}

TEST(SinkBacklog, HandsOverEachLineOnceWhateverTheOrderAndTheRenamings) {
    for (const Order order : {Order::oldestFirst, Order::newestFirst}) {
        std::mt19937 random(order == Order::oldestFirst ? 1 : 2);
        WrittenSink sink;
        int written = 0;
        int rotations = 0;
        std::multiset<int> taken;
        SinkProgress progress;
        for (int round = 0; round != 40; ++round) {
            SinkBacklog backlog(sink.path(), progress);
            for (int step = 0; step != 8; ++step) {
                const int count = static_cast<int>(random() % 20);
                sink.write(written, written + count);
                written += count;
                if (random() % 40 == 0 && ++rotations <= 4) {
                    sink.rotate();
                }
                EXPECT_TRUE(backlog.look().isEmpty());
                const Piece piece = backlog.next(order, 1 + random() % 30);
                for (std::size_t at = piece.text.find("\"n\":"); at != piece.text.npos;
                     at = piece.text.find("\"n\":", at + 1)) {
                    taken.insert(std::stoi(piece.text.substr(at + 4)));
                }
                backlog.take(piece);
            }
            progress = backlog.progress();
        }
        SinkBacklog last(sink.path(), progress);
        EXPECT_TRUE(last.look().isEmpty());
        for (const int number : takeAll(last, order)) {
            taken.insert(number);
        }
        EXPECT_EQ(taken.size(), static_cast<std::size_t>(written));
        EXPECT_EQ(std::set<int>(taken.begin(), taken.end()).size(), static_cast<std::size_t>(written));
        EXPECT_EQ(last.leftLines(), 0U);
    }
}

TEST(SinkBacklog, GivesTheNewestFirstAndOnlyWholeLines) {
    WrittenSink sink;
    sink.write(0, 3);
    sink.rotate();
    sink.write(3, 6);
    sink.append(R"({"time":5,"n":6,)");
    SinkBacklog backlog(sink.path(), {});
    EXPECT_TRUE(backlog.look().isEmpty());
    const Piece piece = backlog.next(Order::newestFirst, 2);
    backlog.take(piece);
    EXPECT_EQ(piece.text, numberedLine(4) + numberedLine(5));
    sink.append("\"z\":0}\n" + numberedLine(7));
    EXPECT_TRUE(backlog.look().isEmpty());
    EXPECT_THAT(takeAll(backlog, Order::newestFirst), ElementsAre(6, 7, 3, 0, 1, 2));
    // Long lines make pieces of their own; of one that is too long only its place.
    sink.append(numberedLine(8, SinkBacklog::kPieceBytes) + numberedLine(9, SinkBacklog::kLongestLine) +
                numberedLine(10));
    for (const Order order : {Order::newestFirst, Order::oldestFirst}) {
        SinkBacklog other(sink.path(), backlog.progress());
        EXPECT_TRUE(other.look().isEmpty());
        EXPECT_EQ(takeAll(other, order),
                  order == Order::newestFirst ? std::vector({10, 8}) : std::vector({8, 10}));
        EXPECT_EQ(other.leftLines(), 0U);
    }
}

TEST(SinkBacklog, CountsWhatIsInNoFileAnyMore) {
    WrittenSink sink;
    SinkProgress progress;
    MissedLines missed;
    sink.write(0, 10);
    {
        SinkBacklog backlog(sink.path(), {});
        EXPECT_TRUE(backlog.look().isEmpty());
        backlog.take(backlog.next(Order::oldestFirst, 4));
        progress = backlog.progress();
    }
    // The file that was written to last stays: what is lost has been counted.
    sink.rotate();
    sink.write(10, 12);
    SinkProgress before = progress;
    {
        SinkBacklog backlog(sink.path(), progress);
        EXPECT_TRUE(backlog.look().isEmpty());
        before = backlog.progress();
    }
    std::filesystem::remove(sink.path(1));
    EXPECT_THAT(takeAll(sink.path(), before, &missed), ElementsAre(10, 11));
    EXPECT_EQ(missed.known, 6U);
    EXPECT_FALSE(missed.uncounted);
    // It goes, too: more may have been written to it, until the first line that is left.
    EXPECT_THAT(takeAll(sink.path(), progress, &missed), ElementsAre(10, 11));
    EXPECT_EQ(missed.known, 6U);
    ASSERT_TRUE(missed.uncounted);
    EXPECT_EQ(missed.uncounted->to, 1'795'271'169 + 10);
    EXPECT_THAT(takeAll(sink.path(), progress, &missed), IsEmpty());
    EXPECT_TRUE(missed.isEmpty()) << "said once";
}

TEST(SinkBacklog, ReadsAFileAnewThatAPowerCutTookBack) {
    WrittenSink sink;
    SinkProgress progress;
    sink.write(0, 10);
    EXPECT_THAT(takeAll(sink.path(), progress), testing::SizeIs(10));
    std::filesystem::resize_file(sink.path(), 3 * numberedLine(0).size());
    sink.write(20, 21);
    EXPECT_THAT(takeAll(sink.path(), progress), ElementsAre(0, 1, 2, 20));
    // Others stand there by now, and it is as long as it was.
    std::filesystem::resize_file(sink.path(), 3 * numberedLine(0).size());
    sink.write(30, 35);
    EXPECT_THAT(takeAll(sink.path(), progress), ElementsAre(0, 1, 2, 30, 31, 32, 33, 34));
}

TEST(SinkBacklog, HandsOverNothingOfWhatIsCutOffWhileItIsRead) {
    for (const Order order : {Order::oldestFirst, Order::newestFirst}) {
        for (const std::size_t filling : {std::size_t{0}, SinkBacklog::kPieceBytes}) {
            WrittenSink sink;
            for (const int number : {0, 1}) {
                sink.append(numberedLine(number, filling));
            }
            const std::string whole = test::contentOf(sink.path());
            SinkBacklog backlog(sink.path(), {});
            EXPECT_TRUE(backlog.look().isEmpty());
            // The last line has no end any more; then it is as long as it was, and another one.
            for (const std::string& left :
                 {whole.substr(0, whole.size() - 5), whole.substr(0, whole.size() - 5) + "xxxxx"}) {
                test::writeFile(sink.path(), left);
                const Piece piece = backlog.next(order, 1000);
                EXPECT_EQ(piece.text, order == Order::newestFirst ? "" : numberedLine(0, filling));
            }
        }
    }
}

TEST(SinkBacklog, ForgetsNothingOfAFileThatCannotBeReadForAWhile) {
    WrittenSink sink;
    SinkProgress progress;
    MissedLines missed;
    sink.write(0, 5);
    sink.rotate();
    sink.write(5, 8);
    EXPECT_THAT(takeAll(sink.path(), progress), testing::SizeIs(8));
    std::filesystem::rename(sink.path(1), sink.path(9));
    std::filesystem::create_directory(sink.path(1));
    SinkBacklog backlog(sink.path(), progress);
    EXPECT_TRUE(backlog.look().isEmpty());
    EXPECT_THAT(backlog.problems(), ElementsAre(HasSubstr("sink.jsonl.1")));
    progress = backlog.progress();
    std::filesystem::remove(sink.path(1));
    std::filesystem::rename(sink.path(9), sink.path(1));
    EXPECT_THAT(takeAll(sink.path(), progress, &missed), IsEmpty());
    EXPECT_TRUE(missed.isEmpty());
    // A copy next to the file is no further file of the sink.
    std::filesystem::copy_file(sink.path(), sink.path(2));
    SinkBacklog copied(sink.path(), progress);
    EXPECT_TRUE(copied.look().isEmpty());
    EXPECT_THAT(copied.problems(), ElementsAre(HasSubstr("begins like another file")));
    EXPECT_THAT(takeAll(copied, Order::oldestFirst), IsEmpty());
    sink.write(8, 10);
    EXPECT_TRUE(copied.look().isEmpty());
    EXPECT_THAT(takeAll(copied, Order::oldestFirst), ElementsAre(8, 9)) << "the one that goes on";
}

TEST(FileProgress, FillsGapsBeforeItHasTooManyRanges) {
    FileProgress file{.identity = {}, .counted = 1000, .tail = {}, .lines = 1000, .taken = {}};
    // A reader that takes a byte of ten that come.
    for (std::uint64_t round = 1; round != 200; ++round) {
        file.counted = 1000 + 10 * round;
        const Range left = file.lastLeft();
        file.take({left.end - 1, left.end}, 1);
        EXPECT_LE(file.taken.size(), FileProgress::kMostRanges);
    }
    EXPECT_EQ(file.takenLines, 199U);
    for (Range left = file.lastLeft(); left.begin < left.end; left = file.lastLeft()) {
        file.take({left.end - 1, left.end}, 1);
    }
    EXPECT_EQ(file.takenLines, file.counted);
}

TEST(ExportCursor, SaysWhatWasStoredToTheNextOneAndToOneAtATime) {
    const TemporaryDirectory directory;
    const std::string path = directory.path("cursor");
    {
        auto opened = Cursor::open(path, "device");
        auto& cursor = std::get<Cursor>(opened);
        cursor.set("sink", {{.identity = "first",
                             .counted = 30,
                             .tail = "t",
                             .written = 5,
                             .lines = 3,
                             .takenLines = 2,
                             .taken = {{0, 10}, {20, 30}}}});
        cursor.setSpent({.day = 20'000, .bytes = 12'345});
        EXPECT_EQ(cursor.store(), std::nullopt);
        EXPECT_THAT(std::get<std::string>(Cursor::open(path, "device")), HasSubstr("another export"));
    }
    for (const char* const device : {"device", "other"}) {
        auto opened = Cursor::open(path, device);
        const auto& cursor = std::get<Cursor>(opened);
        EXPECT_EQ(cursor.wasOfOtherDevice(), std::string(device) == "other");
        EXPECT_EQ(cursor.spent().bytes, 12'345U);
        const SinkProgress progress = cursor.progress("sink");
        ASSERT_EQ(progress.size(), 1U);
        EXPECT_EQ(progress[0].identity, "first");
        EXPECT_EQ(progress[0].leftLines(), 1U);
        EXPECT_EQ(progress[0].lastLeft().begin, 10U);
        EXPECT_EQ(progress[0].lastLeft().end, 20U);
    }
    for (const char* const text : {"", "{", "[]", R"({"version":2})", "\0"}) {
        directory.write("cursor", text);
        EXPECT_THAT(std::get<std::string>(Cursor::open(path, "device")), HasSubstr("remove it")) << text;
    }
}

} // namespace
} // namespace tamblo::tools
