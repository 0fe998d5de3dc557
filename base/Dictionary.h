#pragma once

#include "base/KeySet.h"
#include "base/Value.h"

#include <atomic>
#include <cstdint>
#include <initializer_list>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

/// String keys to values, sorted by key, with value semantics: the payload of every message.
///
/// One pointer wide. Copies share a block until one of them is changed (copy on write), so handing a payload
/// on is one atomic increment; the keys lie in a `KeySet` that dictionaries of the same keys share. Two
/// threads may use two copies at the same time; one object is, like any value, used by one thread at a time.
class Dictionary {
public:
    using Entry = std::pair<std::string_view, Value>;

    Dictionary() noexcept = default;
    Dictionary(std::initializer_list<Entry> entries);
    Dictionary(const Dictionary& other) noexcept : block_(other.block_) { retain(block_); }
    Dictionary(Dictionary&& other) noexcept : block_(other.block_) { other.block_ = nullptr; }
    Dictionary& operator=(const Dictionary& other) noexcept;
    Dictionary& operator=(Dictionary&& other) noexcept {
        std::swap(block_, other.block_);
        return *this;
    }
    ~Dictionary() { release(block_); }

    [[nodiscard]] std::size_t size() const noexcept { return block_ == nullptr ? 0 : block_->count(); }
    [[nodiscard]] bool empty() const noexcept { return size() == 0; }

    /// Entries in key order. A reference to a key or value holds until the dictionary is changed or
    /// destroyed.
    [[nodiscard]] std::string_view keyAt(std::size_t index) const noexcept { return keys().key(index); }
    [[nodiscard]] const Value& valueAt(std::size_t index) const noexcept { return values()[index]; }
    [[nodiscard]] const KeySet& keys() const noexcept {
        return block_ == nullptr ? *KeySet::empty() : *block_->keys;
    }
    [[nodiscard]] std::span<const Value> values() const noexcept {
        return block_ == nullptr ? std::span<const Value>() : std::span(block_->values(), block_->count());
    }

    /// The value of the key, or null. Allocates nothing.
    [[nodiscard]] const Value* find(std::string_view key) const noexcept;
    [[nodiscard]] bool contains(std::string_view key) const noexcept { return find(key) != nullptr; }

    void set(std::string_view key, Value value);
    /// Replaces the value at an index; the keys stay.
    void setValueAt(std::size_t index, Value value);
    bool remove(std::string_view key);
    /// A key that is added, by its index among the keys as they are then.
    struct Addition {
        std::size_t index;
        const Value& value;
    };
    /// Adds some entries, in ascending order, whose keys `keys` has and this one lacks.
    void addKeys(const KeySetRef& keys, std::span<const Addition> added);
    /// Adds every entry of the other dictionary; its values win.
    void merge(const Dictionary& other);

    /// Builds a dictionary from one value for each key; `places[i]` is the index of the key that `values[i]`
    /// belongs to, each index once. `spare` is room for keys to come. The values are moved from.
    static Dictionary fromKeySet(KeySetRef keys, std::span<Value> values,
                                 std::span<const std::uint32_t> places, std::size_t spare = 0);
    /// The same with values that are yet to be filled in, in the order of the keys; false until then.
    struct Unfilled;
    static Unfilled fromKeySet(KeySetRef keys, std::size_t spare);
    /// The same of keys in ascending order, each once, whose values stand in that order.
    static Dictionary fromSorted(std::span<const std::string_view> keys, std::span<Value> values,
                                 std::size_t spare = 0);
    /// The entries of a map from texts to values, made at once: key by key, the time would grow with the
    /// square of their number.
    template <typename Map> static Dictionary fromMap(const Map& entries, std::size_t spare = 0) {
        std::vector<std::string_view> keys;
        std::vector<Value> values;
        for (const auto& [key, value] : entries) {
            keys.push_back(key);
            values.push_back(value);
        }
        return fromSorted(keys, values, spare);
    }

    [[nodiscard]] bool operator==(const Dictionary& other) const noexcept;
    /// Equal but for the entries of the ignored keys, wherever they stand.
    [[nodiscard]] bool equalsIgnoring(const Dictionary& other,
                                      std::span<const std::string_view> ignoredKeys) const noexcept;

    /// Whether both are the same block, and so equal for as long as neither is changed.
    [[nodiscard]] bool sharesStorageWith(const Dictionary& other) const noexcept {
        return block_ == other.block_;
    }

    /// How what several values share is counted.
    enum class Shared : std::uint8_t { inFull, inProportion };
    /// Bytes of memory that the block and what its values refer to take, the keys of this dictionary aside.
    /// In proportion, short texts and the keys of inner dictionaries count half where others refer to them as
    /// well, and anything else in full. They never count less: once the others have gone, this dictionary
    /// alone keeps that memory, and its owner must not have been charged next to nothing for it.
    [[nodiscard]] std::size_t bytesOfValues(Shared shared) const noexcept;

private:
    friend class Value;
    /// The values, in the order of the keys, follow the block. Room beyond the keys' count is uninitialised.
    struct Block {
        Block(std::size_t room, KeySetRef keySet) noexcept
            : capacity(static_cast<std::uint32_t>(room)), keys(std::move(keySet)) {}
        static Block* make(std::size_t capacity, KeySetRef keys);
        /// Frees the block alone; its values are gone already.
        static void free(Block* block) noexcept;
        [[nodiscard]] std::size_t count() const noexcept { return keys->size(); }
        [[nodiscard]] Value* values() noexcept { return reinterpret_cast<Value*>(this + 1); }

        std::atomic<std::uint32_t> references{1};
        std::uint32_t capacity;
        KeySetRef keys;
    };

    void detach(std::size_t capacity);
    /// Adds the entries whose keys are missing here; the others stay as they are.
    void addAll(const Dictionary& other);
    static void retain(Block* block) noexcept {
        if (block != nullptr) {
            block->references.fetch_add(1, std::memory_order_relaxed);
        }
    }
    static void release(Block* block) noexcept {
        if (block != nullptr && block->references.fetch_sub(1, std::memory_order_acq_rel) == 1) {
            destroy(block);
        }
    }
    static void destroy(Block* block) noexcept;

    Block* block_ = nullptr;
};

/// Values may be filled in until the dictionary is copied.
struct Dictionary::Unfilled {
    Dictionary dictionary;
    std::span<Value> values;
};

/// Bytes of memory that a dictionary takes, its keys and all that it refers to included, whether or not
/// others refer to it as well.
[[nodiscard]] std::size_t heldBytes(const Dictionary& dictionary) noexcept;

} // namespace tamblo
