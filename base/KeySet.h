#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <span>
#include <string_view>

namespace tamblo {

class KeySet;

/// Shared ownership of a key set; one pointer wide.
class KeySetRef {
public:
    KeySetRef() noexcept = default;
    explicit KeySetRef(const KeySet* keys) noexcept;
    KeySetRef(const KeySetRef& other) noexcept;
    KeySetRef(KeySetRef&& other) noexcept : keys_(other.keys_) { other.keys_ = nullptr; }
    KeySetRef& operator=(KeySetRef other) noexcept;
    ~KeySetRef();

    [[nodiscard]] const KeySet* get() const noexcept { return keys_; }
    const KeySet* operator->() const noexcept { return keys_; }
    const KeySet& operator*() const noexcept { return *keys_; }
    explicit operator bool() const noexcept { return keys_ != nullptr; }

private:
    const KeySet* keys_ = nullptr;
};

/// The sorted keys of a dictionary, apart from its values.
///
/// Messages of one kind all have the same keys, so their dictionaries share one key set: comparing two of
/// them compares a pointer and the values, a message takes no memory for its keys, and what follows from the
/// keys alone (the JSON text of each, whether one holds a space) is worked out once. A key set is immutable
/// and lives as long as a dictionary, or a key set that was derived from, refers to it. Safe on any thread.
class KeySet {
public:
    static constexpr std::size_t kNotFound = static_cast<std::size_t>(-1);

    /// `sortedKeys` ascending by bytes, each once.
    static KeySetRef make(std::span<const std::string_view> sortedKeys);
    static const KeySetRef& empty();

    [[nodiscard]] std::size_t size() const noexcept { return count_; }
    [[nodiscard]] std::string_view key(std::size_t index) const noexcept;
    /// The key as it stands in JSON, quotes and colon included: `"key":`. So many bytes from its beginning on
    /// may be read, however long it is.
    static constexpr std::size_t kReadableOfJsonKey = 32;
    [[nodiscard]] std::string_view jsonKey(std::size_t index) const noexcept;
    [[nodiscard]] std::size_t find(std::string_view key) const noexcept;
    /// Whether the key at an index is this one.
    [[nodiscard]] bool is(std::size_t index, std::string_view key) const noexcept;
    /// The first index from `start` on whose key is not below the other set's key; the count when there is
    /// none.
    [[nodiscard]] std::size_t findFrom(std::size_t start, const KeySet& other,
                                       std::size_t otherIndex) const noexcept;
    [[nodiscard]] bool sameKey(std::size_t index, const KeySet& other, std::size_t otherIndex) const noexcept;
    /// Whether a key holds U+0020.
    [[nodiscard]] bool anyKeyHasSpace() const noexcept { return anyKeyHasSpace_; }
    [[nodiscard]] bool operator==(const KeySet& other) const noexcept;

    /// Bytes of memory.
    [[nodiscard]] std::size_t heldBytes() const noexcept { return heldBytes_; }
    /// Whether more refer to it than the dictionary that asks and one other, such as what remembers key sets.
    [[nodiscard]] bool isShared() const noexcept { return references_.load(std::memory_order_relaxed) > 2; }

    struct Extension {
        KeySetRef keys;
        std::size_t index; ///< of the added key
    };
    /// The key set with one more key, which it must not hold. The few keys that are added again and again are
    /// remembered, from the second time on, so that this is a look-up.
    [[nodiscard]] Extension adding(std::string_view key) const;
    /// The key set without the key at an index; remembered likewise.
    [[nodiscard]] KeySetRef removing(std::size_t index) const;

private:
    friend class KeySetRef;

    /// Eight leading bytes of the key, most significant first: most comparisons end here.
    struct Entry {
        std::uint64_t prefix;
        std::uint32_t offset;
        std::uint32_t length;
        std::uint32_t jsonOffset;
        std::uint32_t jsonLength;
    };
    struct Transition;

