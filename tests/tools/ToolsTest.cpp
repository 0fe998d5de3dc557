#include "base/Json.h"
#include "tests/client/FakeService.h"
#include "tests/platform/LinuxServiceSupport.h"
#include "tools/Payload.h"
#include "tools/ServiceConnection.h"
#include "tools/SessionPlayer.h"
#include "tools/SinkFile.h"

namespace tamblo::tools {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;

void append(const std::string& path, std::string_view text) {
    std::ofstream(path, std::ios::app) << text;
}

TEST(Payload, WordsAndObjectsAreRead) {
    const struct {
        std::vector<std::string_view> words;
        std::string json; ///< empty: refused
    } cases[] = {
        {{}, "{}"},
        {{"n=5", "f=0.5", "b=true", "t=text"}, R"({"b":true,"f":0.5,"n":5,"t":"text"})"},
        {{"quoted=\"5\"", "empty=", "eq=a=b", "array=[1]", "null=null"},
         R"({"array":"[1]","empty":"","eq":"a=b","null":"null","quoted":"5"})"},
        {{R"({"a":{"b":[1,2]}})"}, R"({"a":{"b":[1,2]}})"},
        {{"a=1", "a=2"}, ""},
        {{"=1"}, ""},
        {{"word"}, ""},
        {{"{}", "a=1"}, ""},
        {{R"({"a":{"b":[null]}})"}, ""},
    };
    for (const auto& row : cases) {
        const auto payload = parsePayload(row.words);
        const auto* dictionary = std::get_if<Dictionary>(&payload);
        EXPECT_EQ(dictionary == nullptr ? "" : jsonText(*dictionary), row.json);
    }
}

TEST(Arguments, OptionsAreTakenApart) {
    const Option options[] = {{"--name", "X", ""}, {"--flag", "", ""}};
    const std::string_view words[] = {"a", "--name", "1", "--flag", "--name=2=3", "b", "--", "--flag"};
    const auto parsed = Arguments::parse(options, words);
    const auto& arguments = std::get<Arguments>(parsed);
    EXPECT_EQ(arguments.all("--name"), (std::vector<std::string_view>{"1", "2=3"}));
    EXPECT_TRUE(arguments.has("--flag"));
    EXPECT_EQ(arguments.rest(), (std::vector<std::string_view>{"a", "b", "--flag"}));
    for (const std::vector<std::string_view>& wrong :
         {std::vector<std::string_view>{"--other"}, {"--name"}, {"--flag=1"}, {"--nam=1"}}) {
        EXPECT_TRUE(std::holds_alternative<std::string>(Arguments::parse(options, wrong))) << wrong[0];
    }
}

TEST(ServiceConnection, TheTimeoutIsANumberOfSeconds) {
    const Option options[] = {kSocketOption, kTimeoutOption};
    const auto connect = [&options](std::string_view timeout) {
        const std::string_view words[] = {"--socket", "/nonexistent/socket", "--timeout", timeout};
        ServiceConnection service(std::get<Arguments>(Arguments::parse(options, words)));
        const auto status = service.connect();
        return status == ExitStatus::unreachable ? service.timeout() : -1ms;
    };
    EXPECT_EQ(connect(".25"), 250ms);
    EXPECT_EQ(connect("1e9"), 24h);
    for (const std::string_view wrong : {"abc", "5s", "-1", "nan", ""}) {
        EXPECT_EQ(connect(wrong), -1ms) << wrong;
    }
}

TEST(SessionFile, LinesAreReadAndWrongOnesRefused) {
    const auto parsed = parseSessionLine(
        R"({"offset_s": 0.5, "category": "Session_Playback", "type": 2, "payload": {"a": 1}, "note": "x"})");
    const auto& line = std::get<SessionLine>(parsed);
    EXPECT_EQ(line.offset, 0.5);
    EXPECT_EQ(static_cast<std::uint32_t>(line.category), 0x08000004U);
    EXPECT_EQ(line.type, client::EventType::stop);
    EXPECT_EQ(line.payload, (Dictionary{{"a", 1}}));
    for (const std::string_view wrong :
         {"[]", R"({"type": "Start"})", R"({"category": 14.5})", R"({"category": 14, "type": "Nope"})",
          R"({"category": 14, "offset_s": -1})", R"({"category": 14, "offset_s": "1"})",
          R"({"category": 14, "payload": [1]})", R"({"category": 14, "payload": {"a": null}})"}) {
        EXPECT_TRUE(std::holds_alternative<std::string>(parseSessionLine(wrong))) << wrong;
    }
}

TEST(SessionSpacing, OffsetsWinOverTimestampsAndNeitherKeepsTheTime) {
    const struct {
        std::optional<double> offset, timestamp;
        double due;
    } lines[] = {{{}, {}, 0},       {{}, 1000.0, 0},  {{}, 1002.5, 2.5}, {{}, {}, 2.5},
                 {{}, 1001.0, 2.5}, {4.0, 1001.0, 4}, {{}, 1005.0, 5}};
    SessionSpacing spacing;
    for (const auto& [offset, timestamp, due] : lines) {
        SessionLine line;
        line.offset = offset;
        if (timestamp) {
            line.payload.set(kTimestampKey, *timestamp);
        }
        EXPECT_EQ(spacing.due(line), due);
    }
}

class SessionPlayerTest : public testing::Test {
protected:
    /// Plays the lines as the options say; what is wrong with them, if anything.
    std::optional<std::string> play(SessionPlayer::Options options, const std::string& lines) {
        EXPECT_TRUE(client.connect());
        options.reporterID = 7;
        options.timeout = 5s;
        SessionPlayer player(client, options);
        std::istringstream stream(lines);
        auto wrong = player.play(stream, "file");
        report = player.report();
        requests = service.requests();
        return wrong;
    }
    /// The timestamp of a message that the service was sent.
    double timestamp(std::size_t number) {
        return requests.at(number).dictionary.find(kTimestampKey)->doubleValue();
    }
    static double now() {
        return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
    }

