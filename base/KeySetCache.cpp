#include "base/KeySetCache.h"

#include "base/Hash.h"
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

/// A hash of texts in their order, good enough to tell the kinds of messages apart: of each text its length
/// and up to sixteen of its bytes. What is found by it is verified text by text.
std::uint64_t hashKeys(std::span<const std::string_view> keys) noexcept {
    static const std::uint64_t seed = SeededHash().seed;
    std::uint64_t hash = seed + keys.size();
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

/// A text's head in CBOR (RFC 8949), in its shortest form; what is remembered has no longer ones.
void appendEncoded(std::string& encoded, std::string_view key) {
    constexpr unsigned kText = 0x60;
    const auto add = [&encoded](std::size_t byte) { encoded += static_cast<char>(byte); };
    if (key.size() < KeySetCache::kLongText) {
        add(kText + key.size());
    } else if (key.size() < 0x100) {
        add(kText + KeySetCache::kLongText);
        add(key.size());
    } else {
        add(kText + KeySetCache::kLongText + 1);
        add(key.size() >> 8U);
        add(key.size() & 0xFFU);
    }
    encoded += key;
}

bool isWorthRemembering(std::span<const std::string_view> keys) noexcept {
    std::size_t bytes = 0;
    for (const std::string_view key : keys) {
        bytes += key.size();
    }
    return keys.size() <= kMostRememberedKeys && bytes <= kMostRememberedKeyBytes;
}

} // namespace

bool KeySetCache::Shape::matches(std::span<const std::string_view> arrived) const noexcept {
    if (places.size() != arrived.size()) {
        return false;
    }
    for (std::size_t i = 0; i < arrived.size(); ++i) {
        if (!keys->is(places[i], arrived[i])) {
            return false;
        }
    }
    return true;
}

KeySetCache::Fault KeySetCache::makeDictionary(std::span<const std::string_view> keys,
                                               std::span<Value> values, std::size_t spare, bool isPart,
                                               Dictionary& dictionary) {
    const std::uint64_t hash = hashKeys(keys);
    const ShapeRef* known = shapes_.find(
        hash, [keys](const ShapeRef& shape) { return shape != nullptr && shape->matches(keys); });
    if (known == nullptr) {
        if (!isWorthRemembering(keys)) {
            return makeDictionaryOnce(keys, values, spare, dictionary);
        }
        Shape shape;
        const Fault fault = sortKeys(keys, shape.keys, shape.places);
        if (fault != Fault::none) {
            return fault;
        }
        for (const std::string_view key : keys) {
            appendEncoded(shape.encoded, key);
            shape.ends.push_back(static_cast<std::uint32_t>(shape.encoded.size()));
        }
        shape.encoded.append(kReadableBehind, '\0');
        known = &shapes_.put(hash, std::make_shared<const Shape>(std::move(shape)));
    }
    if (Expected& next = expected(keys.size()); !isPart && next.shape != *known) {
        // In this order: without memory for the second, nothing is expected.
        next.shape = nullptr;
        next.texts.assign(keys.size(), Value());
        next.shape = *known;
    }
    dictionary = Dictionary::fromKeySet((*known)->keys, values, (*known)->places, spare);
    return Fault::none;
}

KeySetCache::Fault KeySetCache::makeDictionaryOnce(std::span<const std::string_view> keys,
                                                   std::span<Value> values, std::size_t spare,
                                                   Dictionary& dictionary) {
    KeySetRef sorted;
    std::vector<std::uint32_t> places;
    const Fault fault = sortKeys(keys, sorted, places);
    if (fault == Fault::none) {
        dictionary = Dictionary::fromKeySet(std::move(sorted), values, places, spare);
    }
    return fault;
}

std::optional<Value> KeySetCache::textValue(std::string_view text) {
    const bool isRemembered = KeySetCache::isRemembered(text.size());
    const std::uint64_t hash = isRemembered ? hashKeys({&text, 1}) : 0;
    if (isRemembered) {
        if (const Value* known =
                texts_.find(hash, [text](const Value& value) { return value.stringValue() == text; })) {
            return *known;
        }
    }
    if (!isUtf8(text)) {
        return std::nullopt;
    }
    return isRemembered ? texts_.put(hash, Value(text)) : Value(text);
}

} // namespace tamblo
