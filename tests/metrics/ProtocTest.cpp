#include "metrics/AudioIssueDetected.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <limits>
#include <random>
#include <sstream>
#include <string>
#include <vector>

// The records against the Protocol Buffers compiler, which encodes and decodes by the published description.

namespace tamblo::qmxmetrics {
namespace {

constexpr const char* kDescription = EXAMPLES_DIR "/../packaging/audio_issue_detected.proto";

class Protoc : public testing::Test {
protected:
    void SetUp() override {
        if (std::system("command -v protoc >/dev/null") != 0) {
            GTEST_SKIP() << "protoc is not installed (Debian: protobuf-compiler)";
        }
        char name[] = "/tmp/tamblo-protoc-XXXXXX";
        ASSERT_NE(::mkdtemp(name), nullptr);
        directory = name;
    }
    void TearDown() override {
        if (!directory.empty()) {
            std::filesystem::remove_all(directory);
        }
    }

    [[nodiscard]] std::string file(const char* name) const { return directory + "/" + name; }

    /// What protoc makes of the input; `act` is `encode` (from text) or `decode` (to text).
    [[nodiscard]] std::string protoc(const std::string& act, const std::string& input,
                                     const std::string& description = kDescription) const {
        std::ofstream(file("in"), std::ios::binary) << input;
        const std::string folder = std::filesystem::path(description).parent_path();
        const std::string command = "protoc --" + act + "=qmxmetrics.AudioIssueDetected -I'" + folder +
                                    "' '" + description + "' <" + file("in") + " >" + file("out");
        EXPECT_EQ(std::system(command.c_str()), 0) << command;
        std::ostringstream output;
        output << std::ifstream(file("out"), std::ios::binary).rdbuf();
        return output.str();
    }

    std::string directory;
};

std::string written(const AudioIssueDetected& record) {
    TextBuffer bytes;
    ProtoWriter writer(bytes);
    record.writeTo(writer);
    return std::string(bytes.view());
}

bool readInto(AudioIssueDetected& record, const std::string& bytes) {
    ProtoReader reader({reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()});
    return record.readFrom(reader);
}

/// The lines of the record without the object around them.
std::vector<std::string> linesOf(const AudioIssueDetected& record) {
    std::string text;
    ProtoTextFormatter formatter(text);
    record.formatText(formatter, "record");
    std::istringstream stream(text);
    std::vector<std::string> lines;
    for (std::string line; std::getline(stream, line);) {
        if (line.starts_with("  ")) {
            lines.push_back(line.substr(2));
        }
    }
    return lines;
}

std::string joined(std::vector<std::string> lines) {
    std::sort(lines.begin(), lines.end());
    std::string text;
    for (const std::string& line : lines) {
        text += line + "\n";
    }
    return text;
}

std::string sortedLines(const std::string& text) {
    std::istringstream stream(text);
    std::vector<std::string> lines;
    for (std::string line; std::getline(stream, line);) {
        lines.push_back(line);
    }
    return joined(lines);
}

std::vector<AudioIssueDetected> records() {
    std::vector<AudioIssueDetected> made(4);
    made[1].timestamp = 0;
    made[1].issuetype = std::string("quote\" 'it' \\ \n\r\t\0\x01\x7F", 20);
    made[2].timestamp = std::numeric_limits<std::uint64_t>::max();
    made[2].duration = std::numeric_limits<std::int32_t>::min();
    made[2].node = std::string(20'000, 'n');
    made[3].duration = -1;
    made[3].rtaidclient = "com.example.Ger\xC3\xA4t \xF0\x9F\x8E\xA7";
    std::mt19937_64 random(5); // NOLINT: the same records at every run
    for (int i = 0; i < 8; ++i) {
        AudioIssueDetected& record = made.emplace_back();
        if (random() % 2 == 0) {
            record.timestamp = random() >> (random() % 64);
        }
        record.duration = static_cast<std::int32_t>(random() >> (32 + random() % 32));
        for (std::string* text : {&record.issuetype, &record.node, &record.rtaidclient}) {
            for (auto length = random() % 300; length > 0; --length) {
                *text += static_cast<char>(random() % 128);
            }
        }
    }
    return made;
}

TEST_F(Protoc, WritesTheSameBytesAndReadsOurs) {
    for (const AudioIssueDetected& record : records()) {
        const std::string bytes = written(record);
        const std::string theirs = protoc("encode", joined(linesOf(record)));
        EXPECT_EQ(theirs, bytes);
        AudioIssueDetected read;
        EXPECT_TRUE(readInto(read, theirs));
        EXPECT_EQ(read, record);
        if (record.rtaidclient.find('\xC3') == std::string::npos) { // protoc escapes what is not ASCII
            EXPECT_EQ(sortedLines(protoc("decode", bytes)), joined(linesOf(record)));
        }
    }
}

TEST_F(Protoc, FieldsOfALaterVersionArePassedOver) {
    const std::string later = file("later.proto");
    std::ofstream(later) << R"(syntax = "proto2";
package qmxmetrics;
message AudioIssueDetected {
  optional uint64 timestamp = 1;
  optional int32 duration = 2;
  optional string issuetype = 3;
  optional string node = 4;
  optional string rtaidclient = 5;
  optional sint64 a = 6;
  repeated fixed64 b = 7 [packed = true];
  optional float c = 8;
  optional double d = 900;
  optional group E = 9 { optional group F = 1 { optional string g = 3; } optional fixed32 h = 2; }
  extensions 1000 to max;
  optional AudioIssueDetected inner = 536;
}
)";
    const std::string bytes = protoc("encode", R"(a: -5 b: 1 b: 2 c: 0.5 d: 1e300
E { F { g: "in a group" } h: 7 } inner { duration: 9 node: "inner" }
duration: 3 node: "outer")",
                                     later);
    EXPECT_GT(bytes.size(), 60U);
    AudioIssueDetected expected;
    expected.duration = 3;
    expected.node = "outer";
    AudioIssueDetected read;
    EXPECT_TRUE(readInto(read, bytes));
    EXPECT_EQ(read, expected);
}

} // namespace
} // namespace tamblo::qmxmetrics
