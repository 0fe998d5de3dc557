#include "metrics/AudioIssueDetected.h"
#include "tests/base/Hex.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
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
    const auto block = std::make_unique<std::uint8_t[]>(bytes.size());
    std::copy(bytes.begin(), bytes.end(), block.get());
    ProtoReader reader({block.get(), bytes.size()});
    return record.readFrom(reader);
}

/// `TIMESTAMP DURATION ISSUETYPE|NODE|RTAIDCLIENT`, with `-` for no timestamp, and `!` in front when the
/// bytes are not accepted.
std::string readAs(std::string_view bytes) {
    AudioIssueDetected record;
    const bool accepted = readInto(record, bytes);
    return (accepted ? "" : "!") + (record.timestamp ? std::to_string(*record.timestamp) : "-") + " " +
           std::to_string(record.duration) + " " + record.issuetype + "|" + record.node + "|" +
           record.rtaidclient;
}

AudioIssueDetected makeRecord(std::optional<std::uint64_t> timestamp, std::int32_t duration,
                              std::string issuetype = {}, std::string node = {},
                              std::string rtaidclient = {}) {
    AudioIssueDetected record;
    record.timestamp = timestamp;
    record.duration = duration;
    record.issuetype = std::move(issuetype);
    record.node = std::move(node);
    record.rtaidclient = std::move(rtaidclient);
    return record;
}

TEST(AudioIssueDetected, IsWrittenInTheOrderOfFieldNumbersAndReadsBack) {
    constexpr auto least = std::numeric_limits<std::int32_t>::min();
    const struct {
        AudioIssueDetected record;
        std::string hex;
    } cases[] = {
        {{}, "10 00 1A 00 22 00 2A 00"},
        {makeRecord(0, 0), "08 00 10 00 1A 00 22 00 2A 00"},
        {makeRecord(~0ULL, 127, "a", "bc", "d"),
         "08 FFFFFFFFFFFFFFFFFF01 10 7F 1A 01 61 22 02 6263 2A 01 64"},
        {makeRecord(127, -1), "08 7F 10 FFFFFFFFFFFFFFFFFF01 1A 00 22 00 2A 00"},
        {makeRecord(128, least), "08 8001 10 80808080F8FFFFFFFF01 1A 00 22 00 2A 00"},
        {makeRecord({}, 0x7FFFFFFF, {}, std::string("\0\xFF", 2)), "10 FFFFFFFF07 1A 00 22 02 00FF 2A 00"},
        {makeRecord({}, 128, std::string(127, 'x'), std::string(128, 'y')),
         "10 8001 1A 7F" + std::string(254, 'x') + "22 8001" + std::string(256, 'y') + "2A 00"},
    };
    for (const auto& row : cases) {
        std::string hex = row.hex;
        for (const auto& [letter, byte] : {std::pair("x", "78"), std::pair("y", "79")}) {
            for (std::size_t at = 0; (at = hex.find(letter, at)) != std::string::npos; at += 2) {
                hex.replace(at, 2, byte);
            }
        }
        EXPECT_EQ(written(row.record), bytesOf(hex)) << row.hex;
        AudioIssueDetected record;
        EXPECT_TRUE(readInto(record, bytesOf(hex))) << row.hex;
        EXPECT_EQ(record, row.record) << row.hex;
    }
}

TEST(AudioIssueDetected, ReadsWhatOthersWriteAndRefusesWhatIsCutShort) {
    const std::string tenMore = "80808080808080808080"; // ten bytes, each of which says that more follow
    const struct {
        std::string hex;
        const char* expected;
    } cases[] = {
        // Any order, the last one wins, all may be absent.
        {"", "- 0 ||"},
        {"2A 01 63 10 05 1A 01 61 10 06 08 01", "1 6 a||c"},
        // Unknown fields of every wire type are passed over.
        {"48 9601 10 05", "- 5 ||"},
        {"49 0102030405060708 4D 01020304 4A 02 1005 10 06", "- 6 ||"},
        {"4B 10 07 53 22 01 61 54 4C 10 05", "- 5 ||"},
        {"00 01 F8FFFFFFFFFFFFFFFF01 02 10 05", "- 5 ||"},
        // Known fields are read as what they should be, whatever wire type the key has.
        {"0D 05 12 07 18 01 61 23 01 62 2E 01 63", "5 7 a|b|c"},
        // Wire type 4 ends the record, of a known field, too; the rest is not looked at.
        {"10 05 4C 10 06", "- 5 ||"},
        {"10 05 14 FF", "- 5 ||"},
        // Long varints: ten bytes count, of the tenth one bit; more than ten read as 0, which is no error.
        {"08 85808080808080808000 10 05", "5 5 ||"},
        {"08 FFFFFFFFFFFFFFFFFF7F", "18446744073709551615 0 ||"},
        {"10 8580808010", "- 5 ||"},
        {"08" + tenMore + "10 05", "0 5 ||"},
        {"10 05 10" + tenMore + "08 03", "3 0 ||"},
        {tenMore + "07 10 05", "- 5 ||"},
        {"1A" + tenMore + "10 05", "- 5 ||"},
        {"48" + tenMore + "10 05", "- 5 ||"},
        {tenMore, "!- 0 ||"},
        // Cut short: what came before stays, and a timestamp is there as soon as its key was.
        {"10 05 08", "!0 5 ||"},
        {"10 05 08 80", "!0 5 ||"},
        {"10 05 10 80", "!- 0 ||"},
        // Lengths beyond the end, up to those at which a sum would wrap around.
        {"2A FFFFFFFF0F 61", "!- 0 ||"},
        {"2A FFFFFFFFFFFFFFFF7F 61", "!- 0 ||"},
        {"2A FFFFFFFFFFFFFFFFFF01 61", "!- 0 ||"},
        {"2A F5FFFFFFFFFFFFFFFF01 61", "!- 0 ||"},
        {"4A FFFFFFFFFFFFFFFFFF01 10 05", "!- 0 ||"},
        {"4B 52 FFFFFFFFFFFFFFFFFF01 4C 10 05", "!- 0 ||"},
        // What cannot be passed over ends the reading at once.
        {"10 05 4E 10 06", "!- 5 ||"},
        {"10 05 4B 54 10 06", "!- 5 ||"},
        {"10 05 4B 4E 4C 10 06", "!- 5 ||"},
        {"10 05 4B 53 4C 54 10 06", "!- 5 ||"},
    };
    for (const auto& row : cases) {
        EXPECT_EQ(readAs(bytesOf(row.hex)), row.expected) << row.hex;
    }
}

