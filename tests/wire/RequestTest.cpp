#include "wire/Request.h"
#include "base/Cbor.h"
#include "tests/base/Hex.h"
#include "wire/FrameSplitter.h"
#include "wire/Reply.h"

#include <gtest/gtest.h>

#include <limits>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::wire {
namespace {

using test::fromHex;
using Bytes = std::vector<std::uint8_t>;

Request everyParameter(Method method) {
    Request request;
    request.method = method;
    request.id = 4'000'000'000'000U;
    request.reporterID = -7;
    request.serviceType = 65535;
    request.dictionary = {{"a key", 1}, {"name", "a text that lies outside of its value"}, {"ratio", 0.5F}};
    request.category = 0xFFFFFFFF;
    request.type = 19;
    request.reporterIDs = {7, 0, 7, std::numeric_limits<std::int64_t>::min()};
    return request;
}

TEST(Request, EveryMethodIsReadAsItWasWritten) {
    KeySetCache keySets;
    for (std::size_t i = 0; i < kMethods.size(); ++i) {
        for (const bool wantsReply : {true, false}) {
            Request written = everyParameter(static_cast<Method>(i));
            if (!wantsReply) {
                written.id.reset();
            }
            TextBuffer out;
            ASSERT_TRUE(appendRequestFrame(out, written));
            FrameSplitter frames(out.bytes());
            const auto frame = frames.next();
            ASSERT_TRUE(frame);
            EXPECT_TRUE(frames.rest().empty());

            Request read;
            const auto refusal = decodeRequest(*frame, keySets, read);
            ASSERT_FALSE(refusal) << kMethods[i].name << ": " << refusal->error.message;
            EXPECT_EQ(read.method, written.method);
            EXPECT_EQ(read.id, written.id);
            TextBuffer again;
            ASSERT_TRUE(appendRequestFrame(again, read));
            EXPECT_EQ(again.view(), out.view()) << "every parameter";
        }
    }
}

TEST(Request, IndefiniteLengthsAndAbsentValuesAreAccepted) {
    KeySetCache keySets;
    // [_ 0, 5, (_ "sendMe", "ssage"), [_ {_ "k": (_ "a", "b")}, 1, 2, [_ 7]]]
    const Bytes streamed = fromHex(
        "9f 00 05 7f 66 73656e644d65 65 7373616765 ff 9f bf 61 6b 7f 61 61 61 62 ff ff 01 02 9f 07 ff ff ff");
    Request request;
    ASSERT_FALSE(decodeRequest(streamed, keySets, request));
    EXPECT_EQ(request.dictionary, (Dictionary{{"k", "ab"}}));
    EXPECT_EQ(request.reporterIDs, std::vector<std::int64_t>{7});

    // [2, "sendMessage", [null, 1, 2, null]]
    const Bytes nothing = fromHex("83 02 6b 73656e644d657373616765 84 f6 01 02 f6");
    ASSERT_FALSE(decodeRequest(nothing, keySets, request));
    EXPECT_TRUE(request.dictionary.empty());
    EXPECT_TRUE(request.reporterIDs.empty());
    EXPECT_FALSE(request.id);
}

TEST(Request, WhatIsRefusedNamesItsReason) {
    struct Case {
        std::string_view name;
        std::int64_t code;
        std::uint64_t id;
        std::string_view mentions;
        std::string hex;
    };
    // sendMessage with id 5 begins 84 00 05 6b "sendMessage" 84.
    const std::string send = "84 00 05 6b 73656e644d657373616765 84";
    const std::string create = "84 00 05 76 6372656174655265706f7274696e6753657373696f6e";
    std::string nestedDeep = "a1 61 6b";
    for (int i = 0; i < 32; ++i) {
        nestedDeep += "81";
    }
    nestedDeep += "00";
    const std::vector<Case> cases = {
        {"nothing", kNotWellFormed, 0, "early", ""},
        {"cut short", kNotWellFormed, 0, "early", "84 00 05"},
        {"two items", kNotWellFormed, 0, "follow", create + "81 07 00"},
        {"not an array", kNotARequest, 0, "array", "a0"},
        {"a reply", kNotARequest, 0, "neither", "84 01 05 f6 f6"},
        {"negative id", kNotARequest, 0, "id", "84 00 20 60 80"},
        {"method no text", kNotARequest, 5, "method", "84 00 05 07 80"},
        {"unknown method, no reply wanted", kUnknownMethod, 0, "fly", "83 02 63 666c79 80"},
        {"unknown method", kUnknownMethod, 5, "fly", "84 00 05 63 666c79 80"},
        {"params missing", kWrongParameters, 5, "params",
         "83 00 05 76 6372656174655265706f7274696e6753657373696f6e"},
        {"too few", kWrongParameters, 5, "reporter ID is missing", create + "80"},
        {"too many", kWrongParameters, 5, "too many", create + "82 07 07"},
        {"reporter no integer", kWrongParameters, 5, "reporter ID", create + "81 61 37"},
        {"reporter too large", kWrongParameters, 5, "reporter ID", create + "81 1b ffffffffffffffff"},
        {"fifth element", kNotARequest, 5, "too many",
         "85 00 05 76 6372656174655265706f7274696e6753657373696f6e 81 07 00"},
        {"payload no map", kWrongParameters, 5, "payload", send + "80 01 02 80"},
        {"null inside", kWrongParameters, 5, "null", send + "a1 61 6b f6 01 02 80"},
        {"other tag", kWrongParameters, 5, "tag", send + "a1 61 6b c2 41 00 01 02 80"},
        {"key no text", kWrongParameters, 5, "key", send + "a1 01 02 01 02 80"},
        {"key twice", kWrongParameters, 5, "twice", send + "a2 61 6b 01 61 6b 02 01 02 80"},
        {"not UTF-8", kWrongParameters, 5, "UTF-8", send + "a1 61 6b 61 ff 01 02 80"},
        {"too deep", kWrongParameters, 5, "deeper", send + nestedDeep + "01 02 80"},
        {"category too large", kWrongParameters, 5, "category", send + "a0 1b 0000000100000000 02 80"},
        {"type too large", kWrongParameters, 5, "type", send + "a0 01 1a 00010000 80"},
        {"IDs no array", kWrongParameters, 5, "reporter IDs", send + "a0 01 02 07"},
        {"an ID no integer", kWrongParameters, 5, "reporter IDs", send + "a0 01 02 82 07 f4"},
        {"bad value, then cut short", kNotWellFormed, 0, "early", send + "a1 61 6b f6 01 02"},
    };
    KeySetCache keySets;
    for (const Case& expected : cases) {
        SCOPED_TRACE(expected.name);
        Request request;
        const auto refusal = decodeRequest(fromHex(expected.hex), keySets, request);
        ASSERT_TRUE(refusal);
        EXPECT_EQ(refusal->error.domain, kProtocolErrorDomain);
        EXPECT_EQ(refusal->error.code, expected.code);
        EXPECT_EQ(refusal->id, expected.id);
        EXPECT_EQ(refusal->endsConnection, expected.code == kNotWellFormed);
        EXPECT_NE(refusal->error.message.find(expected.mentions), std::string::npos)
            << refusal->error.message;
    }
    // What was refused leaves nothing behind that the next request could trip over.
    Request request;
    EXPECT_FALSE(decodeRequest(fromHex(create + "81 07"), keySets, request));
    EXPECT_EQ(request.reporterID, 7);
}

TEST(Request, FrameBeyondTheLimitIsNotWritten) {
    Request request;
    request.method = Method::sendMessage;
    request.dictionary = {{"k", std::string(kMaximumFrameBytes, 'x')}};
    TextBuffer out;
    out.append("before");
    EXPECT_FALSE(appendRequestFrame(out, request));
    EXPECT_EQ(out.view(), "before");
}

TEST(FrameSplitter, TakesWholeFramesOfAnyCut) {
    Bytes stream;
    for (const std::size_t length : {0U, 1U, 300U}) {
        stream.insert(stream.end(),
                      {static_cast<std::uint8_t>(length), static_cast<std::uint8_t>(length >> 8), 0, 0});
        stream.insert(stream.end(), length, 0x20);
    }
    for (std::size_t cut = 0; cut <= stream.size(); ++cut) {
        FrameSplitter frames({stream.data(), cut});
        std::size_t taken = 0;
        while (const auto frame = frames.next()) {
            taken += kLengthBytes + frame->size();
        }
        EXPECT_EQ(taken + frames.rest().size(), cut);
        EXPECT_FALSE(frames.tooLong());
        EXPECT_GT(frames.wanted(), frames.rest().size());
    }
}

TEST(FrameSplitter, LongestFrameIsTheLimit) {
    Bytes stream(kLengthBytes + kMaximumFrameBytes);
    stream[2] = 0x10;
    EXPECT_TRUE(FrameSplitter(stream).next());
    stream[0] = 1;
    FrameSplitter frames(stream);
    EXPECT_FALSE(frames.next());
    EXPECT_TRUE(frames.tooLong());
}

TEST(Reply, EveryResultIsReadAsItWasWritten) {
    const std::vector<std::int64_t> numbers{1, -5, std::numeric_limits<std::int64_t>::max()};
    const Dictionary dictionary{{"reporterID", 7}, {"serviceType", 2}};
    TextBuffer out;
    appendNullReply(out, 1);
    appendBooleanReply(out, 2, true);
    appendUnsignedReply(out, 3, 65535);
    appendDictionaryReply(out, 4, dictionary);
    appendIntegersReply(out, 5, numbers);
    appendErrorReply(out, 6, {"a.domain", -32601, "why"});
    appendErrorReply(out, 7, {"b.domain", 1, ""});

    FrameSplitter frames(out.bytes());
    std::vector<Reply> replies;
    while (const auto frame = frames.next()) {
        const auto reply = decodeReply(*frame);
        ASSERT_TRUE(reply);
        replies.push_back(*reply);
        for (std::size_t cut = 0; cut < frame->size(); ++cut) {
            EXPECT_FALSE(decodeReply(frame->first(cut)));
        }
    }
    ASSERT_EQ(replies.size(), 7U);
    EXPECT_FALSE(replies[0].result);
    EXPECT_EQ(*replies[1].result, Value(true));
    EXPECT_EQ(*replies[2].result, Value(65535));
    EXPECT_EQ(*replies[3].result, Value(dictionary));
    EXPECT_EQ(*replies[4].result, Value(Array(numbers.begin(), numbers.end())));
    EXPECT_EQ(replies[5].error->code, -32601);
    EXPECT_EQ(replies[5].error->message, "why");
    EXPECT_EQ(replies[6].error->domain, "b.domain");
    for (std::size_t i = 0; i < replies.size(); ++i) {
        EXPECT_EQ(replies[i].id, i + 1);
    }
}

} // namespace
} // namespace tamblo::wire
