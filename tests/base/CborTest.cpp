#include "base/Cbor.h"
#include "base/Json.h"
#include "tests/base/AllocationCount.h"
#include "tests/base/Samples.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <iterator>
#include <set>
#include <sstream>
#include <string>
#include <variant>
#include <vector>

namespace tamblo {
namespace {

using test::fromHex;
using test::repeated;
using Bytes = std::vector<std::uint8_t>;
using Outcome = std::variant<Value, CborError>;

/// Reads one item, with and without the memory of key sets, which must not make a difference.
Outcome read(std::span<const std::uint8_t> bytes, KeySetCache* known = nullptr) {
    KeySetCache fresh;
    CborReader plain(bytes);
    const auto value = plain.readValue();
    for (int round = 0; round < 2; ++round) {
        CborReader cached(bytes, known != nullptr ? known : &fresh);
        EXPECT_EQ(cached.readValue(), value);
        EXPECT_EQ(cached.error(), plain.error());
    }
    EXPECT_TRUE(value ? plain.atEnd() : plain.peek() == CborReader::Type::end);
    EXPECT_EQ(value.has_value(), plain.error() == CborError::none);
    return value ? Outcome(*value) : plain.error();
}

Bytes written(const Value& value) {
    TextBuffer out;
    CborWriter(out).value(value);
    return {out.bytes().begin(), out.bytes().end()};
}

bool skips(const Bytes& bytes) {
    CborReader reader(bytes);
    const bool whole = reader.skip();
    EXPECT_EQ(whole, reader.error() == CborError::none);
    EXPECT_TRUE(!whole || reader.atEnd());
    return whole;
}

std::vector<std::string> wordsOf(const std::string& text) {
    std::istringstream stream(text);
    return {std::istream_iterator<std::string>(stream), {}};
}

/// A value in JSON; `f` stands behind a number of single precision, `t` behind the seconds of a date, `h`
/// behind the hexadecimal digits of a byte string.
Value valueNamed(const std::string& text) {
    switch (text.back()) {
    case 'f':
        return std::stof(text);
    case 't':
        return Value::date(std::stod(text));
    case 'h':
        return Value::data(fromHex(std::string_view(text).substr(0, text.size() - 1)));
    default:
        return std::get<Value>(readJson(text));
    }
}

TEST(Cbor, ReadsTheExamplesOfTheStandardAndFindsTheirTruncationAtEveryByte) {
    // RFC 8949, appendix A, and some more, without what an independent implementation writes in the same way:
    // bytes and their value.
    const auto words = wordsOf(R"(
        f90000 0.0f  f98000 -0.0f  f93c00 1.0f  f97bff 65504.0f  f9c400 -4.0f  f90001 5.960464477539063e-8f
        f90400 0.00006103515625f  fa47c35000 100000.0f  fa7f7fffff 3.4028234663852886e+38f  fa3dcccccd 0.1f
        f97c00 inff  f9fc00 -inff  fa7f800000 inff  fa7fc00000 nanf  fb3ff0000000000000 1.0
        c1fb41d452d9ec200000 1363896240.5t  c1f93e00 1.5t  c120 -1t
        4401020304 01020304h  5f42010243030405ff 0102030405h  5fff h
        64f0908591 "\ud800\udd51"  7f657374726561646d696e67ff "streaming"
        9fff []  9f018202039f0405ffff [1,[2,3],[4,5]]  83019f0203ff820405 [1,[2,3],[4,5]]
        bf61610161629f0203ffff {"a":1,"b":[2,3]}  826161bf61626163ff ["a",{"b":"c"}]
        bf6346756ef563416d7421ff {"Fun":true,"Amt":-2}  bf7f616161626163ff01ff {"abc":1}
        1800 0  190000 0  1a00000000 0  3800 -1  1b0000000000000001 1  5900020102 0102h
        5a000000020102 0102h  7b000000000000000178 "x"  bf7f616162c3a9ff9ff5a1616280ffff {"aé":[true,{"b":[]}]})");
    for (std::size_t i = 0; i + 1 < words.size(); i += 2) {
        SCOPED_TRACE(words[i]);
        const Value expected = valueNamed(words[i + 1]);
        const Bytes bytes = fromHex(words[i]);
        EXPECT_TRUE(skips(bytes));
        for (const Outcome& outcome : {read(bytes), read(written(expected))}) {
            ASSERT_EQ(outcome, Outcome(expected));
            EXPECT_EQ(std::get<Value>(outcome).kind(), expected.kind());
        }
        for (std::size_t length = 0; length < bytes.size(); ++length) {
            // A copy of its own length, so that a memory checker sees a step beyond it.
            const Bytes part(bytes.begin(), bytes.begin() + static_cast<std::ptrdiff_t>(length));
            EXPECT_EQ(read(part), Outcome(CborError::truncated)) << length;
            EXPECT_FALSE(skips(part)) << length;
        }
    }
    EXPECT_EQ(written(Array{0.1F, 1.0, Dictionary{{"b", 24}, {"a", -257}}}),
              fromHex("83 fa3dcccccd fb3ff0000000000000 a2 6161 390100 6162 1818"));
}

TEST(Cbor, RefusesWhatIsNoValueAndSkipsWhatIsWellFormed) {
    const std::vector<std::pair<CborError, const char*>> table{
        {CborError::nullValue, "f6 f7 a16161f6 81f7 c1f6"},
        {CborError::unsupportedTag,
         "c249010000000000000000 c349010000000000000000 d74401020304 d818456449455446"},
        {CborError::unsupportedTag, "c074323031332d30332d32315432303a30343a30305a c16131 c1c101 81d9d9f701"},
        {CborError::unsupportedSimple, "f0 f8ff e0 f3 f820"},
        {CborError::keyNotText, "a201020304 a1416101 bff500ff"},
        {CborError::duplicateKey, "a2616101616102 a3616201616102616203 bf6161016161f5ff a27f6161ff01616102"},
        {CborError::duplicateKey, "8181a2616101616102"},
        // Each chunk of a text stands for itself (RFC 8949, section 3.2.3).
        {CborError::notUtf8, "61ff 62c080 63eda080 70616161616161616161616161616161ff a161ff01 7f61c361bcff"},
        {CborError::integerOutOfRange, "3bffffffffffffffff 3b8000000000000000"},
        {CborError::malformed, "1c 1d 1e 3c 3e 5c 7d 9e bc dd fc fd fe f800 f818 f81f 1f 3f df ff c1ff"},
        {CborError::malformed, "5f00ff 5f21ff 5f6100ff 5f80ff 5fa0ff 5fc000ff 5fe0ff 7f4100ff 5f5f4100ffff"},
        {CborError::malformed, "7f7f6100ffff 81ff 8200ff a1ff a26161ff a26161016162ff 9f81ff bf6161ff"},
        {CborError::truncated, "fa0000 fb000000 9a01ff00 5affffffff00 5bffffffffffffffff010203 7affffffff00"},
        {CborError::truncated, "7b7fffffffffffffff010203 8200 a1 c1 d8 f8"}};
    for (const auto& [error, row] : table) {
        for (const std::string& hex : wordsOf(row)) {
            const bool isWellFormed = error != CborError::malformed && error != CborError::truncated;
            EXPECT_EQ(read(fromHex(hex)), Outcome(error)) << hex;
            EXPECT_EQ(skips(fromHex(hex)), isWellFormed) << hex;
        }
    }
}

TEST(Cbor, AllocatesNothingFromADeclaredCount) {
    KeySetCache cache;
    for (const char* major : {"5", "7", "9", "b"}) {
        for (const char* count :
             {"a40000000", "b1000000000000000", "b8000000000000000", "bffffffffffffffff"}) {
            for (const char* rest : {"", "616101", "0000"}) {
                const Bytes bytes = fromHex(std::string(major) + count + rest);
                const auto spent = test::allocationsOf(
                    [&] { EXPECT_EQ(CborReader(bytes, &cache).readValue(), std::nullopt); });
                EXPECT_LT(spent.bytes, 20'000U) << major << count << rest;
                EXPECT_FALSE(skips(bytes)) << major << count << rest;
            }
        }
    }
}

TEST(Cbor, NestsToItsDepth) {
    const int most = CborReader::kMaximumDepth;
    for (const auto& [open, close] : std::vector<std::pair<std::string, std::string>>{
             {"81", ""}, {"9f", "ff"}, {"a16161", ""}, {"bf6161", "ff"}}) {
        const auto nested = [&](int depth) {
            return fromHex(repeated(open, depth) + "01" + repeated(close, depth));
        };
        EXPECT_TRUE(std::holds_alternative<Value>(read(nested(most)))) << open;
        EXPECT_EQ(read(nested(most + 1)), Outcome(CborError::tooDeep)) << open;
        EXPECT_EQ(read(nested(200'000)), Outcome(CborError::tooDeep)) << open;
        EXPECT_TRUE(skips(nested(200'000))) << open;
    }
    const Bytes tags = fromHex(repeated("c1", 200'000) + "01");
    EXPECT_EQ(read(tags), Outcome(CborError::unsupportedTag));
    EXPECT_TRUE(skips(tags));
}

TEST(KeySetCache, MakesNoDifferenceButSharesKeySets) {
    KeySetCache cache;
    test::RandomJson random(3);
    // Few keys make shapes that begin like a remembered one and then differ, end early, go on, or name a key
    // twice; many keys fill the memory.
    for (int i = 0; i < 6000; ++i) {
        const std::size_t entries = random.below(6);
        Bytes bytes{static_cast<std::uint8_t>(0xA0 + entries)};
        std::set<std::string> keys;
        for (std::size_t entry = 0; entry < entries; ++entry) {
            const std::string number = std::to_string(random.below(1500));
            const std::string key = random.below(8) == 0 ? "equal ends " + number + " equal ends"
                                                         : std::string(1, "abcdefgh"[random.below(8)]);
            std::ranges::copy(written(Value(key)), std::back_inserter(bytes));
            std::ranges::copy(written(valueNamed(random.value(1))), std::back_inserter(bytes));
            keys.insert(key);
        }
        const bool namesAKeyTwice = keys.size() < entries;
        ASSERT_EQ(read(bytes, &cache) == Outcome(CborError::duplicateKey), namesAKeyTwice);
    }
    const Bytes one = fromHex("a3616101616202616303");
    const Bytes other = fromHex("a3616105616206616307");
    EXPECT_EQ(&CborReader(one, &cache).readDictionary(1)->keys(),
              &CborReader(other, &cache).readDictionary(1)->keys());
}

TEST(RecentTexts, AreSharedAndNeverTakenForOthers) {
    KeySetCache cache;
    // Some take each other's places, some differ in the middle only, some are too short or too long.
    for (int i = 0; i < 6000; ++i) {
        const std::string number = std::to_string(i % 2000);
        for (const std::string& text :
             {"a text with " + number, "equal ends " + number + " equal ends", std::string(i % 120, 'x')}) {
            const Bytes bytes = written(Value(text));
            ASSERT_EQ(CborReader(bytes, &cache).readValue(), Value(text));
            const auto again = test::allocationsOf(
                [&] { ASSERT_EQ(CborReader(bytes, &cache).readValue()->stringValue(), text); });
            ASSERT_EQ(again.blocks, text.size() > 96 ? 1U : 0U);
        }
    }
}

} // namespace
} // namespace tamblo
