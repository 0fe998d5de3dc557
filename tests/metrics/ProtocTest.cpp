#include "metrics/AudioIssueDetected.h"
#include "tests/platform/LinuxServiceSupport.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <limits>
#include <random>
#include <string>
#include <vector>

// The records against the Protocol Buffers compiler, which encodes and decodes by the published description.

namespace tamblo::qmxmetrics {
namespace {

class Protoc : public testing::Test {
protected:
    void SetUp() override {
        if (std::system("command -v protoc >/dev/null") != 0) {
            GTEST_SKIP() << "protoc is not installed (Debian: protobuf-compiler)";
        }
    }

    /// What protoc makes of the input; `act` is `encode` (from text) or `decode` (to text).
    [[nodiscard]] std::string protoc(const std::string& act, const std::string& input) const {
        directory.write("in", input);
        const std::string folder = EXAMPLES_DIR "/../packaging";
        const std::string command = "protoc --" + act + "=qmxmetrics.AudioIssueDetected -I'" + folder +
                                    "' audio_issue_detected.proto <" + directory.path("in") + " >" +
                                    directory.path("out");
        EXPECT_EQ(std::system(command.c_str()), 0) << command;
        return directory.read("out");
    }

    TemporaryDirectory directory;
};

std::string withoutObject(const std::string& text) {
    const std::size_t start = text.find('\n') + 1;
    return text.substr(start, text.rfind('}') - start);
}

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
        EXPECT_EQ(protoc("encode", protoc("decode", bytes)), bytes) << "whole, and in its order";
        std::string text;
        ProtoTextFormatter formatter(text);
        record.formatText(formatter, "record");
        EXPECT_EQ(protoc("encode", withoutObject(text)), bytes);
        AudioIssueDetected read;
        EXPECT_TRUE(readInto(read, bytes));
        EXPECT_EQ(read, record);
    }
}

} // namespace
} // namespace tamblo::qmxmetrics
