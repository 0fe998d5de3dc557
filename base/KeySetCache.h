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
    /// From here on those of one map, which go with it, whether it could be read or not.
    class Own {
    public:
        explicit Own(MapEntries& entries) noexcept
            : first(entries.keys.size()), entries_(entries), assembled_(entries.assembledKeys.size()) {}
        ~Own() {
            entries_.keys.resize(first);
            entries_.values.resize(first);
            entries_.assembledKeys.resize(assembled_);
        }
        Own(const Own&) = delete;
        Own& operator=(const Own&) = delete;

        const std::size_t first;

    private:
        MapEntries& entries_;
        const std::size_t assembled_;
    };

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
        std::string encoded;             ///< the keys as CBOR texts, one behind the other, and some room
        std::vector<std::uint32_t> ends; ///< of each of these

        [[nodiscard]] bool matches(std::span<const std::string_view> arrived) const noexcept;
    };
    using ShapeRef = std::shared_ptr<const Shape>;

    /// The last map of about as many entries that was no part of another, which the next one most likely
    /// looks like.
    struct Expected {
        ShapeRef shape;           ///< or null
        std::vector<Value> texts; ///< under each key, in the order of their arrival, the last one, if any
    };
    [[nodiscard]] Expected& expected(std::uint64_t count) noexcept {
        return expected_[count % expected_.size()];
    }
    /// CBOR texts of so many bytes, and longer ones, have their length behind their first byte.
    static constexpr std::size_t kLongText = 24;
    /// Bytes behind `Shape::encoded` that may be read.
    static constexpr std::size_t kReadableBehind = 8;

    /// A dictionary of one value for each key, in any order; the values are moved from. `spare` is room for
    /// keys to come. Nothing is expected of those that are part of another.
    [[nodiscard]] Fault makeDictionary(std::span<const std::string_view> keys, std::span<Value> values,
                                       std::size_t spare, bool isPart, Dictionary& dictionary);
    /// The same without remembering anything.
    [[nodiscard]] static Fault makeDictionaryOnce(std::span<const std::string_view> keys,
                                                  std::span<Value> values, std::size_t spare,
                                                  Dictionary& dictionary);

    /// The value of a text; nothing when that is not UTF-8. A client sends the same few over and over (its
    /// application, a device, a route): the values of those that were read last share one block, which saves
    /// the time to check and copy them and, in a session that retains its messages, most of the memory of
    /// their payloads. The values may go to other threads.
    [[nodiscard]] std::optional<Value> textValue(std::string_view text);
    /// Whether texts of that length are remembered. Shorter ones lie in their value; longer ones would make
    /// the memory held here large, and seldom repeat.
    [[nodiscard]] static constexpr bool isRemembered(std::size_t length) noexcept {
        return length >= 15 && length <= 96;
    }

    /// Memory for whoever reads with this cache.
    [[nodiscard]] MapEntries& entries() noexcept { return entries_; }

private:
    BoundedCache<ShapeRef, 128> shapes_;
    std::array<Expected, 32> expected_;
    BoundedCache<Value, 64> texts_;
    MapEntries entries_;
};

} // namespace tamblo
