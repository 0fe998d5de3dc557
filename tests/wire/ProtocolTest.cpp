#include "base/Format.h"
#include "base/Json.h"
#include "tests/base/Samples.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"
#include "wire/Request.h"

#include <gmock/gmock.h>

#include <cstdint>
#include <limits>
#include <string>
#include <utility>
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
    const auto expectRefused = [&](const auto& refused, const std::string& hex) {
        const auto& [code, id, mentions, same] = refused;
        SCOPED_TRACE(hex);
        const auto refusal = decodeRequest(fromHex(hex), keySets, request);
        ASSERT_TRUE(refusal);
        EXPECT_EQ(refusal->error.code, code);
        EXPECT_EQ(refusal->id, id);
        EXPECT_EQ(refusal->endsConnection, code == kNotWellFormed);
        EXPECT_THAT(refusal->error.message, testing::HasSubstr(mentions));
    };
    for (const auto& refused : cases) {
        expectRefused(refused, refused.hex);
        // With the id as the client library writes it.
        if (refused.hex.starts_with(send)) {
            expectRefused(refused, "84 00 1b 0000000000000005 " + refused.hex.substr(9));
        }
    }
}

TEST(Request, CountsTheSameHoweverItsIdIsWritten) {
    const std::string rest =
        " 6b 73656e644d657373616765 84 a2 61 6b 67 6120746578742e 61 6c 82 01 02 01 02 81 07";
    const auto decoded = [&rest](const std::string& head, std::size_t limit) {
        KeySetCache keySets;
        Request request;
        const bool isRefused =
            decodeRequest(fromHex(head + rest), keySets, request, {.values = {.decodedBytes = limit}})
                .has_value();
        return std::pair(isRefused, request.decodedBytes);
    };
    const std::size_t bytes = decoded("84 00 05", 10'000).second;
    ASSERT_GT(bytes, 100U);
    for (const std::size_t limit : {bytes - 1, bytes, bytes + 1}) {
        EXPECT_EQ(decoded("84 00 1b 0000000000000005", limit), decoded("84 00 05", limit));
        EXPECT_EQ(decoded("84 00 05", limit).first, limit < bytes);
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

} // namespace
} // namespace tamblo::wire
