#include "os/FileDescriptor.h"
#include "platform/linux/log/LinuxStructuredLog.h"
#include "platform/linux/log/LinuxTracePoints.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <array>
#include <deque>
#include <numeric>
#include <random>

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

namespace tamblo {
namespace {

TEST(LogRingTest, HoldsTheLastLinesWithinBothLimits) {
    std::mt19937 random(7);
    for (const std::size_t longest : {40UL, 8192UL}) { // for the limit on lines, and for that on bytes
        LogRing ring;
        std::deque<std::string> expected;
        std::size_t size = 0;
        for (int added = 0; added < 3000; ++added) {
            expected.push_back(std::string(random() % longest, static_cast<char>('a' + added % 26)) + '\n');
            ring.add(expected.back());
            size += expected.back().size();
            while (expected.size() > LogRing::kMaximumLines || size > LogRing::kMaximumBytes) {
                size -= expected.front().size();
                expected.pop_front();
            }
        }
        EXPECT_EQ(ring.text(), std::accumulate(expected.begin(), expected.end(), std::string()));
    }
}

TEST(LogFilterTest, ReadsLevelsForAllAndForSingleCategories) {
    const struct {
        const char* words;
        LogLevel zrrs, zrrc;
        std::vector<std::string> unknown;
    } cases[] = {
        {"", LogLevel::standard, LogLevel::standard, {}},
        {"error,zrrs=debug", LogLevel::debug, LogLevel::error, {}},
        {" zrrs = info , fault ,, zrrs=default", LogLevel::standard, LogLevel::fault, {}},
        {"loud,zrrs=,zrrc=Debug,zr=info,info,=error",
         LogLevel::info,
         LogLevel::info,
         {"loud", "zrrs=", "zrrc=Debug", "zr=info", "=error"}},
    };
    for (const auto& [words, zrrs, zrrc, unknown] : cases) {
        const LogFilter filter(words);
        EXPECT_EQ(filter.threshold("zrrs"), zrrs) << words;
        EXPECT_EQ(filter.threshold("zrrc"), zrrc) << words;
        EXPECT_EQ(filter.unknownWords(), unknown) << words;
    }
}

/// The end of a pipe or socket that takes the log in.
class LogReader {
public:
    explicit LogReader(bool isSocket) {
        int ends[2];
        EXPECT_EQ(isSocket ? ::socketpair(AF_UNIX, SOCK_STREAM, 0, ends) : ::pipe(ends), 0);
        in_ = FileDescriptor(ends[0]);
        out_ = FileDescriptor(ends[1]);
        ::fcntl(in_.get(), F_SETFL, O_NONBLOCK);
    }
    [[nodiscard]] int writeEnd() const { return out_.get(); }
    void close() { in_.reset(); }
    std::string take() {
        std::string text;
        std::array<char, 4096> bytes;
        for (ssize_t count = 0; (count = ::read(in_.get(), bytes.data(), bytes.size())) > 0;) {
            text.append(bytes.data(), static_cast<std::size_t>(count));
        }
        return text;
    }

private:
    FileDescriptor in_, out_;
};

TEST(LinuxStructuredLogTest, WritesHarmlessLinesOfBoundedLength) {
    LogReader reader(false);
    LinuxStructuredLog log(reader.writeEnd(), "bogus");
    EXPECT_THAT(reader.take(), testing::MatchesRegex(
                                   "<3>zrrs        LinuxStructuredLog:[0-9 ]{5} TAMBLO_LOG: \"bogus\".*\n"));
    LinuxStructuredLog(reader.writeEnd(), "debug,zrrs=fault").report(LogLevel::error, "zrrs", "off");
    EXPECT_EQ(reader.take(), "");
    log.write(LogLevel::fault, "zrrc", "a\n<3>zrrs forged\r\t\x1b[2J\x7f \xC2\x9B é \\");
    log.write(LogLevel::debug, "zrrr", "");
    const std::string lines = reader.take();
    EXPECT_EQ(lines, "<2>zrrc a\\n<3>zrrs forged\\r\\t\\x1b[2J\\x7f \\x9b é \\\n<7>zrrr \n");
    EXPECT_TRUE(log.lastLines().ends_with(lines));
    for (std::size_t length = 8170; length < 8190; ++length) {
        log.write(LogLevel::standard, "zrrr", std::string(length, 'x') + "€uro");
        const std::string line = reader.take();
        EXPECT_LE(line.size(), LinuxStructuredLog::kMaximumLine);
        EXPECT_THAT(line, testing::AnyOf(testing::EndsWith("x…\n"), testing::EndsWith("€…\n"),
                                         testing::EndsWith("€uro\n"), testing::EndsWith("€u…\n"),
                                         testing::EndsWith("€ur…\n")));
    }
}

TEST(LinuxStructuredLogTest, NeitherWaitsForAReaderNorEndsWithIt) {
    for (const bool isSocket : {false, true}) {
        LogReader reader(isSocket);
        LinuxStructuredLog log(reader.writeEnd(), "");
        EXPECT_EQ(::fcntl(reader.writeEnd(), F_GETFL) & O_NONBLOCK, 0) << "others share that description";
        const std::string filling(5000, 'x');
        for (int line = 0; line < 200; ++line) { // more than a pipe or a socket holds
            log.write(LogLevel::info, "zrrs", filling);
        }
        std::size_t whole = 0;
        std::string text = reader.take();
        std::istringstream lines(text);
        for (std::string line; std::getline(lines, line);) {
            whole += line == "<6>zrrs " + filling && !lines.eof() ? 1 : 0;
        }
        EXPECT_LT(whole, 200U);
        log.write(LogLevel::info, "zrrs", "again");
        text += reader.take();
        EXPECT_THAT(text.substr(text.find("\n<3>") + 1),
                    testing::MatchesRegex("<3>zrrs        LinuxStructuredLog:[0-9 ]{5} " +
                                          std::to_string(200 - whole) +
                                          " log lines were dropped here\n<6>zrrs again\n"));
        reader.close();
        log.write(LogLevel::info, "zrrs", "to nobody");
    }
}

TEST(LinuxTracePointsTest, WritesTheCodeToTheFirstMarkerThereIs) {
    const TemporaryDirectory directory;
    directory.write("marker", "");
    const std::string missing = directory.path("missing"), marker = directory.path("marker");
    const char* const files[] = {missing.c_str(), marker.c_str()};
    LinuxTracePoints(files).EmitTracePoint(0x21044838);
    EXPECT_EQ(directory.read("marker"), "tamblo 0x21044838\n");
    LinuxTracePoints(std::span(files).first(1)).EmitTracePoint(1);
}

} // namespace
} // namespace tamblo
