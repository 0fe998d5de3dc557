#include "base/Cbor.h"
#include "base/Json.h"
#include "tests/client/FakeService.h"
#include "tools/Decode.h"
#include "tools/SessionPlayer.h"
#include "tools/SessionSummaries.h"
#include "tools/records/Payload.h"
#include "tools/records/SinkFile.h"

#include <map>

#include <gmock/gmock.h>

namespace tamblo::tools {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;
using wire::Method;

TEST(Payload, WordsAndObjectsAreRead) {
    const struct {
        std::vector<std::string_view> words;
        std::string json; ///< empty: refused
    } cases[] = {
        {{}, "{}"},
        {{"n=5", "f=0.5", "b=true", "t=text"}, R"({"b":true,"f":0.5,"n":5,"t":"text"})"},
        {{"quoted=\"5\"", "empty=", "eq=a=b", "array=[1]", "null=\"null\""},
         R"({"array":"[1]","empty":"","eq":"a=b","null":"null","quoted":"5"})"},
        {{"null=null"}, ""},
        {{R"({"a":{"b":[1,2]}})"}, R"({"a":{"b":[1,2]}})"},
        {{"a=1", "a=2"}, ""},
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

TEST(SessionFile, WrongLinesAreRefused) {
    for (const std::string_view wrong :
         {"[]", R"({"type": "Start"})", R"({"category": 14.5})", R"({"category": 14, "type": "Nope"})",
          R"({"category": 14, "offset_s": -1})", R"({"category": 14, "payload": [1]})",
          R"({"category": 14, "payload": {"a": null}})"}) {
        EXPECT_TRUE(std::holds_alternative<std::string>(parseSessionLine(wrong))) << wrong;
    }
}

TEST(SessionPlayer, PlaysInTimeAndStampsWhatHasNoTimestamp) {
    test::FakeService service;
    client::Client client({.socketPath = service.path(), .threading = client::Client::Threading::caller});
    ASSERT_TRUE(client.connect());
    // Offsets win over timestamps, which count from the first; no line is due before the one in front of it.
    std::istringstream lines(
        "{\"category\": 14, \"offset_s\": 2}\n\n"
        "{\"category\": 14, \"payload\": {\"zrreporting_timestamp\": 1000}}\n"
        "{\"category\": 14, \"offset_s\": 4, \"payload\": {\"zrreporting_timestamp\": 1100}}\n"
        "{\"category\": 14, \"payload\": {\"zrreporting_timestamp\": 1060}}\n"
        "{\"category\": 14, \"payload\": {\"zrreporting_timestamp\": 1001}}\n"
        "{\"category\": 14}\n{\"category\": }\n");
    EXPECT_EQ(recordedLength(lines), 62.0);
    SessionPlayer player(client, {.reporterID = 7, .speed = 1000, .recordedLength = 62, .timeout = 5s});
    const auto wrong = player.play(lines, "file");
    ASSERT_TRUE(wrong);
    EXPECT_TRUE(wrong->starts_with("file:8: ")) << *wrong;
    const SessionPlayer::Report& report = player.report();
    EXPECT_TRUE(report.sent == 6 && report.answered == 6 && report.refused == 0);
    EXPECT_GE(report.seconds, 0.06);
    std::vector<double> timestamps;
    for (const wire::Request& request : service.requests()) {
        timestamps.push_back(request.dictionary.find(kTimestampKey)->doubleValue());
        EXPECT_EQ(request.reporterIDs, std::vector<std::int64_t>{7});
    }
    ASSERT_EQ(timestamps.size(), 6U);
    EXPECT_EQ(timestamps[3], 1060);
    EXPECT_NEAR(timestamps[5] - timestamps[0], 60, 1e-3) << "as recorded, whatever the speed";
}

TEST(SinkFollower, ReadsWholeLinesThroughRotationsAndTornEnds) {
    const TemporaryDirectory directory;
    const std::string path = directory.path("events.jsonl");
    SinkFollower follower(path);
    const auto append = [&path](std::string_view text) { test::writeFile(path, text, std::ios::app); };
    const auto read = [&follower] {
        std::string seen;
        LineFunction collect = [&seen](std::string_view line) { seen.append(line).append(" "); };
        follower.readNew(collect);
        return seen;
    };
    EXPECT_EQ(read(), "");
    append("1\n2\nto");
    EXPECT_EQ(read(), "1 2 ");
    fs::resize_file(path, 4);
    append("3\n");
    EXPECT_EQ(read(), "3 ");
    fs::resize_file(path, 0);
    EXPECT_EQ(read(), "");
    append("4\n" + std::string(600000, 'x') + "\n");
    fs::rename(path, path + ".1");
    append("5\n");
    fs::rename(path + ".1", path + ".2");
    fs::rename(path, path + ".1");
    append("6\n");
    EXPECT_EQ(read(), "4 " + std::string(600000, 'x') + " 5 6 ");
    EXPECT_EQ(filesOfSink(path), (std::vector{path + ".2", path + ".1", path}));
    fs::remove(path);
    EXPECT_EQ(read(), "");
    append("7\n");
    EXPECT_EQ(read(), "7 ");
}

/// "V2" is the second output stretch, "Smusic:9" the summary of a session of that application with 9
/// messages; written as the nth of all.
SessionSummary summaryFrom(const std::string& word, std::size_t n) {
    const std::map<char, std::string> kinds{
        {'V', "Volume"}, {'K', "Kaleen"}, {'S', "Session_Generic"}, {'I', "Input"}};
    SessionSummary summary{"com.vandra.tamblo." + kinds.at(word[0]) + ".Summary", {{"n", n}}};
    if (const std::size_t colon = word.find(':'); colon != word.npos) {
        summary.payload.set("HostApplicationDisplayID", word.substr(1, colon - 1));
        summary.payload.set("summaryServiceName", "haptics");
        summary.payload.set("num_messages", std::stoi(word.substr(colon + 1)));
    } else {
        summary.payload.set("msgidx", std::stoi(word.substr(1)));
    }
    return summary;
}

TEST(SessionSummaries, ThoseOfOneStopAreTakenOut) {
    const struct {
        const char *written, *service, *taken;
    } cases[] = {
        {"V1 V2 K1 Sa:9 I1", "haptics", "01234"},
        {"Sb:9 V1 Sa:9 Sb:9", "haptics", "12"},          // stops without stretches
        {"V1 Sa:9 I1 I2 V1 V2 Sb:9", "haptics", "0123"}, // input comes behind the session
        // One that has no session of its own in between.
        {"V1 V2 Sb:9 I1 I1 Sb:9 K1 Sa:9", "haptics", "67"},
        {"V1 Sa:9 V1 Sa:10", "haptics", "23"},   // alike: the last
        {"V1 Sa:4 I1 V1 Sb:9", "haptics", "34"}, // none: too few messages, another application
        {"Sa:9 Sb:9", "alarms", "1"},            // another service
        {"V1 V2 V1", "haptics", "2"},            // the session's own is not in use
        {"", "haptics", ""},
    };
    for (const auto& row : cases) {
        std::istringstream words(row.written);
        std::vector<SessionSummary> written;
        for (std::string word; words >> word;) {
            written.push_back(summaryFrom(word, written.size()));
        }
        std::string taken;
        for (const SessionSummary& summary : summariesOf({"a", row.service, 5}, written)) {
            taken += jsonText(*summary.payload.find("n"));
        }
        EXPECT_EQ(taken, row.taken) << row.written;
    }
}

Decoded guessed(std::string_view input) {
    return decode(input, guessEncodedKind(input));
}

/// A record up to its timestamp.
std::string shown(const std::string& duration, const std::string& type, const std::string& node,
                  const std::string& client) {
    return "AudioIssueDetected {\n  duration: " + duration + "\n  issuetype: \"" + type + "\"\n  node: \"" +
           node + "\"\n  rtaidclient: \"" + client + "\"\n";
}

TEST(Decode, RecordsAndLinesAreLaidOutAndWhatIsWrongIsNamed) {
    const std::string record = "EAIaATMiAW4qA2NvbQ=="; // duration 2, "3", "n", "com"
    const std::string recordText = shown("2", "3", "n", "com") + "}\n# timestamp is not set\n";
    const std::string metric = R"({"time":0,"metric":5963779,"record":")";
    const std::string metricText = "1970-01-01T00:00:00.000Z 5963779\n  metric: 5963779\n  record: \"";
    const struct {
        std::string input;
        std::string text;
        std::string problem;
    } cases[] = {
        {"\n " + record + "\r\n", recordText, ""},
        {"CAA=", shown("0", "", "", "") + "  timestamp: 0\n}\n", ""},
        {"EAIaATMiAW4qA2Nv", shown("2", "3", "n", "") + "}\n# timestamp is not set\n",
         "line 1: not a whole metric record: byte 10 of 12 is the last that could be read"},
        {" \n", "", "there is nothing to decode"},
        {R"({"time":1772366400.25,"event":"a.b","payload":{"x y":1.0,"l":[1,"a"],"n":{"b":true},"e":{}}})",
         "2026-03-01T12:00:00.250Z a.b\n  event: \"a.b\"\n  payload:\n    e: {}\n    l: [1,\"a\"]\n"
         "    n:\n      b: true\n    x y: 1.0\n  time: 1772366400.25\n",
         ""},
        {R"({"time":0.5,"op":"\u001b[2J","new\nline":"\n"})",
         "1970-01-01T00:00:00.500Z \\u001b[2J\n  new\\nline: \"\\n\"\n  op: \"\\u001b[2J\"\n  time: 0.5\n",
         ""},
        {metric + record + "\"}", metricText + record + "\"\n  time: 0\n" + recordText, ""},
        {R"({"time":)", "",
         "line 1: not usable JSON: column 9: a value is expected, not the end of the text"},
    };
    for (const auto& row : cases) {
        const Decoded decoded = guessed(row.input);
        EXPECT_EQ(decoded.text, row.text) << row.input;
        EXPECT_EQ(decoded.problems.empty() ? "" : decoded.problems[0], row.problem) << row.input;
    }
}

TEST(Decode, FramesAreShownAsJson) {
    TextBuffer out;
    const wire::Request requests[] = {
        {.method = Method::sendMessage,
         .id = 7,
         .dictionary = {{"at", Value::date(1772366400.25)}, {"level", 0.1F}},
         .category = 0x08000004,
         .type = 1,
         .reporterIDs = {7, -8}},
        {.method = Method::sendMessage, .category = 0x00050063, .type = 60},
        {.method = Method::setServiceType, .id = ~0ULL, .reporterID = -5, .serviceType = 3},
    };
    for (const wire::Request& request : requests) {
        EXPECT_TRUE(wire::appendRequestFrame(out, request));
    }
    wire::appendDictionaryReply(out, 4, {{"b", true}});
    wire::appendErrorReply(out, 0, {"d", -32601, "unknown \"method\""});
    const std::string expected =
        R"({"frame":"request","id":7,"method":"sendMessage","payload":{"at":"2026-03-01T12:00:00.250Z","level":0.1},"category":134217732,"categoryName":"Session_Playback","type":1,"typeName":"Start","reporterIDs":[7,-8]}
{"frame":"request without reply","method":"sendMessage","payload":{},"category":327779,"type":60,"reporterIDs":[]}
{"frame":"request","id":18446744073709551615,"method":"setServiceType","type":3,"typeName":"haptics","reporterID":-5}
{"frame":"reply","id":4,"error":null,"result":{"b":true}}
{"frame":"reply","id":0,"error":{"code":-32601,"domain":"d","message":"unknown \"method\""},"result":null}
)";
    EXPECT_EQ(guessed(out.view()).text, expected);
    EXPECT_THAT(guessed(out.view()).problems, IsEmpty());
}

TEST(Decode, FramesThatAreNoneAreNamed) {
    const std::pair<std::string, std::string> cases[] = {
        {"01000000A0", "not a request that the service would accept (-32600): the frame is not an array"},
        {"0100000084", "not CBOR: the item ends too early"},
        {"050000008401", "cut short: 6 of 9 bytes are there"},
        {"0100100080", "its length, 1048577, is beyond the longest, 1048576"},
    };
    for (const auto& [hex, problem] : cases) {
        const Decoded decoded = guessed("05000000 840103f6\nF5" + hex); // behind [1, 3, null, true]
        EXPECT_EQ(decoded.text, "{\"frame\":\"reply\",\"id\":3,\"error\":null,\"result\":true}\n");
        EXPECT_THAT(decoded.problems, ElementsAre("frame 2: " + problem));
    }
}

} // namespace
} // namespace tamblo::tools
