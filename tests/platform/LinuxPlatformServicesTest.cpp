#include "os/FileDescriptor.h"
#include "platform/linux/device/LinuxClock.h"
#include "platform/linux/device/LinuxProcessInformation.h"
#include "platform/linux/log/LinuxStructuredLog.h"
#include "platform/linux/log/LinuxTracePoints.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "platform/linux/sinks/LinuxAnalyticsEventService.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gmock/gmock.h>

#include <array>
#include <cstdlib>
#include <ctime>
#include <utility>

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

namespace tamblo {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

TEST(LinuxClockTest, TheOffsetIsThatOfTheZoneOfTheMoment) {
    const char* before = ::getenv("TZ");
    const std::string zone = before != nullptr ? before : "";
    constexpr std::pair<const char*, int> cases[] = {{"ABC-5:45", 20'700}, {"ABC3:30", -12'600}};
    for (const auto& [name, offset] : cases) {
        ::setenv("TZ", name, 1);
        EXPECT_EQ(LinuxClock().utcOffset(WallTime()).count(), offset) << name;
    }
    before != nullptr ? ::setenv("TZ", zone.c_str(), 1) : ::unsetenv("TZ");
    ::tzset();
}

class SteppingClock final : public Clock {
public:
    [[nodiscard]] WallTime now() const noexcept override {
        return WallTime(std::chrono::milliseconds(250 * ++reads_));
    }
    [[nodiscard]] std::chrono::seconds utcOffset(WallTime) const override { return {}; }

    void sleepFor(std::chrono::microseconds) override {}

private:
    mutable int reads_ = 0;
};

class LinuxAnalyticsEventServiceTest : public testing::Test {
protected:
    LinuxAnalyticsEventServiceTest() { std::filesystem::create_directory(path_); }

    void write(const std::string& domain, const std::string& content) {
        directory_.write("preferences/" + domain + ".json", content);
        readChanges();
    }
    /// Those that must have come.
    void readChanges() {
        const std::uint64_t before = preferences_.generation();
        while (isReadable(preferences_.fileDescriptor(), preferences_.generation() == before ? 2000 : 0)) {
            preferences_.readChanges();
        }
        EXPECT_NE(preferences_.generation(), before);
    }
    void useEvents(const std::string& patterns) {
        write("com.vandra.tamblo.analytics", R"({"events_in_use":)" + patterns + "}");
    }

    TemporaryDirectory directory_;
    const std::string path_ = directory_.path("preferences");
    RecordingLog log_;
    LinuxPreferences preferences_{path_, log_};
    SteppingClock clock_;
    SinkFiles sinks_{directory_.path(), log_};
    LinuxAnalyticsEventService events_{sinks_, clock_, preferences_, log_};
};

TEST_F(LinuxAnalyticsEventServiceTest, AnswersWhichEventsAreInUse) {
    const struct {
        const char *patterns, *inUse, *notInUse;
    } cases[] = {
        {R"(["a.b", "c.*"])", "a.b c. c.d", "a.bc a c cd"},
        {R"(["*"])", "a x", ""},
        {"[]", "", "a.b c.d"},
        {R"(["a*", "a.b*c", "*d"])", "a a.b", "d xd"},
        {R"("a")", "a zz", ""},
        {R"([1, "1x"])", "1x", "1 a"},
    };
    EXPECT_TRUE(events_.isEventInUse("a.b"));
    for (const auto& [patterns, inUse, notInUse] : cases) {
        useEvents(patterns);
        std::istringstream yes(inUse), no(notInUse);
        for (std::string name; yes >> name;) {
            EXPECT_TRUE(events_.isEventInUse(name)) << patterns << " " << name;
        }
        for (std::string name; no >> name;) {
            EXPECT_FALSE(events_.isEventInUse(name)) << patterns << " " << name;
        }
    }
    write("d", R"({"k": 1})"); // no news of this file
    EXPECT_TRUE(events_.isEventInUse("1x"));
    EXPECT_THAT(log_.take(), ElementsAre(HasSubstr("analytics.json: events_in_use is no array"),
                                         HasSubstr("analytics.json: events_in_use holds what is no name")));
    std::filesystem::remove(directory_.path("preferences/com.vandra.tamblo.analytics.json"));
    readChanges();
    EXPECT_TRUE(events_.isEventInUse("a.b"));
}

TEST_F(LinuxAnalyticsEventServiceTest, WritesTheEventsThatAreInUse) {
    useEvents(R"(["e1", "e\"2"])");
    int calls = 0;
    Dictionary payload{{"k", 1}, {"t", "x\ny"}};
    const auto provider = [&] {
        ++calls;
        return payload;
    };
    events_.sendEventLazy("e1", provider);
    events_.sendEventLazy("e3", provider);
    events_.sendEventLazy("e\"2", provider);
    payload.set("k", 2); // the same dictionary, another payload
    events_.sendEventLazy("e1", provider);
    EXPECT_EQ(calls, 3);
    EXPECT_EQ(directory_.read("analytics-events.jsonl"), "");
    sinks_.flush();
    events_.sendEventLazy("e1", [] { return Dictionary(); });
    sinks_.flush();
    EXPECT_EQ(directory_.read("analytics-events.jsonl"),
              R"({"time":0.25,"event":"e1","payload":{"k":1,"t":"x\ny"}})"
              "\n"
              R"({"time":0.25,"event":"e\"2","payload":{"k":1,"t":"x\ny"}})"
              "\n"
              R"({"time":0.5,"event":"e1","payload":{"k":2,"t":"x\ny"}})"
              "\n"
              R"({"time":0.75,"event":"e1","payload":{}})"
              "\n");
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
    EXPECT_EQ(reader.take(), "<2>zrrc a\\n<3>zrrs forged\\r\\t\\x1b[2J\\x7f \\x9b é \\\n<7>zrrr \n");
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

TEST(LinuxProcessInformationTest, NamesLivingProcessesInUtf8) {
    const LinuxProcessInformation information;
    std::string comm;
    std::getline(std::ifstream("/proc/self/comm"), comm);
    EXPECT_EQ(information.ProcessNameForPid(::getpid()), comm);
    EXPECT_EQ(information.ProcessNameForPid(0), std::nullopt);
    EXPECT_EQ(information.ProcessNameForPid(0x7FFFFFFF), std::nullopt);
    std::ofstream("/proc/self/comm") << "0123456789abc\u20AC";
    EXPECT_EQ(information.ProcessNameForPid(::getpid()), "0123456789abc");
    std::ofstream("/proc/self/comm") << "a\xFF"
                                        "b\xC3";
    EXPECT_EQ(information.ProcessNameForPid(::getpid()), "a?b?");
    std::ofstream("/proc/self/comm") << comm;
}

} // namespace
} // namespace tamblo
