#include "tools/Decode.h"

#include "base/Base64.h"
#include "base/Cbor.h"
#include "metrics/AudioIssueDetected.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <gmock/gmock.h>

#include <string>
#include <vector>

namespace tamblo::tools {
namespace {

using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::HasSubstr;
using testing::IsEmpty;

Decoded guessed(std::string_view input) {
    return decode(input, guessEncodedKind(input));
}

std::string hexOf(std::string_view bytes) {
    std::string text;
    for (const char byte : bytes) {
        constexpr std::string_view digits = "0123456789aBcDeF";
        text += digits[static_cast<unsigned char>(byte) >> 4U];
        text += digits[static_cast<unsigned char>(byte) & 15U];
        text += byte == '\x01' ? "\n" : " ";
    }
    return text;
}

constexpr std::string_view kRecord = "EAIaATMiAW4qA2NvbQ=="; // duration 2, "3", "n", "com"
constexpr std::string_view kRecordText = "AudioIssueDetected {\n"
                                         "  duration: 2\n"
                                         "  issuetype: \"3\"\n"
                                         "  node: \"n\"\n"
                                         "  rtaidclient: \"com\"\n"
                                         "}\n"
                                         "# timestamp is not set\n";

TEST(Decode, RecordsAreShownWithWhatIsPresent) {
    EXPECT_EQ(guessed(kRecord).text, kRecordText);
    EXPECT_EQ(guessed("\n " + std::string(kRecord) + "\r\n" + std::string(kRecord)).text,
              std::string(kRecordText) + std::string(kRecordText));
    const Decoded withTime = guessed("CAAQABoAIgAqAA==");
    EXPECT_THAT(withTime.text, HasSubstr("  timestamp: 0\n}\n"));
    EXPECT_THAT(withTime.text, testing::Not(HasSubstr("not set")));

    const struct {
        std::string_view input;
        std::string_view problem;
    } cases[] = {
        {"EAIaATMiAW4qA2Nvb", "line 1: not Base64"},
        {"EAIaATMiAW4qA2Nv",
         "line 1: not a whole metric record: byte 10 of 12 is the last that could be read"},
        {"EAUMEAY=", "line 1: 2 bytes follow the end of the record"},
        {"!", "line 1: not Base64"},
        {"", "there is nothing to decode"},
        {" \n", "there is nothing to decode"},
    };
    for (const auto& row : cases) {
        EXPECT_THAT(decode(row.input, EncodedKind::record).problems, ElementsAre(row.problem)) << row.input;
    }
    EXPECT_THAT(guessed("EAIaATMiAW4qA2Nv").text, HasSubstr("  node: \"n\"\n")) << "what could be read";
    const Decoded mixed = guessed("\n\n!\n" + std::string(kRecord));
    EXPECT_EQ(mixed.text, kRecordText);
    EXPECT_THAT(mixed.problems, ElementsAre("line 3: not Base64"));
}

TEST(Decode, LinesOfEverySinkAreLaidOut) {
    const struct {
        std::string line;
        std::string text;
        std::vector<std::string> problems;
    } cases[] = {
        {R"({"time":1772366400.25,"event":"a.b","payload":{"x y":1.0,"l":[1,"a"],"n":{"b":true},"e":{}}})",
         "2026-03-01T12:00:00.250Z a.b\n"
         "  event: \"a.b\"\n"
         "  payload:\n"
         "    e: {}\n"
         "    l: [1,\"a\"]\n"
         "    n:\n"
         "      b: true\n"
         "    x y: 1.0\n"
         "  time: 1772366400.25\n",
         {}},
        {R"({"time":0.5,"op":"flush","session":3,"gone":null,"new\nline":"\n"})",
         "1970-01-01T00:00:00.500Z flush\n"
         "  new\\nline: \"\\n\"\n"
         "  op: \"flush\"\n"
         "  session: 3\n"
         "  time: 0.5\n"
         "# a null is left out: a number that is not finite\n",
         {}},
        {R"({"time":0,"metric":5963779,"record":")" + std::string(kRecord) + "\"}",
         "1970-01-01T00:00:00.000Z 5963779\n"
         "  metric: 5963779\n"
         "  record: \"" +
             std::string(kRecord) +
             "\"\n"
             "  time: 0\n" +
             std::string(kRecordText),
         {}},
        {R"({"time":0,"metric":5963779,"record":"EAI"})",
         "1970-01-01T00:00:00.000Z 5963779\n"
         "  metric: 5963779\n"
         "  record: \"EAI\"\n"
         "  time: 0\n",
         {"line 1: the record is not Base64"}},
        {R"({"time":0,"metric":5963779,"op":"\u001b[2J","record":5})",
         "1970-01-01T00:00:00.000Z \\u001b[2J\n"
         "  metric: 5963779\n"
         "  op: \"\\u001b[2J\"\n"
         "  record: 5\n"
         "  time: 0\n",
         {"line 1: there is no record"}},
        {R"({"event":"a"})", "", {"line 1: not a line of a report sink: those have a \"time\""}},
        {R"({"time":)",
         "",
         {"line 1: not usable JSON: line 1, column 9: a value is expected, not the end of the text"}},
    };
    for (const auto& row : cases) {
        const Decoded decoded = guessed(row.line);
        EXPECT_EQ(decoded.text, row.text) << row.line;
        EXPECT_THAT(decoded.problems, ElementsAreArray(row.problems)) << row.line;
    }
    EXPECT_THAT(decode("[1]", EncodedKind::line).problems, ElementsAre("line 1: not a JSON object"));
}

std::string framesOf(const std::vector<std::string>& items) {
    TextBuffer out;
    for (const std::string& item : items) {
        const std::size_t start = wire::beginFrame(out);
        out.append(item);
        EXPECT_TRUE(wire::finishFrame(out, start));
    }
    return std::string(out.view());
}

TEST(Decode, FramesAreShownAsJson) {
    TextBuffer out;
    wire::Request request;
    const auto append = [&](wire::Method method, std::optional<std::uint64_t> id) {
        request.method = method;
        request.id = id;
        EXPECT_TRUE(wire::appendRequestFrame(out, request));
    };
    request.dictionary = {{"at", Value::date(1772366400.25)}, {"level", 0.1F}};
    request.category = 0x08000004;
    request.type = 1;
    request.reporterIDs = {7, -8};
    append(wire::Method::sendMessage, 7);
    request = {};
    request.category = 0x00050063;
    request.type = 60;
    append(wire::Method::sendMessage, std::nullopt);
    request.reporterID = -5;
    request.serviceType = 3;
    append(wire::Method::setServiceType, ~0ULL);
    request.dictionary = {{"a", 1}};
    append(wire::Method::setConfiguration, 0);
    append(wire::Method::reporterID, 1);
    append(wire::Method::killService, 2);
    wire::appendNullReply(out, 3);
    wire::appendDictionaryReply(out, 4, {{"b", true}});
    wire::appendErrorReply(out, 0, {"d", -32601, "unknown \"method\""});
    wire::appendErrorReply(out, 5, {"d", 2, ""});
    const std::string expected =
        R"({"frame":"request","id":7,"method":"sendMessage","payload":{"at":"2026-03-01T12:00:00.250Z","level":0.1},"category":134217732,"categoryName":"Session_Playback","type":1,"typeName":"Start","reporterIDs":[7,-8]}
{"frame":"request without reply","method":"sendMessage","payload":{},"category":327779,"type":60,"reporterIDs":[]}
{"frame":"request","id":18446744073709551615,"method":"setServiceType","type":3,"typeName":"haptics","reporterID":-5}
{"frame":"request","id":0,"method":"setConfiguration","configuration":{"a":1},"reporterID":-5}
{"frame":"request","id":1,"method":"reporterID","reporterID":-5}
{"frame":"request","id":2,"method":"killService"}
{"frame":"reply","id":3,"error":null,"result":null}
{"frame":"reply","id":4,"error":null,"result":{"b":true}}
{"frame":"reply","id":0,"error":{"code":-32601,"domain":"d","message":"unknown \"method\""},"result":null}
{"frame":"reply","id":5,"error":{"code":2,"domain":"d"},"result":null}
)";
    const std::string bytes(out.view());
    for (const std::string& input : {bytes, hexOf(bytes)}) {
        const Decoded decoded = guessed(input);
        EXPECT_EQ(decoded.text, expected);
        EXPECT_THAT(decoded.problems, IsEmpty());
    }
}

TEST(Decode, FramesThatAreNoneAreNamed) {
    const std::string good = framesOf({"\x84\x01\x03\xF6\xF5"}); // [1, 3, null, true]
    const struct {
        std::string bytes;
        std::string problem;
    } cases[] = {
        {framesOf({"\xA0"}),
         "not a request that the service would accept (-32600): the frame is not an array"},
        {framesOf({"\x84"}), "not CBOR: the item ends too early"},
        {framesOf({"\x80\x80"}), "not CBOR: bytes follow the item"},
        {framesOf({"\x83\x01\x03\xF6"}), "not a reply as the protocol has them"},
        {framesOf({"\x84\x01\x03\xF5\xF5"}), "not a reply as the protocol has them"},
        {framesOf({std::string("\x84\x00\x01\x61x\x80", 6)}),
         "not a request that the service would accept (-32601): unknown method x"},
        {std::string("\x05\0\0\0\x84\x01", 6), "cut short: 6 of 9 bytes are there"},
        {std::string("\x05\0", 2), "cut short: 2 of 4 bytes are there"},
        {std::string("\x01\x00\x10\x00\x80", 5), "its length, 1048577, is beyond the longest, 1048576"},
    };
    for (const auto& row : cases) {
        const Decoded decoded = guessed(good + row.bytes);
        EXPECT_EQ(decoded.text, "{\"frame\":\"reply\",\"id\":3,\"error\":null,\"result\":true}\n");
        EXPECT_THAT(decoded.problems, ElementsAre("frame 2: " + row.problem));
    }
    EXPECT_THAT(decode("0", EncodedKind::frame).problems,
                ElementsAre("frame 1: cut short: 1 of 4 bytes are there"));
}

} // namespace
} // namespace tamblo::tools
