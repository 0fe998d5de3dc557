#include "base/Format.h"
#include "base/Json.h"
#include "tests/base/Samples.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <gmock/gmock.h>
#include <nlohmann/json.hpp>

#include <algorithm>
#include <cstdint>
#include <fstream>
#include <limits>
#include <map>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::wire {
namespace {

using test::fromHex;
using Bytes = std::vector<std::uint8_t>;

TEST(Request, EveryMethodIsReadAsItWasWritten) {
    Request written;
    written.reporterID = -7;
    written.serviceType = 65535;
    written.dictionary = {{"a key", 1}, {"name", "a text that lies outside of its value"}, {"ratio", 0.5F}};
    written.category = 0xFFFFFFFF;
    written.type = 19;
    written.reporterIDs = {7, 0, 7, std::numeric_limits<std::int64_t>::min()};
    KeySetCache keySets;
    for (std::size_t i = 0; i < kMethods.size(); ++i) {
        written.method = static_cast<Method>(i);
        for (const std::optional<std::uint64_t> id : {std::optional(4'000'000'000'000U), {}}) {
            written.id = id;
            TextBuffer out;
            ASSERT_TRUE(appendRequestFrame(out, written));
            Request read;
            ASSERT_FALSE(decodeRequest(out.bytes().subspan(kLengthBytes), keySets, read)) << i;
            EXPECT_TRUE(read.method == written.method && read.id == written.id) << i;
            TextBuffer again;
            ASSERT_TRUE(appendRequestFrame(again, read));
            EXPECT_EQ(again.view(), out.view()) << "every parameter";
        }
    }
}

TEST(Request, PiecesAndAbsentValuesAreAccepted) {
    KeySetCache keySets;
    Request request;
    request.dictionary = {{"left", "behind"}};
    request.reporterIDs = {1};
    // [_ 2, (_ "sendMe", "ssage"), [_ null, 1, 2, null]]
    const Bytes nothing = fromHex("9f 02 7f 66 73656e644d65 65 7373616765 ff 9f f6 01 02 f6 ff ff");
    ASSERT_FALSE(decodeRequest(nothing, keySets, request));
    EXPECT_TRUE(request.dictionary.empty() && request.reporterIDs.empty());
    EXPECT_EQ(request.type, 2);
    EXPECT_FALSE(request.id);
}

TEST(Request, WhatIsRefusedNamesItsReason) {
    // Requests with id 5, up to their parameters.
    const std::string send = "84 00 05 6b 73656e644d657373616765 84";
    const std::string create = "00 05 76 6372656174655265706f7274696e6753657373696f6e";
    const struct {
        std::int64_t code;
        std::uint64_t id;
        std::string mentions;
        std::string hex;
    } cases[] = {
        {kNotWellFormed, 0, "early", ""},
        {kNotWellFormed, 0, "follow", "84" + create + "81 07 00"},
        {kNotWellFormed, 0, "early", send + "a1 61 6b f6 01 02"}, // a bad value, then cut short
        {kNotARequest, 0, "array", "a0"},
        {kNotARequest, 0, "id", "84 00 20 60 80"},
        {kNotARequest, 5, "too many", "85" + create + "81 07 00"},
        {kUnknownMethod, 0, "fly", "83 02 63 666c79 80"}, // without reply
        {kWrongParameters, 5, "params", "83" + create},
        {kWrongParameters, 5, "reporter ID is missing", "84" + create + "80"},
        {kWrongParameters, 5, "too many", "84" + create + "82 07 07"},
        {kWrongParameters, 5, "reporter ID", "84" + create + "81 1b ffffffffffffffff"},
        {kWrongParameters, 5, "twice", send + "a2 61 6b 01 61 6b 02 01 02 80"},
        {kWrongParameters, 5, "category", send + "a0 1b 0000000100000000 02 80"},
        {kWrongParameters, 5, "type", send + "a0 01 1a 00010000 80"},
        {kWrongParameters, 5, "reporter IDs", send + "a0 01 02 82 07 f4"},
    };
    KeySetCache keySets;
    Request request;
    for (const auto& [code, id, mentions, hex] : cases) {
        SCOPED_TRACE(hex);
        const auto refusal = decodeRequest(fromHex(hex), keySets, request);
        ASSERT_TRUE(refusal);
        EXPECT_EQ(refusal->error.code, code);
        EXPECT_EQ(refusal->id, id);
        EXPECT_EQ(refusal->endsConnection, code == kNotWellFormed);
        EXPECT_THAT(refusal->error.message, testing::HasSubstr(mentions));
    }
}

TEST(FrameSplitter, TakesWholeFramesOfAnyCutUpToTheLimit) {
    const Bytes stream = fromHex("00000000 01000000 20 2c010000" + test::repeated("20", 300));
    for (std::size_t cut = 0; cut <= stream.size(); ++cut) {
        FrameSplitter frames({stream.data(), cut});
        std::size_t taken = 0;
        while (const auto frame = frames.next()) {
            taken += kLengthBytes + frame->size();
        }
        EXPECT_EQ(taken + frames.rest().size(), cut);
        EXPECT_TRUE(!frames.tooLong() && frames.wanted() > frames.rest().size());
    }
    Bytes longest(kLengthBytes + kMaximumFrameBytes);
    longest[2] = 0x10;
    EXPECT_TRUE(FrameSplitter(longest).next());
    longest[0] = 1;
    FrameSplitter frames(longest);
    EXPECT_TRUE(!frames.next() && frames.tooLong());
}

TEST(Reply, EveryResultIsReadAsItWasWritten) {
    const std::vector<std::int64_t> numbers{1, -5, std::numeric_limits<std::int64_t>::max()};
    for (const std::uint64_t id : {23ULL, 24ULL, 255ULL, 256ULL, 65'536ULL, ~0ULL}) {
        TextBuffer out;
        appendNullReply(out, id);
        appendBooleanReply(out, id, true);
        appendUnsignedReply(out, id, 65535);
        appendDictionaryReply(out, id, {{"reporterID", 7}, {"serviceType", 2}});
        appendIntegersReply(out, id, numbers);
        appendErrorReply(out, id, {"a.domain", -32601, "why"});
        appendErrorReply(out, id, {"b.domain", 1, ""});
        appendDictionaryReply(out, id, {{"k", std::string(kMaximumFrameBytes, 'x')}});
        FrameSplitter frames(out.bytes());
        std::vector<std::string> results;
        while (const auto frame = frames.next()) {
            const auto reply = decodeReply(*frame);
            ASSERT_TRUE(reply);
            EXPECT_EQ(reply->id, id);
            const Error error = reply->error.value_or(Error{});
            results.push_back(reply->result  ? jsonText(*reply->result)
                              : reply->error ? formatted("{} {} {}", error.domain, error.code, error.message)
                                             : "null");
            for (std::size_t cut = 0; cut < frame->size(); ++cut) {
                EXPECT_FALSE(decodeReply(frame->first(cut)));
            }
        }
        EXPECT_THAT(results,
                    testing::ElementsAre("null", "true", "65535", R"({"reporterID":7,"serviceType":2})",
                                         "[1,-5,9223372036854775807]", "a.domain -32601 why", "b.domain 1 ",
                                         "com.vandra.tamblo.protocol -32600 the result is too long"));
    }
}

/// What the protocol's page shows, in the order of the page.
struct Example {
    std::string heading;
    char sender; ///< 'C', 'S', or 'V' for a value of a table
    std::string notation;
    std::string hex;
};

/// The one item of the one frame, which says what the notation says; an independent decoder knows.
Bytes itemOf(const Example& example) {
    const Bytes all = fromHex(example.hex);
    FrameSplitter frames(all);
    const auto frame = frames.next().value();
    EXPECT_TRUE(frames.rest().empty()) << "more than one frame";
    if (example.notation.starts_with('[')) {
        EXPECT_EQ(nlohmann::json::from_cbor(frame), nlohmann::json::parse(example.notation));
    }
    return {frame.begin(), frame.end()};
}

std::vector<Example> examplesOfThePage() {
    std::ifstream page(EXAMPLES_DIR "/../docs/protocol.md");
    EXPECT_TRUE(page);
    std::vector<Example> examples;
    std::string heading;
    bool isInBlock = false;
    for (std::string line; std::getline(page, line);) {
        const std::string_view text = line;
        if (text.starts_with("```")) {
            isInBlock = !isInBlock;
        } else if (text.starts_with("#")) {
            heading = text.substr(text.find(' ') + 1);
        } else if (heading == "Values" && text.starts_with("| ") && text.find('`') != text.npos) {
            const std::size_t hexEnd = line.rfind('`');
            const std::size_t hexStart = line.rfind('`', hexEnd - 1) + 1;
            examples.push_back({heading, 'V', line, line.substr(hexStart, hexEnd - hexStart)});
        } else if (isInBlock && (text.starts_with("C: ") || text.starts_with("S: "))) {
            examples.push_back({heading, text[0], std::string(text.substr(3)), {}});
        } else if (isInBlock) {
            // Notation that goes on is indented further than bytes are.
            std::string& part = text.starts_with("    ") ? examples.back().notation : examples.back().hex;
            part.append(" ").append(text.substr(text.find_first_not_of(' ')));
        }
    }
    return examples;
}

TEST(ProtocolDocument, EveryExampleIsReadAsThePageSays) {
    KeySetCache keySets;
    const std::vector<Example> examples = examplesOfThePage();
    std::set<Method> shown;
    std::map<std::string, int> seen;
    for (std::size_t i = 0; i < examples.size(); ++i) {
        const auto& [heading, sender, notation, hex] = examples[i];
        SCOPED_TRACE(notation);
        if (sender == 'S') {
            EXPECT_TRUE(decodeReply(itemOf(examples[i])));
            ++seen["replies"];
            continue;
        }
        if (sender == 'V') {
            const Bytes item = fromHex(hex);
            CborReader reader(item);
            EXPECT_TRUE(reader.readValue() && reader.atEnd());
            ++seen["values"];
            continue;
        }
        Request request;
        const auto refusal = decodeRequest(itemOf(examples[i]), keySets, request);
        if (const auto method = methodNamed(heading)) {
            ASSERT_FALSE(refusal) << refusal->error.message;
            EXPECT_EQ(request.method, *method);
            shown.insert(*method);
        } else if (heading == "Errors") {
            ASSERT_TRUE(refusal);
            TextBuffer answer;
            appendErrorReply(answer, refusal->id, refusal->error);
            EXPECT_TRUE(std::ranges::equal(answer.bytes(), fromHex(examples.at(i + 1).hex)))
                << refusal->error.message;
            ++seen["refusals"];
        }
    }
    EXPECT_EQ(shown.size(), kMethods.size()) << "a method without an example";
    EXPECT_TRUE(seen["refusals"] >= 5 && seen["replies"] >= 11 && seen["values"] >= 11);
}

} // namespace
} // namespace tamblo::wire
