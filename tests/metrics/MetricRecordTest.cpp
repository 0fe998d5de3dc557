#include "tools/MetricRecord.h"
#include "tests/base/Samples.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <limits>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::qmxmetrics {
namespace {

std::string bytesOf(std::string_view hex) {
    const auto bytes = test::fromHex(hex);
    return {bytes.begin(), bytes.end()};
}

std::string written(const AudioIssueDetected& record) {
    TextBuffer bytes;
    ProtoWriter writer(bytes);
    record.writeTo(writer);
    return std::string(bytes.view());
}

/// From a block of exactly these bytes, so that the address sanitizer sees a step outside.
bool readInto(AudioIssueDetected& record, std::string_view bytes) {
    const std::vector<std::uint8_t> block(bytes.begin(), bytes.end());
    tools::ProtoReader reader(block);
    return tools::readRecord(reader, record);
}

/// `TIMESTAMP DURATION ISSUETYPE|NODE|RTAIDCLIENT`, with `-` for no timestamp, and `!` in front when the
/// bytes are not accepted.
std::string readAs(std::string_view bytes) {
    AudioIssueDetected record;
    const bool accepted = readInto(record, bytes);
    const auto& [timestamp, duration, issuetype, node, rtaidclient] = record;
    return (accepted ? "" : "!") + (timestamp ? std::to_string(*timestamp) : "-") + " " +
           std::to_string(duration) + " " + issuetype + "|" + node + "|" + rtaidclient;
}

TEST(MetricRecord, WhatOthersWriteIsReadAndWhatIsCutShortIsRefused) {
    const std::string tenMore = "80808080808080808080"; // ten bytes, each of which says that more follow
    const struct {
        std::string hex;
        const char* expected;
    } cases[] = {
        // Any order, the last one wins, all may be absent.
        {"", "- 0 ||"},
        {"2A 01 63 10 05 1A 01 61 10 06 08 01", "1 6 a||c"},
        // Unknown fields of every wire type are passed over.
        {"49 0102030405060708 4D 01020304 4A 02 1005 10 06", "- 6 ||"},
        {"00 01 F8FFFFFFFFFFFFFFFF01 02 10 05", "- 5 ||"},
        // Known fields are read as what they should be, whatever wire type the key has.
        {"0D 05 12 07 18 01 61 23 01 62 2E 01 63", "5 7 a|b|c"},
        // Wire type 4 ends the record, of a known field, too; the rest is not looked at.
        {"10 05 4C 10 06", "- 5 ||"},
        // Long varints: ten bytes count, of the tenth one bit; more than ten read as 0, which is no error.
        {"08 85808080808080808000 10 05", "5 5 ||"},
        {"08 FFFFFFFFFFFFFFFFFF7F", "18446744073709551615 0 ||"},
        {"10 8580808010", "- 5 ||"},
        {"10 05 10" + tenMore + "08 03", "3 0 ||"},
        {tenMore + "07 10 05", "- 5 ||"},
        {tenMore, "!- 0 ||"},
        // Cut short: what came before stays, and a timestamp is there as soon as its key was.
        {"10 05 08", "!0 5 ||"},
        {"10 FFFFFFFF", "!- 0 ||"},
        {"1A 03 6162", "!- 0 ||"},
        {"4B 08 01 53", "!- 0 ||"},
        // Lengths beyond the end, up to those at which a sum would wrap around.
        {"2A FFFFFFFFFFFFFFFFFF01 61", "!- 0 ||"},
        {"4A FFFFFFFFFFFFFFFFFF01 10 05", "!- 0 ||"},
        // What cannot be passed over ends the reading at once.
        {"10 05 4E 10 06", "!- 5 ||"},
        {"10 05 4B 53 4C 54 10 06", "!- 5 ||"},
    };
    for (const auto& row : cases) {
        EXPECT_EQ(readAs(bytesOf(row.hex)), row.expected) << row.hex;
    }
    const auto nested = [](int depth) {
        return bytesOf(test::repeated("4B", depth) + test::repeated("4C", depth) + "10 05");
    };
    EXPECT_EQ(readAs(nested(tools::ProtoReader::kMaximumDepth)), "- 5 ||");
    EXPECT_EQ(readAs(nested(tools::ProtoReader::kMaximumDepth + 1)), "!- 0 ||");
    EXPECT_EQ(readAs(std::string(1'000'000, '\x4B')), "!- 0 ||");
}

/// What the Protocol Buffers compiler makes of the input by the published description; `act` is `encode`
/// (from text) or `decode` (to text).
std::string protoc(const std::string& act, const std::string& input) {
    const TemporaryDirectory directory;
    directory.write("in", input);
    const std::string command = "cd " + directory.path() + " && protoc --" + act +
                                "=qmxmetrics.AudioIssueDetected -I'" EXAMPLES_DIR
                                "/../packaging' audio_issue_detected.proto <in >out";
    EXPECT_EQ(std::system(command.c_str()), 0) << command;
    return directory.read("out");
}

TEST(MetricRecord, AgreesWithAnIndependentImplementation) {
    const bool hasProtoc = std::system("command -v protoc >/dev/null") == 0;
    std::string ascii;
    for (char character = 0; character < 0x7F; ++character) {
        ascii += character;
    }
    const AudioIssueDetected records[] = {
        {},
        {0, 1, ascii, "\x7F", {}},
        {127, 127, std::string(127, 'i'), std::string(128, 'n'), "\"'\\\t"},
        {128, 128, "a", "b", "c"},
        {~0ULL, std::numeric_limits<std::int32_t>::min(), {}, std::string(20'000, 'n'), {}},
        {{}, -1, {}, {}, "com.example.Ger\xC3\xA4t \xF0\x9F\x8E\xA7"},
    };
    for (const AudioIssueDetected& record : records) {
        const std::string bytes = written(record);
        AudioIssueDetected read;
        EXPECT_TRUE(readInto(read, bytes));
        EXPECT_EQ(read, record);
        EXPECT_EQ(hash_value(read), hash_value(record));
        if (hasProtoc) {
            EXPECT_EQ(protoc("encode", protoc("decode", bytes)), bytes) << "whole, and in its order";
            std::string text;
            tools::appendRecordText(text, record);
            const std::size_t start = text.find('\n') + 1;
            EXPECT_EQ(protoc("encode", text.substr(start, text.rfind('}') - start)), bytes);
        }
    }
    EXPECT_EQ(written({128, -1, "a", {}, {}}),
              bytesOf("08 8001 10 FFFFFFFFFFFFFFFFFF01 1A 01 61 22 00 2A 00"));
    std::string text;
    tools::appendRecordText(text, {~0ULL, -5, "Ger\xC3\xA4t\n\t\r", "\"'\\\x01\x7F", "\xC3\xA4\xFF"});
    EXPECT_EQ(text, "AudioIssueDetected {\n  duration: -5\n  issuetype: \"Ger\xC3\xA4t\\n\\t\\r\"\n"
                    "  node: \"\\\"\\'\\\\\\001\\177\"\n  rtaidclient: \"\\303\\244\\377\"\n"
                    "  timestamp: 18446744073709551615\n}\n");
    if (!hasProtoc) {
        GTEST_SKIP() << "protoc is not installed (Debian: protobuf-compiler)";
    }
}

} // namespace
} // namespace tamblo::qmxmetrics
