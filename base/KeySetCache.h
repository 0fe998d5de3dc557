#pragma once

#include "base/Dictionary.h"
#include "base/RecentTexts.h"
#include "base/Value.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <list>
#include <memory>
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

    KeySetCache();
    ~KeySetCache();
    KeySetCache(const KeySetCache&) = delete;
    KeySetCache& operator=(const KeySetCache&) = delete;

    /// A dictionary of one value for each key, in any order; the values are moved from. `spare` is room for
    /// keys to come.
    [[nodiscard]] Fault makeDictionary(std::span<const std::string_view> keys, std::span<Value> values,
                                       std::size_t spare, Dictionary& dictionary);
    /// The same without remembering anything.
    [[nodiscard]] static Fault makeDictionaryOnce(std::span<const std::string_view> keys,
                                                  std::span<Value> values, std::size_t spare,
                                                  Dictionary& dictionary);

    /// Memory for whoever reads with this cache.
    [[nodiscard]] MapEntries& entries() noexcept { return entries_; }
    [[nodiscard]] RecentTexts& recentTexts() noexcept { return recentTexts_; }

private:
    struct Shape;
    static constexpr std::size_t kSlots = 512;

    std::array<std::unique_ptr<Shape>, kSlots> slots_;
    MapEntries entries_;
    RecentTexts recentTexts_;
};

} // namespace tamblo
