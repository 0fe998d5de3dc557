#pragma once

#include "base/BoundedCache.h"
#include "base/Dictionary.h"
#include "base/Value.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <list>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// The entries of the maps that are being read, those of the inner maps on top of those of the outer ones.
struct MapEntries {
    std::vector<std::string_view> keys;
    std::vector<Value> values;
    std::list<std::string> assembledKeys; ///< the texts of keys that came in chunks
};

/// Makes dictionaries of keys and values as they arrive, and remembers the key sets, by the order in which
/// their keys came: the maps of one kind of message share one key set and are read without sorting or
/// comparing keys with each other. Bounded: a client that invents keys only pushes others out. Used by one
/// thread at a time.
class KeySetCache {
public:
    enum class Fault : std::uint8_t { none, notUtf8, duplicateKey };

    KeySetCache() = default;
    KeySetCache(const KeySetCache&) = delete;
    KeySetCache& operator=(const KeySetCache&) = delete;

    /// The keys of a map as they came, and where each stands among the sorted ones.
    struct Shape {
        KeySetRef keys;
        std::vector<std::uint32_t> places;
        std::string encoded;             ///< the keys as CBOR texts, one behind the other
        std::vector<std::uint32_t> ends; ///< of each of these

        [[nodiscard]] bool matches(std::span<const std::string_view> arrived) const noexcept;
    };
    using ShapeRef = std::shared_ptr<const Shape>;

    /// What a map of so many entries most likely looks like: as the last one of about as many did. Or null.
    [[nodiscard]] const ShapeRef& expected(std::uint64_t count) const noexcept {
        return expected_[count % expected_.size()];
    }

    /// A dictionary of one value for each key, in any order; the values are moved from. `spare` is room for
    /// keys to come.
    [[nodiscard]] Fault makeDictionary(std::span<const std::string_view> keys, std::span<Value> values,
                                       std::size_t spare, Dictionary& dictionary);
    /// The same without remembering anything.
    [[nodiscard]] static Fault makeDictionaryOnce(std::span<const std::string_view> keys,
                                                  std::span<Value> values, std::size_t spare,
                                                  Dictionary& dictionary);

    /// The value of a text; nothing when that is not UTF-8. A client sends the same few over and over (its
    /// application, a device, a route): the values of those that were read last share one block, which saves
    /// the time to check and copy them and, in a session that retains its messages, most of the memory of
    /// their payloads. The values may go to other threads.
    [[nodiscard]] std::optional<Value> textValue(std::string_view text);

    /// Memory for whoever reads with this cache.
    [[nodiscard]] MapEntries& entries() noexcept { return entries_; }

private:
    BoundedCache<ShapeRef, 128> shapes_;
    std::array<ShapeRef, 32> expected_;
    BoundedCache<Value, 64> texts_;
    MapEntries entries_;
};

} // namespace tamblo