    test::FakeService service;
    client::Client client{{.socketPath = service.path(), .threading = client::Client::Threading::caller}};
    SessionPlayer::Report report;
    std::vector<wire::Request> requests;
};

TEST_F(SessionPlayerTest, PlaysInTimeAndStampsWhatHasNoTimestamp) {
    const auto wrong =
        play({.speed = 10}, "{\"category\": 14, \"payload\": {\"zrreporting_timestamp\": 5}}\n\n"
                            "{\"category\": 14, \"offset_s\": 0.4}\n{\"category\": }\n");
    ASSERT_TRUE(wrong);
    EXPECT_TRUE(wrong->starts_with("file:4: ")) << *wrong;
    EXPECT_EQ(report.sent, 2U);
    EXPECT_EQ(report.answered, 2U);
    EXPECT_EQ(report.refused, 0U);
    EXPECT_GE(report.seconds, 0.04);
    EXPECT_EQ(timestamp(0), 5);
    EXPECT_NEAR(timestamp(1), now(), 5);
    EXPECT_EQ(requests[1].reporterIDs, std::vector<std::int64_t>{7});
}

TEST_F(SessionPlayerTest, KeepsTheRecordedTimesAtAnySpeed) {
    const std::string recorded =
        "{\"category\": 14, \"offset_s\": 2}\n{\"category\": 14, \"offset_s\": 62}\n";
    std::istringstream lines(recorded);
    EXPECT_EQ(recordedLength(lines), 62.0);
    EXPECT_FALSE(play({.speed = {}, .recordedLength = 62}, recorded));
    EXPECT_NEAR(timestamp(1) - timestamp(0), 60, 1e-3);
    EXPECT_NEAR(timestamp(1), now(), 5);
}

TEST(RecordFilter, WantsOneOfTheEventsAndAllOfTheKeys) {
    const Dictionary record{
        {"time", 1}, {"event", "com.vandra.a"}, {"payload", Dictionary{{"n", 5}, {"t", "5"}}}};
    const struct {
        std::vector<std::string_view> events;
        std::vector<std::string_view> keys;
        bool accepts;
    } cases[] = {
        {{"x", "com.*"}, {}, true},      {{"com.vandra"}, {}, false}, {{"com.vandra.a*"}, {"n"}, true},
        {{}, {"n=5", "t=5"}, true},      {{}, {"n=6"}, false},        {{}, {"n", "missing"}, false},
        {{}, {"n=5.0", "time=1"}, true},
    };
    for (const auto& row : cases) {
        RecordFilter filter;
        std::ranges::for_each(row.events, [&](auto event) { filter.wantEvent(event); });
        std::ranges::for_each(row.keys, [&](auto key) { filter.wantKey(key); });
        EXPECT_EQ(filter.accepts(record), row.accepts) << (row.keys.empty() ? "" : row.keys[0]);
    }
    RecordFilter ofReporter;
    ofReporter.wantEvent("7");
    EXPECT_TRUE(ofReporter.accepts({{"time", 1}, {"reporter", 7}})) << "a line of the memory log";
}

TEST(SinkFollower, ReadsWholeLinesThroughRotationsAndTornEnds) {
    const TemporaryDirectory directory;
    const std::string path = directory.path("events.jsonl");
    SinkFollower follower(path);
    std::string seen;
    LineFunction collect = [&seen](std::string_view line) { seen.append(line).append(" "); };
    const auto read = [&] {
        seen.clear();
        follower.readNew(collect);
        return seen;
    };
    EXPECT_EQ(read(), "");
    append(path, "1\n2\nto");
    EXPECT_EQ(read(), "1 2 ");
    fs::resize_file(path, 4);
    append(path, "3\n");
    EXPECT_EQ(read(), "3 ");
    append(path, "4\n" + std::string(600000, 'x') + "\n");
    fs::rename(path, path + ".1");
    append(path, "5\n");
    fs::rename(path + ".1", path + ".2");
    fs::rename(path, path + ".1");
    append(path, "6\n");
    EXPECT_EQ(read(), "4 " + std::string(600000, 'x') + " 5 6 ");
    EXPECT_EQ(filesOfSink(path), (std::vector{path + ".2", path + ".1", path}));
    fs::remove(path);
    EXPECT_EQ(read(), "");
    append(path, "7\n");
    EXPECT_EQ(read(), "7 ");
    EXPECT_EQ(sinkPath(directory.path(""), path), path);
}

} // namespace
} // namespace tamblo::tools