    explicit KeySet(std::span<const std::string_view> sortedKeys);
    /// Room for so many keys, and for the bytes of their texts and of those as JSON.
    KeySet(std::size_t count, std::size_t textLength, std::size_t jsonLength);
    [[nodiscard]] static std::uint32_t bytesOf(std::size_t count, std::size_t text) noexcept;
    ~KeySet();
    KeySet(const KeySet&) = delete;
    KeySet& operator=(const KeySet&) = delete;

    /// The first index whose key is not below this one.
    [[nodiscard]] std::size_t lowerBound(std::string_view key) const noexcept;
    /// Where the texts of the key at an index begin, or of the last key end.
    [[nodiscard]] std::size_t textOffset(std::size_t index) const noexcept;
    [[nodiscard]] std::size_t jsonOffset(std::size_t index) const noexcept;
    /// Copies keys of another one, from `begin` to `end`, to an index and to where their texts are to begin.
    void copyKeys(const KeySet& from, std::size_t begin, std::size_t end, std::size_t index,
                  std::size_t textOffset, std::size_t jsonOffset) noexcept;
    [[nodiscard]] KeySetRef makeAdding(std::string_view key, std::size_t index) const;
    [[nodiscard]] KeySetRef makeRemoving(std::size_t index) const;
    void remember(const KeySetRef& target, std::size_t index, bool isRemoval) const;
    void retain() const noexcept { references_.fetch_add(1, std::memory_order_relaxed); }
    void release() const noexcept;

    mutable std::atomic<std::uint32_t> references_{0};
    std::uint32_t count_ = 0;
    bool anyKeyHasSpace_ = false;
    mutable std::atomic<bool> wasAsked_{false}; ///< for a key set with a key more or less
    std::unique_ptr<Entry[]> entries_;
    std::unique_ptr<char[]> text_;
    std::uint32_t textLength_ = 0;
    std::uint32_t heldBytes_ = 0;
    mutable std::atomic<std::uint32_t> transitionCount_{0};
    mutable std::atomic<Transition*> transitions_{nullptr};
};

inline KeySetRef::KeySetRef(const KeySet* keys) noexcept : keys_(keys) {
    if (keys_ != nullptr) {
        keys_->retain();
    }
}
inline KeySetRef::KeySetRef(const KeySetRef& other) noexcept : KeySetRef(other.keys_) {}
inline KeySetRef& KeySetRef::operator=(KeySetRef other) noexcept {
    const KeySet* mine = keys_;
    keys_ = other.keys_;
    other.keys_ = mine;
    return *this;
}
inline KeySetRef::~KeySetRef() {
    if (keys_ != nullptr) {
        keys_->release();
    }
}
inline std::string_view KeySet::key(std::size_t index) const noexcept {
    return {text_.get() + entries_[index].offset, entries_[index].length};
}
inline bool KeySet::is(std::size_t index, std::string_view key) const noexcept {
    const Entry& entry = entries_[index];
    if (entry.length != key.size()) {
        return false;
    }
    const char* const mine = text_.get() + entry.offset;
    if (key.size() < 8 || key.size() > 24) {
        return key.empty() || std::memcmp(mine, key.data(), key.size()) == 0;
    }
    // Most keys are of this length: three words, which may overlap, cover them without a call.
    const auto differ = [mine, &key](std::size_t at) {
        std::uint64_t word = 0;
        std::uint64_t other = 0;
        std::memcpy(&word, mine + at, sizeof word);
        std::memcpy(&other, key.data() + at, sizeof other);
        return word ^ other;
    };
    const std::size_t last = key.size() - 8;
    return (differ(0) | differ(last / 2) | differ(last)) == 0;
}
inline std::string_view KeySet::jsonKey(std::size_t index) const noexcept {
    return {text_.get() + entries_[index].jsonOffset, entries_[index].jsonLength};
}

} // namespace tamblo
