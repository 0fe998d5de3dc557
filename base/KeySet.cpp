#include "base/KeySet.h"

#include "base/AllocatedBytes.h"
#include "base/Json.h"
#include "base/TextBuffer.h"

#include <algorithm>
#include <cstring>
#include <vector>

namespace tamblo {

/// A key set that was made from another by adding a key, or by removing one. Kept in a list that only grows,
/// so that it is read without a lock; the index is the key's in the larger of the two.
struct KeySet::Transition {
    KeySetRef target;
    std::size_t index;
    bool isRemoval;
    Transition* next;
};

namespace {

// Remembering stops at these limits, so that a client that invents keys cannot make the process grow; what is
// not remembered is made anew each time.
constexpr std::uint32_t kMaximumTransitionsOfOne = 8;
/// Dictionaries that the service itself builds begin with one of some dozens of keys.
constexpr std::uint32_t kMaximumTransitionsOfEmpty = 64;
constexpr std::uint32_t kMaximumTransitionsOfAll = 4096;
constexpr std::uint32_t kMaximumKeysToRemember = 64;

/// Most dictionaries are small: up to this many keys, a walk over the prefixes is predictable and beats a
/// binary search.
constexpr std::uint32_t kMaximumKeysToWalk = 32;

std::atomic<std::uint32_t>& transitionsOfAll() noexcept {
    static std::atomic<std::uint32_t> count{0};
    return count;
}

/// Counts one more, unless the limit is reached.
bool countUpTo(std::uint32_t limit, std::atomic<std::uint32_t>& counter) noexcept {
    if (counter.fetch_add(1, std::memory_order_relaxed) < limit) {
        return true;
    }
    counter.fetch_sub(1, std::memory_order_relaxed);
    return false;
}

std::uint64_t prefixOf(std::string_view key) noexcept {
    if (key.size() >= 8) {
        std::uint64_t bytes;
        std::memcpy(&bytes, key.data(), 8);
        return __builtin_bswap64(bytes);
    }
    std::uint64_t prefix = 0;
    for (std::size_t i = 0; i < 8; ++i) {
        prefix = prefix << 8 | (i < key.size() ? static_cast<std::uint8_t>(key[i]) : 0U);
    }
    return prefix;
}

} // namespace

KeySet::KeySet(std::span<const std::string_view> sortedKeys)
    : count_(static_cast<std::uint32_t>(sortedKeys.size())), entries_(new Entry[sortedKeys.size()]) {
    TextBuffer text;
    for (std::size_t i = 0; i < sortedKeys.size(); ++i) {
        const std::string_view key = sortedKeys[i];
        Entry& entry = entries_[i];
        entry.prefix = prefixOf(key);
        entry.offset = static_cast<std::uint32_t>(text.size());
        entry.length = static_cast<std::uint32_t>(key.size());
        text.append(key);
        anyKeyHasSpace_ = anyKeyHasSpace_ || key.find(' ') != std::string_view::npos;
    }
    textLength_ = static_cast<std::uint32_t>(text.size());
    for (std::size_t i = 0; i < sortedKeys.size(); ++i) {
        entries_[i].jsonOffset = static_cast<std::uint32_t>(text.size());
        appendJsonString(text, sortedKeys[i]);
        text.append(':');
        entries_[i].jsonLength = static_cast<std::uint32_t>(text.size()) - entries_[i].jsonOffset;
    }
    text_.reset(new char[text.size() + 1]);
    if (!text.empty()) {
        std::memcpy(text_.get(), text.data(), text.size());
    }
}

KeySet::~KeySet() {
    Transition* transition = transitions_.load(std::memory_order_acquire);
    while (transition != nullptr) {
        Transition* next = transition->next;
        delete transition;
        transitionsOfAll().fetch_sub(1, std::memory_order_relaxed);
        transition = next;
    }
}

void KeySet::release() const noexcept {
    if (references_.fetch_sub(1, std::memory_order_acq_rel) == 1) {
        delete this;
    }
}

KeySetRef KeySet::make(std::span<const std::string_view> sortedKeys) {
    return KeySetRef(new KeySet(sortedKeys));
}

const KeySetRef& KeySet::empty() {
    static const KeySetRef none = make({});
    return none;
}

std::size_t KeySet::find(std::string_view key) const noexcept {
    const std::uint64_t prefix = prefixOf(key);
    const Entry* entry = entries_.get();
    const Entry* const end = entry + count_;
    if (count_ > kMaximumKeysToWalk) {
        entry = std::partition_point(entry, end, [&](const Entry& other) {
            return other.prefix < prefix ||
                   (other.prefix == prefix &&
                    this->key(static_cast<std::size_t>(&other - entries_.get())) < key);
        });
        const auto index = static_cast<std::size_t>(entry - entries_.get());
        return entry != end && is(index, key) ? index : kNotFound;
    }
    while (entry != end && entry->prefix < prefix) {
        ++entry;
    }
    for (; entry != end && entry->prefix == prefix; ++entry) {
        const auto index = static_cast<std::size_t>(entry - entries_.get());
        if (is(index, key)) {
            return index;
        }
    }
    return kNotFound;
}

std::size_t KeySet::findFrom(std::size_t start, const KeySet& other, std::size_t otherIndex) const noexcept {
    const std::uint64_t prefix = other.entries_[otherIndex].prefix;
    while (start < count_ && (entries_[start].prefix < prefix ||
                              (entries_[start].prefix == prefix && key(start) < other.key(otherIndex)))) {
        ++start;
    }
    return start;
}

bool KeySet::sameKey(std::size_t index, const KeySet& other, std::size_t otherIndex) const noexcept {
    return entries_[index].prefix == other.entries_[otherIndex].prefix && key(index) == other.key(otherIndex);
}

bool KeySet::operator==(const KeySet& other) const noexcept {
    if (this == &other) {
        return true;
    }
    if (count_ != other.count_ || textLength_ != other.textLength_ ||
        std::memcmp(text_.get(), other.text_.get(), textLength_) != 0) {
        return false;
    }
    return std::equal(entries_.get(), entries_.get() + count_, other.entries_.get(),
                      [](const Entry& mine, const Entry& theirs) { return mine.length == theirs.length; });
}

std::size_t KeySet::heldBytes() const noexcept {
    const std::size_t text =
        count_ != 0 ? entries_[count_ - 1].jsonOffset + entries_[count_ - 1].jsonLength : 0;
    return allocatedBytes(sizeof(KeySet)) + allocatedBytes(count_ * sizeof(Entry)) + allocatedBytes(text + 1);
}

KeySet::Extension KeySet::adding(std::string_view key) const {
    for (const Transition* transition = transitions_.load(std::memory_order_acquire); transition != nullptr;
         transition = transition->next) {
        if (!transition->isRemoval && transition->target->key(transition->index) == key) {
            return {transition->target, transition->index};
        }
    }
    std::vector<std::string_view> keys;
    keys.reserve(count_ + 1);
    for (std::size_t i = 0; i < count_; ++i) {
        keys.push_back(this->key(i));
    }
    const auto place = std::lower_bound(keys.begin(), keys.end(), key);
    const auto index = static_cast<std::size_t>(place - keys.begin());
    keys.insert(place, key);
    Extension extension{make(keys), index};
    remember(extension.keys, index, false);
    return extension;
}

void KeySet::remember(const KeySetRef& target, std::size_t index, bool isRemoval) const {
    // What is asked for once only, as of the keys of a client that invents them, is not worth a place.
    const bool wasAsked = wasAsked_.exchange(true, std::memory_order_relaxed);
    if (!wasAsked || count_ >= kMaximumKeysToRemember ||
        !countUpTo(count_ == 0 ? kMaximumTransitionsOfEmpty : kMaximumTransitionsOfOne, transitionCount_)) {
        return;
    }
    if (!countUpTo(kMaximumTransitionsOfAll, transitionsOfAll())) {
        transitionCount_.fetch_sub(1, std::memory_order_relaxed);
        return;
    }
    auto* transition = new Transition{target, index, isRemoval, transitions_.load(std::memory_order_relaxed)};
    while (!transitions_.compare_exchange_weak(transition->next, transition, std::memory_order_release,
                                               std::memory_order_relaxed)) {
    }
}

KeySetRef KeySet::removing(std::size_t index) const {
    for (const Transition* transition = transitions_.load(std::memory_order_acquire); transition != nullptr;
         transition = transition->next) {
        if (transition->isRemoval && transition->index == index) {
            return transition->target;
        }
    }
    std::vector<std::string_view> keys;
    keys.reserve(count_);
    for (std::size_t i = 0; i < count_; ++i) {
        if (i != index) {
            keys.push_back(key(i));
        }
    }
    KeySetRef target = make(keys);
    remember(target, index, true);
    return target;
}

} // namespace tamblo
