#include "tools/Decode.h"

#include "base/Cbor.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <gmock/gmock.h>

namespace tamblo::tools {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using wire::Method;

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
        {"EAUMEAY=", shown("5", "", "", "") + "}\n# timestamp is not set\n",
         "line 1: 2 bytes follow the end of the record"},
        {"!\n" + record, recordText, "line 1: not Base64"},
        {" \n", "", "there is nothing to decode"},
        {R"({"time":1772366400.25,"event":"a.b","payload":{"x y":1.0,"l":[1,"a"],"n":{"b":true},"e":{}}})",
         "2026-03-01T12:00:00.250Z a.b\n  event: \"a.b\"\n  payload:\n    e: {}\n    l: [1,\"a\"]\n"
         "    n:\n      b: true\n    x y: 1.0\n  time: 1772366400.25\n",
         ""},
        {R"({"time":0.5,"op":"\u001b[2J","gone":null,"new\nline":"\n"})",
         "1970-01-01T00:00:00.500Z \\u001b[2J\n  new\\nline: \"\\n\"\n  op: \"\\u001b[2J\"\n  time: 0.5\n"
         "# a null is left out: a number that is not finite\n",
         ""},
        {metric + record + "\"}", metricText + record + "\"\n  time: 0\n" + recordText, ""},
        {metric + "EAI\"}", metricText + "EAI\"\n  time: 0\n", "line 1: the record is not Base64"},
        {R"({"event":"a"})", "", "line 1: not a line of a report sink: those have a \"time\""},
        {R"({"time":)", "",
         "line 1: not usable JSON: line 1, column 9: a value is expected, not the end of the text"},
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
        {.method = Method::setConfiguration, .id = 8, .reporterID = 5, .dictionary = {{"a", 1}}},
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
{"frame":"request","id":8,"method":"setConfiguration","configuration":{"a":1},"reporterID":5}
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
        {"04000000830103F6", "not a reply as the protocol has them"},
        {"050000008401", "cut short: 6 of 9 bytes are there"},
        {"0100100080", "its length, 1048577, is beyond the longest, 1048576"},
    };
    for (const auto& [hex, problem] : cases) {
        const Decoded decoded = guessed("05000000 840103f6\nF5" + hex); // behind [1, 3, null, true]
        EXPECT_EQ(decoded.text, "{\"frame\":\"reply\",\"id\":3,\"error\":null,\"result\":true}\n");
        EXPECT_THAT(decoded.problems, ElementsAre("frame 2: " + problem));
    }
    EXPECT_THAT(decode("0", EncodedKind::frame).problems,
                ElementsAre("frame 1: cut short: 1 of 4 bytes are there"));
}

} // namespace
} // namespace tamblo::tools