TEST(AudioIssueDetected, APrefixIsAcceptedExactlyWhereAFieldEnds) {
    const std::string fields[] = {
        "08 8001",    "10 FFFFFFFFFFFFFFFFFF01",    "1A 03 616263", "22 00",   "49 0102030405060708",
        "2A 02 6465", "4B 08 01 52 01 61 53 54 4C", "4D 01020304",  "48 8001", "4A 03 102030"};
    std::string bytes;
    for (const std::string& field : fields) {
        const std::string whole = bytesOf(field);
        for (std::size_t length = 0; length <= whole.size(); ++length) {
            AudioIssueDetected record;
            const bool endsAField = length == 0 || length == whole.size();
            EXPECT_EQ(readInto(record, bytes + whole.substr(0, length)), endsAField)
                << field << " " << length;
        }
        bytes += whole;
    }
    EXPECT_EQ(readAs(bytes), "128 -1 abc||de");
}

TEST(AudioIssueDetected, GroupsAreFollowedToALimit) {
    const auto nested = [](int depth) {
        return std::string(static_cast<std::size_t>(depth), '\x4B') +
               std::string(static_cast<std::size_t>(depth), '\x4C') + bytesOf("10 05");
    };
    EXPECT_EQ(readAs(nested(ProtoReader::kMaximumDepth)), "- 5 ||");
    EXPECT_EQ(readAs(nested(ProtoReader::kMaximumDepth + 1)), "!- 0 ||");
    EXPECT_EQ(readAs(std::string(1'000'000, '\x4B')), "!- 0 ||");
}

TEST(AudioIssueDetected, IsAValue) {
    const AudioIssueDetected base = makeRecord(7, -2, "a", "b", "c");
    for (const AudioIssueDetected& other :
         {makeRecord(8, -2, "a", "b", "c"), makeRecord({}, -2, "a", "b", "c"),
          makeRecord(7, 2, "a", "b", "c"), makeRecord(7, -2, "A", "b", "c"), makeRecord(7, -2, "a", "", "c"),
          makeRecord(7, -2, "a", "b", "")}) {
        EXPECT_FALSE(base == other);
        AudioIssueDetected first = base;
        AudioIssueDetected second = other;
        swap(first, second);
        EXPECT_TRUE(first == other && second == base);
    }
    EXPECT_FALSE(makeRecord(0, 0) == AudioIssueDetected()) << "a timestamp of 0 is there";
    const std::hash<std::string> hash;
    EXPECT_EQ(hash_value(base), 7U ^ static_cast<std::size_t>(-2) ^ hash("a") ^ hash("b") ^ hash("c"));
    EXPECT_EQ(hash_value(makeRecord({}, 3)), 3U ^ hash(""));
}

TEST(AudioIssueDetected, IsShownAsAnObject) {
    std::string text;
    ProtoTextFormatter formatter(text);
    formatter.beginObject("outer");
    makeRecord(~0ULL, -5, "Ger\xC3\xA4t\n\t\r", "\"'\\\x01\x7F", "\xC3\xA4\xFF")
        .formatText(formatter, "issue");
    AudioIssueDetected().formatText(formatter, "none");
    formatter.endObject();
    EXPECT_EQ(text, R"(outer {
  issue {
    duration: -5
    issuetype: "Ger)"
                    "\xC3\xA4"
                    R"(t\n\t\r"
    node: "\"\'\\\001\177"
    rtaidclient: "\303\244\377"
    timestamp: 18446744073709551615
  }
  none {
    duration: 0
    issuetype: ""
    node: ""
    rtaidclient: ""
  }
}
)");
}

} // namespace
} // namespace tamblo::qmxmetrics
