#include "base/KeySetCache.h"

#include "base/Utf8.h"

#include <algorithm>
#include <cstring>
#include <utility>

namespace tamblo {

namespace {

// A map beyond these is no ordinary message; remembering its keys would cost memory and help nobody.
constexpr std::size_t kMostRememberedKeys = 64;
constexpr std::size_t kMostRememberedKeyBytes = 4096;

std::uint64_t mix(std::uint64_t hash, std::uint64_t word) noexcept {
    hash = (hash ^ word) * 0x9E3779B97F4A7C15U;
    return hash ^ hash >> 29;
}

/// A hash of keys in their order, good enough to tell the kinds of messages apart: of each key its length and
/// up to sixteen of its bytes. What it answers is verified key by key.
std::uint64_t hashKeys(std::span<const std::string_view> keys) noexcept {
    std::uint64_t hash = keys.size();
    for (const std::string_view key : keys) {
        std::uint64_t first = 0;
        std::uint64_t last = 0;
        if (key.size() >= 8) {
            std::memcpy(&first, key.data(), 8);
            std::memcpy(&last, key.data() + key.size() - 8, 8);
        } else {
            for (const char character : key) {
                first = first << 8 | static_cast<std::uint8_t>(character);
            }
        }
        hash = mix(hash, first + (last << 1 | last >> 63) + key.size());
    }
    return hash;
}

/// Sorts the keys; `places[i]` is then where the i-th key that arrived stands among them.
KeySetCache::Fault sortKeys(std::span<const std::string_view> arrived, KeySetRef& keys,
                            std::vector<std::uint32_t>& places) {
    std::vector<std::uint32_t> order(arrived.size());
    for (std::size_t i = 0; i < order.size(); ++i) {
        order[i] = static_cast<std::uint32_t>(i);
        if (!isUtf8(arrived[i])) {
            return KeySetCache::Fault::notUtf8;
        }
    }
    std::sort(order.begin(), order.end(),
              [arrived](std::uint32_t a, std::uint32_t b) { return arrived[a] < arrived[b]; });
    std::vector<std::string_view> sorted(arrived.size());
    places.resize(arrived.size());
    for (std::size_t i = 0; i < order.size(); ++i) {
        sorted[i] = arrived[order[i]];
        places[order[i]] = static_cast<std::uint32_t>(i);
        if (i != 0 && sorted[i] == sorted[i - 1]) {
            return KeySetCache::Fault::duplicateKey;
        }
    }
    keys = sorted.empty() ? KeySet::empty() : KeySet::make(sorted);
    return KeySetCache::Fault::none;
}

bool isWorthRemembering(std::span<const std::string_view> keys) noexcept {
    std::size_t bytes = 0;
    for (const std::string_view key : keys) {
        bytes += key.size();
    }
    return keys.size() <= kMostRememberedKeys && bytes <= kMostRememberedKeyBytes;
}

} // namespace

/// The keys of a map as they came, and where each stands among the sorted ones.
struct KeySetCache::Shape {
    std::uint64_t hash;
    KeySetRef keys;
    std::vector<std::uint32_t> places;

    [[nodiscard]] bool matches(std::uint64_t otherHash,
                               std::span<const std::string_view> arrived) const noexcept {
        if (hash != otherHash || places.size() != arrived.size()) {
            return false;
        }
        for (std::size_t i = 0; i < arrived.size(); ++i) {
            if (!keys->is(places[i], arrived[i])) {
                return false;
            }
        }
        return true;
    }
};

KeySetCache::KeySetCache() = default;
KeySetCache::~KeySetCache() = default;

KeySetCache::Fault KeySetCache::makeDictionary(std::span<const std::string_view> keys,
                                               std::span<Value> values, std::size_t spare,
                                               Dictionary& dictionary) {
    const std::uint64_t hash = hashKeys(keys);
    std::unique_ptr<Shape>& slot = slots_[hash % kSlots];
    if (slot && slot->matches(hash, keys)) {
        dictionary = Dictionary::adopt(slot->keys, values, slot->places, spare);
        return Fault::none;
    }
    if (!isWorthRemembering(keys)) {
        return makeDictionaryOnce(keys, values, spare, dictionary);
    }
    Shape shape{hash, {}, {}};
    const Fault fault = sortKeys(keys, shape.keys, shape.places);
    if (fault == Fault::none) {
        dictionary = Dictionary::adopt(shape.keys, values, shape.places, spare);
        slot = std::make_unique<Shape>(std::move(shape));
    }
    return fault;
}

KeySetCache::Fault KeySetCache::makeDictionaryOnce(std::span<const std::string_view> keys,
                                                   std::span<Value> values, std::size_t spare,
                                                   Dictionary& dictionary) {
    KeySetRef sorted;
    std::vector<std::uint32_t> places;
    const Fault fault = sortKeys(keys, sorted, places);
    if (fault == Fault::none) {
        dictionary = Dictionary::adopt(std::move(sorted), values, places, spare);
    }
    return fault;
}

} // namespace tamblo
