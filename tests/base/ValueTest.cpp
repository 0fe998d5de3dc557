#include "base/Value.h"
#include "base/Json.h"
#include "base/KeySetCache.h"
#include "tests/base/AllocationCount.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <iterator>
#include <limits>
#include <map>
#include <random>
#include <string>
#include <thread>
#include <vector>

namespace tamblo {
namespace {

constexpr double kNan = std::numeric_limits<double>::quiet_NaN();
constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();
constexpr std::uint64_t kMostUnsigned = std::numeric_limits<std::uint64_t>::max();
constexpr std::int64_t k2To53 = std::int64_t{1} << 53;

TEST(Value, NumbersAreEqualByValueAcrossKinds) {
    const std::vector<std::vector<Value>> classes{
        {0, false, 0.0, -0.0, 0.0F, -0.0F, 0U, Value()},
        {1, true, 1.0, 1.0F, 1U},
        {0.1F, static_cast<double>(0.1F)},
        {k2To53, static_cast<double>(k2To53), static_cast<float>(k2To53)},
        {k2To53 + 1, static_cast<std::uint64_t>(k2To53) + 1},
        {kMost, static_cast<std::uint64_t>(kMost)},
        {std::uint64_t{1} << 63U, 0x1p63, 0x1p63F},
        {kMostUnsigned},
        {0x1p64, 0x1p64F},
        {-kMost - 1, -0x1p63, -0x1p63F},
        {kNan, std::numeric_limits<float>::quiet_NaN(), -kNan},
        {""},
        {Value::date(1)},
        {Value::date(kNan), Value::date(-kNan)},
        {Value::data({})},
        {Value(Dictionary{})},
        {Value(Array{1, "a"}), Value(Array{1.0, "a"})},
        {Value(Dictionary{{"a", 1}}), Value(Dictionary{{"a", true}})},
        {Value(Dictionary{{"a", 1}, {"b", 1}})},
        {Value(Dictionary{{"", 1}, {"ab", 1}})}};
    for (const auto& some : classes) {
        for (const auto& others : classes) {
            for (const Value& a : some) {
                for (const Value& b : others) {
                    EXPECT_EQ(a == b, &some == &others) << jsonText(Array{a, b});
                }
            }
        }
    }
}

TEST(Value, ReadingANumberNeverFails) {
    const struct {
        Value value;
        double real;
        std::int64_t integer;
        std::uint64_t natural;
        bool truth;
    } rows[] = {{true, 1, 1, 1, true},
                {-7, -7, -7, 0, true},
                {-2.9, -2.9, -2, 0, true},
                {0.5F, 0.5, 0, 0, true},
                {kMostUnsigned, 0x1p64, kMost, kMostUnsigned, true},
                {std::numeric_limits<float>::quiet_NaN(), kNan, 0, 0, false},
                {1e300, 1e300, kMost, kMostUnsigned, true},
                {-0.0, 0, 0, 0, false},
                {" \t-3.75e1x", -37.5, -37, 0, true},
                {"0." + std::string(400, '0') + "1", 0, 0, 0, false},
                {std::string(400, '1'), std::numeric_limits<double>::infinity(), kMost, kMostUnsigned, true},
                {"9223372036854775807", 0x1p63, kMost, static_cast<std::uint64_t>(kMost), true},
                {"YES", 0, 0, 0, true},
                {Value::date(5), 0, 0, 0, false},
                {Value(Dictionary{{"a", 1}}), 0, 0, 0, false}};
    for (const auto& [value, real, integer, natural, truth] : rows) {
        EXPECT_EQ(Value(value.doubleValue()), Value(real)) << jsonText(value);
        EXPECT_EQ(value.integerValue(), integer) << jsonText(value);
        EXPECT_EQ(value.unsignedValue(), natural) << jsonText(value);
        EXPECT_EQ(value.boolValue(), truth) << jsonText(value);
    }
}

using Model = std::map<std::string, Value>;

constexpr std::array<std::uint8_t, 20> kSomeBytes{0, 1, 255};

/// Keys that differ late, early, only in length, or only in bytes that are 0 or above ASCII.
const std::vector<std::string>& someKeys() {
    using namespace std::string_literals;
    static const std::vector<std::string> keys{
        ""s,   "\0"s,         "\0\0\0\0\0\0\0\0\0"s,   "a\0"s,      "with space"s,         "a"s,
        "ab"s, "spatial-"s,   "spatial-audio"s,        "spatialA"s, "spatial-audio-mode"s, "\xC3\xA9"s,
        "b"s,  "\"quoted\""s, "zrreporting_timestamp"s};
    return keys;
}

/// The same entries with keys that are shared with no other dictionary built so.
Dictionary unshared(const Model& model) {
    std::vector<std::string_view> keys;
    std::vector<Value> values;
    for (const auto& [key, value] : model) {
        keys.push_back(key);
        values.push_back(value);
    }
    Dictionary dictionary;
    EXPECT_EQ(KeySetCache::makeDictionaryOnce(keys, values, 0, dictionary), KeySetCache::Fault::none);
    return dictionary;
}

void expectHolds(const Dictionary& dictionary, const Model& model) {
    ASSERT_EQ(dictionary, unshared(model));
    std::size_t index = 0;
    bool anyHasSpace = false;
    for (const auto& [key, value] : model) {
        ASSERT_EQ(dictionary.keyAt(index), key);
        ASSERT_EQ(dictionary.keys().jsonKey(index), jsonText(key) + ":");
        ASSERT_EQ(dictionary.valueAt(index++), value);
        ASSERT_EQ(*dictionary.find(key), value);
        ASSERT_EQ(dictionary.find(key + "x") != nullptr, model.contains(key + "x"));
        anyHasSpace = anyHasSpace || key.find(' ') != key.npos;
    }
    ASSERT_EQ(dictionary.size(), index);
    ASSERT_EQ(dictionary.keys().anyKeyHasSpace(), anyHasSpace);
    for (const std::string& key : someKeys()) {
        const Value* found = dictionary.find(key);
        ASSERT_EQ(found != nullptr, model.contains(key));
        ASSERT_TRUE(found == nullptr || *found == model.at(key));
    }
}

class DictionaryModelTest : public testing::TestWithParam<std::uint32_t> {
protected:
    /// The last dictionary stays empty.
    static constexpr std::size_t kChanging = 4;

