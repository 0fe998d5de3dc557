#include "base/Dictionary.h"
#include "tests/base/AllocationCount.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <iterator>
#include <map>
#include <random>
#include <string>
#include <thread>
#include <vector>

namespace tamblo {
namespace {

using Model = std::map<std::string, Value>;

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
    std::vector<std::uint32_t> places;
    for (const auto& [key, value] : model) {
        places.push_back(static_cast<std::uint32_t>(keys.size()));
        keys.push_back(key);
        values.push_back(value);
    }
    return Dictionary::fromKeySet(KeySet::make(keys), values, places);
}

void expectHolds(const Dictionary& dictionary, const Model& model) {
    ASSERT_EQ(dictionary.size(), model.size());
    ASSERT_EQ(dictionary.empty(), model.empty());
    std::size_t index = 0;
    bool anyHasSpace = false;
    for (const auto& [key, value] : model) {
        ASSERT_EQ(dictionary.keyAt(index), key);
        ASSERT_EQ(dictionary.valueAt(index), value);
        anyHasSpace = anyHasSpace || key.find(' ') != key.npos;
        ++index;
    }
    ASSERT_EQ(dictionary.keys().anyKeyHasSpace(), anyHasSpace);
    for (const std::string& key : someKeys()) {
        const auto expected = model.find(key);
        const Value* found = dictionary.find(key);
        ASSERT_EQ(found != nullptr, expected != model.end());
        ASSERT_TRUE(found == nullptr || *found == expected->second);
    }
}

class DictionaryModelTest : public testing::TestWithParam<std::uint32_t> {
protected:
    std::size_t below(std::size_t limit) { return random_() % limit; }
    const std::string& key() { return someKeys()[below(someKeys().size())]; }
    Value value() {
        const int number = static_cast<int>(below(2));
        const Value values[] = {number, static_cast<double>(number),
                                number == 0 ? "short" : "a text that does not lie in the value itself",
                                Array{number}};
        return values[below(4)];
    }
    void change(std::size_t slot) {
        Dictionary& dictionary = dictionaries_[slot];
        Model& model = models_[slot];
        const std::size_t other = below(dictionaries_.size());
        const std::size_t place = model.empty() ? 0 : below(model.size());
        const std::string& k = key();
        const Value v = value();
        Dictionary many;
        switch (below(13)) {
        case 0:
            dictionary.merge(dictionaries_[other]);
            for (const auto& [theirs, their] : Model(models_[other])) {
                model.insert_or_assign(theirs, their);
            }
            return;
        case 1:
            dictionary = dictionaries_[other];
            model = Model(models_[other]);
            return;
        case 2:
            dictionary = unshared(model);
            return;
        case 3:
            // More new keys than are added one by one, among those that are there.
            for (std::size_t i = below(3); i < 40; i += 1 + below(4)) {
                const std::string name(1, static_cast<char>('@' + i));
                many.set(name, v);
                model.insert_or_assign(name, v);
            }
            dictionary.merge(many);
            return;
        case 4:
            dictionary = {};
            model.clear();
            return;
        case 5:
            if (!model.empty()) {
                dictionary.setValueAt(place, v);
                std::next(model.begin(), static_cast<std::ptrdiff_t>(place))->second = v;
            }
            return;
        case 6:
            // A value of its own, which may move as it is set.
            if (!model.empty()) {
                model.insert_or_assign(k, Value(dictionary.valueAt(place)));
                dictionary.set(k, dictionary.valueAt(place));
            }
            return;
        case 7:
        case 8:
        case 9:
            ASSERT_EQ(dictionary.remove(k), model.erase(k) == 1);
            return;
        default:
            dictionary.set(k, v);
            model.insert_or_assign(k, v);
        }
    }

