#include "os/FileDescriptor.h"
#include "platform/LogOrigin.h"
#include "platform/linux/log/LinuxStructuredLog.h"
#include "platform/linux/log/LinuxTracePoints.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <algorithm>
#include <array>
#include <deque>
#include <numeric>
#include <random>
#include <regex>

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

namespace tamblo {
namespace {

using namespace testing;

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
    const std::pair<const char*, const char*> cases[] = {
        {"", "default default"},
        {"error,zrrs=debug", "debug error"},
        {" zrrs = info , fault ,, zrrs=default", "default fault"},
        {"loud,zrrs=,zrrc=Debug,info,zrxx=info,=error", "info info loud zrrs= zrrc=Debug zrxx=info =error"},
    };
    const char* const names[] = {"debug", "info", "default", "error", "fault"};
    for (const auto& [words, expected] : cases) {
        const LogFilter filter(words);
        std::string read = names[static_cast<int>(filter.threshold("zrrs"))];
        read += std::string(" ") + names[static_cast<int>(filter.threshold("zrrc"))];
        for (const std::string& unknown : filter.unknownWords()) {
            read += " " + unknown;
        }
        EXPECT_EQ(read, expected) << words;
    }
}

TEST(LogLimiterTest, CountsWhatClientsMayNotHaveWritten) {
    LogLimiter limiter;
    LogLimiter::Time now{};
    const auto kindOf = [](std::string_view format, LogLevel level = LogLevel::standard) {
        return LogKind{level, "zrrs", format, std::source_location::current()};
    };
    const auto admitted = [&](uid_t user, const LogKind& kind, unsigned lines, pid_t process = 7) {
        unsigned count = 0;
        for (unsigned line = 0; line < lines; ++line) {
            count += limiter.admits({user, process}, kind, now) ? 1 : 0;
        }
        return count;
    };
    const auto told = [&] {
        std::string text;
        while (const auto leftOut = limiter.takeLeftOut(now)) {
            text += formatted("{} {} {} {}; ", leftOut->kind.format, leftOut->lines, leftOut->last.user,
                              leftOut->last.process);
        }
        return text;
    };

    EXPECT_EQ(admitted(1, kindOf("a"), 200'000), LogLimiter::kLinesOfKind);
    EXPECT_EQ(admitted(2, kindOf("a"), 5), 5U) << "another user has a share of its own";
    EXPECT_EQ(admitted(1, kindOf("a"), 11, 8), LogLimiter::kLinesOfKind) << "so has another client";
    unsigned all = 2 * LogLimiter::kLinesOfKind;
    for (const char* format : {"b", "c", "d"}) {
        all += admitted(1, kindOf(format), 11);
    }
    EXPECT_EQ(all, LogLimiter::kLinesOfUser);
    EXPECT_EQ(admitted(1, kindOf("x", LogLevel::error), 9), 9U) << "no stream of others hides an error";
    EXPECT_EQ(told(), "") << "the second is not over";

    now += LogLimiter::kPeriod;
    EXPECT_EQ(admitted(1, kindOf("b"), 12), LogLimiter::kLinesOfKind);
    EXPECT_EQ(told(), "a 199991 1 8; b 3 1 7; c 1 1 7; d 11 1 7; ");
    EXPECT_FALSE(limiter.hasLeftOut());

    // Many users at a time, and again: whoever has no place shares one, and nothing goes uncounted.
    for (int second = 0; second < 2; ++second) {
        now += LogLimiter::kPeriod;
        unsigned written = 0;
        for (uid_t user = 0; user < 100; ++user) {
            written += admitted(user, kindOf("a"), 12);
        }
        EXPECT_EQ(written, LogLimiter::kUsers * LogLimiter::kLinesOfKind);
    }
    std::uint64_t leftOut = 0;
    now += LogLimiter::kPeriod;
    while (const auto taken = limiter.takeLeftOut(now)) {
        leftOut += taken->lines;
    }
    EXPECT_EQ(leftOut, 2U * (100 * 12 - LogLimiter::kUsers * LogLimiter::kLinesOfKind));
}

/// A pipe or socket that takes the log in.
struct LogReader {
    explicit LogReader(bool isSocket) {
        int ends[2];
        EXPECT_EQ(isSocket ? ::socketpair(AF_UNIX, SOCK_STREAM, 0, ends) : ::pipe(ends), 0);
        in = FileDescriptor(ends[0]);
        out = FileDescriptor(ends[1]);
        ::fcntl(in.get(), F_SETFL, O_NONBLOCK);
    }
    std::string take() const {
        std::string text;
        std::array<char, 4096> bytes;
        for (ssize_t count = 0; (count = ::read(in.get(), bytes.data(), bytes.size())) > 0;) {
            text.append(bytes.data(), static_cast<std::size_t>(count));
        }
        return text;
    }

    FileDescriptor in, out;
};

TEST(LinuxStructuredLogTest, WritesHarmlessLinesOfBoundedLength) {
    const LogReader reader(false);
    LinuxStructuredLog log(reader.out.get(), "bogus");
    EXPECT_THAT(reader.take(),
                MatchesRegex("<3>zrrs        LinuxStructuredLog:[0-9 ]{5} TAMBLO_LOG: \"bogus\".*\n"));
    LinuxStructuredLog(reader.out.get(), "debug,zrrs=fault").report(LogLevel::error, "zrrs", "off");
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
        EXPECT_THAT(line, MatchesRegex("<5>zrrr x+(€|€u|€ur)?(…|€uro)\n"));
    }
}

TEST(LinuxStructuredLogTest, NeitherWaitsForAReaderNorEndsWithIt) {
    for (const bool isSocket : {false, true}) {
        LogReader reader(isSocket);
        LinuxStructuredLog log(reader.out.get(), "");
        EXPECT_EQ(::fcntl(reader.out.get(), F_GETFL) & O_NONBLOCK, 0) << "others share that description";
        const std::string filling(5000, 'x');
        for (int line = 0; line < 200; ++line) { // more than a pipe or a socket holds
            log.write(LogLevel::info, "zrrs", filling);
        }
        std::size_t whole = 0;
        std::string text = reader.take();
        for (const std::string line = "<6>zrrs " + filling + "\n"; text.starts_with(line); ++whole) {
            text.erase(0, line.size());
        }
        EXPECT_LT(whole, 200U);
        log.write(LogLevel::info, "zrrs", "again");
        text += reader.take();
        EXPECT_THAT(text.substr(text.find("\n<3>") + 1),
                    MatchesRegex("<3>zrrs        LinuxStructuredLog:[0-9 ]{5} " +
                                 std::to_string(200 - whole) +
                                 " log lines were dropped here\n<6>zrrs again\n"));
        reader.in.reset();
        log.write(LogLevel::info, "zrrs", "to nobody");
    }
}

TEST(LinuxStructuredLogTest, LimitsWhatClientsCauseAndNothingElse) {
    const auto linesOf = [](std::string_view filter, std::optional<ClientIdentity> client, bool isOwn) {
        const LogReader reader(false);
        {
            LinuxStructuredLog log(reader.out.get(), filter);
            const LogOrigin outer(ClientIdentity{77, 1});
            const LogOrigin origin(client);
            for (int line = 0; line < 500; ++line) {
                isOwn ? log.report(LogLevel::error, "zrrs", "no disk")
                      : log.reportOfClient(LogLevel::error, "zrrs", "no reporter {}", line);
            }
        }
        return reader.take();
    };
    const auto count = [](const std::string& text) { return std::ranges::count(text, '\n'); };
    const std::string limited = linesOf("", ClientIdentity{1000, 4242}, false);
    std::smatch told;
    ASSERT_TRUE(std::regex_search(limited, told,
                                  std::regex("<3>zrrs +LogTest:[0-9]+ +([0-9]+) further lines like "
                                             "\"no reporter \\{\\}\" were left out. uid=1000 pid=4242\n$")));
    EXPECT_EQ(count(limited) - 1 + std::stoi(told[1]), 500);
    EXPECT_EQ(count(linesOf("", ClientIdentity{1000, 4242}, true)), 500) << "the service's own";
    EXPECT_EQ(count(linesOf("", std::nullopt, false)), 500) << "nobody's";
    EXPECT_EQ(count(linesOf("zrrs=info", ClientIdentity{1000, 4242}, false)), 500) << "asked for";
}

TEST(LinuxTracePointsTest, WritesTheCodeToTheFirstMarkerThereIs) {
    const TemporaryDirectory directory;
    directory.write("marker", "");
    const std::string missing = directory.path("missing"), marker = directory.path("marker");
    const char* const files[] = {missing.c_str(), marker.c_str()};
    LinuxTracePoints(files).EmitTracePoint(0x21044838);
    EXPECT_EQ(directory.read("marker"), "tamblo 0x21044838\n");
}

} // namespace
} // namespace tamblo