    std::size_t below(std::size_t limit) { return random_() % limit; }
    const std::string& key() { return someKeys()[below(someKeys().size())]; }

    void change(Dictionary& dictionary, Model& model) {
        // Texts of lengths on both sides of what lies in the value itself, and of what a byte can say.
        const std::string text(below(4) == 0 ? below(300) : below(20), 'x');
        const Value values[] = {0, 0.0, 1, text, text, Array{1}, Value::data({&kSomeBytes[0], below(20)})};
        const Value& value = values[below(std::size(values))];
        const std::string& name = key();
        const std::size_t other = below(kChanging + 1);
        const std::size_t place = below(std::max<std::size_t>(model.size(), 1));
        switch (below(11)) {
        case 0:
            dictionary.merge(dictionaries_[other]);
            for (const auto& [theirs, their] : Model(models_[other])) {
                model.insert_or_assign(theirs, their);
            }
            break;
        case 1:
            dictionary = dictionaries_[other];
            model = Model(models_[other]);
            break;
        case 2:
            dictionary = unshared(model);
            break;
        case 3: {
            // More new keys than are added one by one, among those that are there.
            Dictionary many;
            for (char letter = '0'; letter < 'p'; letter = static_cast<char>(letter + 1 + below(9))) {
                many.set({&letter, 1}, value);
                model.insert_or_assign(std::string(1, letter), value);
            }
            dictionary.merge(many);
            break;
        }
        case 4:
            if (!model.empty()) {
                dictionary.setValueAt(place, value);
                std::next(model.begin(), static_cast<std::ptrdiff_t>(place))->second = value;
            }
            break;
        case 5:
            // A value of its own, which may move as it is set.
            if (!model.empty()) {
                model.insert_or_assign(name, Value(dictionary.valueAt(place)));
                dictionary.set(name, dictionary.valueAt(place));
            }
            break;
        case 6:
        case 7:
            ASSERT_EQ(dictionary.remove(name), model.erase(name) == 1);
            break;
        default:
            dictionary.set(name, value);
            model.insert_or_assign(name, value);
        }
    }