    std::mt19937 random_{GetParam()};
    std::array<Dictionary, 4> dictionaries_;
    std::array<Model, 4> models_;
};

TEST_P(DictionaryModelTest, DoesWhatASortedMapDoes) {
    for (int step = 0; step < 3000; ++step) {
        ASSERT_NO_FATAL_FAILURE(change(below(dictionaries_.size())));
        const std::size_t a = below(4);
        const std::size_t b = below(4);
        ASSERT_EQ(dictionaries_[a] == dictionaries_[b], models_[a] == models_[b]);
        std::vector<std::string_view> ignored;
        Model modelA = models_[a];
        Model modelB = models_[b];
        while (below(4) != 0) {
            ignored.emplace_back(key());
            modelA.erase(std::string(ignored.back()));
            modelB.erase(std::string(ignored.back()));
        }
        ASSERT_EQ(dictionaries_[a].equalsIgnoring(dictionaries_[b], ignored), modelA == modelB);
        ASSERT_EQ(dictionaries_[a], unshared(models_[a]));
        // All of them: what shares a block with the changed one must stand as it was.
        for (std::size_t slot = 0; slot < 4; ++slot) {
            ASSERT_NO_FATAL_FAILURE(expectHolds(dictionaries_[slot], models_[slot])) << "step " << step;
        }
    }
}

INSTANTIATE_TEST_SUITE_P(Seeds, DictionaryModelTest, testing::Values(1U, 2U, 3U, 4U));

TEST(Dictionary, CanBeReplacedByWhatItHolds) {
    const auto makeInner = [] {
        return Dictionary{{"b", "another text that does not lie in the value"}, {"c", 2}, {"inner", 1}};
    };
    Dictionary outer{{"inner", makeInner()}};
    outer.merge(outer.find("inner")->dictionaryValue());
    EXPECT_EQ(outer, makeInner());
    outer.set("inner", makeInner());
    outer = outer.find("inner")->dictionaryValue();
    EXPECT_EQ(outer, makeInner());
    Value value = Array{Value(Array{makeInner()})};
    value = value.arrayValue()[0];
    value = value.arrayValue()[0];
    value = *value.dictionaryValue().find("b");
    EXPECT_EQ(value, makeInner().valueAt(0));
}

TEST(Dictionary, AllocatesOnlyForWhatIsNew) {
    if (test::allocationsOf([] { ::operator delete(::operator new(1)); }).blocks == 0) {
        GTEST_SKIP() << "this build counts no allocations";
    }
    Dictionary previous{{"a", 1}, {"b", 2}, {"c", 3}};
    const Dictionary update{{"a", 4}, {"c", "short"}};
    const auto spent = test::allocationsOf([&] {
        EXPECT_TRUE(previous.find("b") != nullptr && previous.find("missing") == nullptr);
        previous.merge(update);
        const Dictionary copy = previous;
    });
    EXPECT_EQ(spent.blocks, 0U);

    // A key that was added to the same keys before is a look-up; only the values need a block.
    const auto extend = [&] {
        Dictionary copy = previous;
        copy.set("zrreporting_timestamp", 1.5);
        return copy;
    };
    const Dictionary first = extend();
    EXPECT_LE(test::allocationsOf([&] { EXPECT_EQ(&extend().keys(), &first.keys()); }).blocks, 1U);
}

TEST(KeySet, IsSharedBetweenThreads) {
    const Dictionary base{{"a", 1}, {"b", 2}};
    std::vector<std::jthread> threads;
    for (int seed = 0; seed < 4; ++seed) {
        threads.emplace_back([&base, seed] {
            for (int i = 0; i < 2000; ++i) {
                Dictionary mine = base;
                mine.set("k" + std::to_string((i * 7 + seed) % 40), i);
                mine.set("zrreporting_timestamp", i);
                mine.remove("a");
                ASSERT_EQ(mine.size(), 3U);
                ASSERT_EQ(*mine.find("zrreporting_timestamp"), Value(i));
            }
        });
    }
    threads.clear();
    EXPECT_EQ(base, (Dictionary{{"a", 1}, {"b", 2}}));
}

} // namespace
} // namespace tamblo