    std::mt19937 random_{GetParam()};
    std::array<Dictionary, kChanging + 1> dictionaries_;
    std::array<Model, kChanging + 1> models_;
};

TEST_P(DictionaryModelTest, DoesWhatASortedMapDoes) {
    for (int step = 0; step < 1000; ++step) {
        const std::size_t a = below(kChanging);
        const std::size_t b = below(kChanging);
        ASSERT_NO_FATAL_FAILURE(change(dictionaries_[a], models_[a]));
        ASSERT_EQ(dictionaries_[a] == dictionaries_[b], models_[a] == models_[b]);
        std::vector<std::string_view> ignored;
        Model modelA = models_[a];
        Model modelB = models_[b];
        while (below(4) != 0) {
            const std::string& ignoredKey = key();
            ignored.emplace_back(ignoredKey);
            modelA.erase(ignoredKey);
            modelB.erase(ignoredKey);
        }
        ASSERT_EQ(dictionaries_[a].equalsIgnoring(dictionaries_[b], ignored), modelA == modelB);
        // All of them: what shares a block with the changed one must stand as it was.
        for (std::size_t slot = 0; slot <= kChanging; ++slot) {
            ASSERT_NO_FATAL_FAILURE(expectHolds(dictionaries_[slot], models_[slot])) << "step " << step;
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Seeds, DictionaryModelTest, testing::Values(1U, 2U, 3U, 4U));

TEST(Dictionary, CanBeReplacedByWhatItHolds) {
    const std::string text = "another text that does not lie in the value";
    Dictionary outer{{"inner", Dictionary{{"b", text}, {"inner", Dictionary{{"b", text}}}}}};
    outer.merge(outer.find("inner")->dictionaryValue());
    EXPECT_EQ(outer, (Dictionary{{"b", text}, {"inner", Dictionary{{"b", text}}}}));
    outer = outer.find("inner")->dictionaryValue();
    EXPECT_EQ(outer, (Dictionary{{"b", text}}));
    Value value = Array{Value(Array{Value(outer)})};
    value = value.arrayValue()[0];
    value = value.arrayValue()[0];
    value = *value.dictionaryValue().find("b");
    EXPECT_EQ(value, Value(text));
}

TEST(Dictionary, AllocatesOnlyForWhatIsNew) {
    Dictionary previous{{"a", 1}, {"b", 2}, {"c", 3}};
    const Dictionary update{{"a", 4}, {"c", "short"}};
    EXPECT_EQ(test::allocationsOf([&] { previous.merge(update); }).blocks, 0U);
    // A key that was added to the same keys twice before is a look-up; only the values need a block.
    Dictionary first;
    for (int i = 0; i < 2; ++i) {
        first = previous;
        first.set("zrreporting_timestamp", 1.5);
    }
    EXPECT_LE(test::allocationsOf([&] { previous.set("zrreporting_timestamp", 2.5); }).blocks, 1U);
    EXPECT_EQ(&previous.keys(), &first.keys());
}

TEST(KeySet, IsSharedBetweenThreads) {
    const Dictionary base{{"a", 1}, {"b", 2}};
    std::vector<std::jthread> threads;
    for (int seed = 0; seed < 4; ++seed) {
        threads.emplace_back([&base, seed] {
            for (int i = 0; i < 2000; ++i) {
                Dictionary mine = base;
                mine.set("k" + std::to_string((i * 7 + seed) % 40), i);
                mine.remove("a");
                ASSERT_EQ(mine.keyAt(0), "b");
                ASSERT_EQ(mine.valueAt(1), Value(i));
            }
        });
    }
}

} // namespace
} // namespace tamblo
