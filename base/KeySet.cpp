#include "base/KeySet.h"

#include "base/AllocatedBytes.h"
#include "base/Json.h"
#include "base/TextBuffer.h"

#include <algorithm>
#include <cstring>

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
/// Bytes of a key set that is remembered: some hundred keys, as the statistics of a device's drivers have.
constexpr std::size_t kMaximumBytesOfOne = 32U << 10U;
/// And of all of them. One of an ordinary message has about a thousand.
constexpr std::size_t kMaximumBytesOfAll = 8U << 20U;

/// Most dictionaries are small: up to this many keys, a walk over the prefixes is predictable and beats a
/// binary search.
constexpr std::uint32_t kMaximumKeysToWalk = 32;

std::atomic<std::size_t>& bytesOfAll() noexcept {
    static std::atomic<std::size_t> bytes{0};
    return bytes;
}

/// Counts more, unless that would be beyond the limit.
template <typename Number> bool countUpTo(Number limit, std::atomic<Number>& counter, Number more) noexcept {
    if (counter.fetch_add(more, std::memory_order_relaxed) + more <= limit) {
        return true;
    }
    counter.fetch_sub(more, std::memory_order_relaxed);
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
    text_.reset(new char[text.size() + kReadableOfJsonKey]);
    if (!text.empty()) {
        std::memcpy(text_.get(), text.data(), text.size());
    }
    std::memset(text_.get() + text.size(), 0, kReadableOfJsonKey);
    heldBytes_ = bytesOf(count_, text.size());
}

KeySet::KeySet(std::size_t count, std::size_t textLength, std::size_t jsonLength)
    : count_(static_cast<std::uint32_t>(count)),
      entries_(new Entry[count]),
      text_(new char[textLength + jsonLength + kReadableOfJsonKey]),
      textLength_(static_cast<std::uint32_t>(textLength)),
      heldBytes_(bytesOf(count, textLength + jsonLength)) {
    std::memset(text_.get() + textLength + jsonLength, 0, kReadableOfJsonKey);
}

std::uint32_t KeySet::bytesOf(std::size_t count, std::size_t text) noexcept {
    return static_cast<std::uint32_t>(allocatedBytes(sizeof(KeySet)) + allocatedBytes(count * sizeof(Entry)) +
                                      allocatedBytes(text + kReadableOfJsonKey));
}

KeySet::~KeySet() {
    Transition* transition = transitions_.load(std::memory_order_acquire);
    while (transition != nullptr) {
        Transition* next = transition->next;
        bytesOfAll().fetch_sub(transition->target->heldBytes(), std::memory_order_relaxed);
        delete transition;
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
    // Never destroyed: a program may end, by `exit`, while another of its threads builds a dictionary.
    static const KeySetRef& none = *new KeySetRef(make({}));
    return none;
}

std::size_t KeySet::find(std::string_view key) const noexcept {
    if (count_ > kMaximumKeysToWalk) {
        const std::size_t index = lowerBound(key);
        return index != count_ && is(index, key) ? index : kNotFound;
    }
    const std::uint64_t prefix = prefixOf(key);
    const Entry* entry = entries_.get();
    const Entry* const end = entry + count_;
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

std::size_t KeySet::lowerBound(std::string_view key) const noexcept {
    const std::uint64_t prefix = prefixOf(key);
    const Entry* const begin = entries_.get();
    const Entry* const found = std::partition_point(begin, begin + count_, [&](const Entry& other) {
        return other.prefix < prefix ||
               (other.prefix == prefix && this->key(static_cast<std::size_t>(&other - begin)) < key);
    });
    return static_cast<std::size_t>(found - begin);
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

std::size_t KeySet::textOffset(std::size_t index) const noexcept {
    return index != count_ ? entries_[index].offset : textLength_;
}

std::size_t KeySet::jsonOffset(std::size_t index) const noexcept {
    if (index != count_) {
        return entries_[index].jsonOffset;
    }
    return count_ != 0 ? entries_[count_ - 1].jsonOffset + entries_[count_ - 1].jsonLength : 0;
}

void KeySet::copyKeys(const KeySet& from, std::size_t begin, std::size_t end, std::size_t index,
                      std::size_t textOffset, std::size_t jsonOffset) noexcept {
    const std::size_t text = from.textOffset(begin);
    const std::size_t json = from.jsonOffset(begin);
    for (std::size_t i = begin; i < end; ++i) {
        Entry& entry = entries_[index + i - begin];
        entry = from.entries_[i];
        entry.offset = static_cast<std::uint32_t>(entry.offset - text + textOffset);
        entry.jsonOffset = static_cast<std::uint32_t>(entry.jsonOffset - json + jsonOffset);
    }
    std::memcpy(text_.get() + textOffset, from.text_.get() + text, from.textOffset(end) - text);
    std::memcpy(text_.get() + jsonOffset, from.text_.get() + json, from.jsonOffset(end) - json);
}

KeySetRef KeySet::makeAdding(std::string_view key, std::size_t index) const {
    TextBuffer json;
    appendJsonString(json, key);
    json.append(':');
    const std::size_t textLength = textLength_ + key.size();
    const std::size_t jsonLength = jsonOffset(count_) - textLength_ + json.size();
    auto* const larger = new KeySet(count_ + std::size_t{1}, textLength, jsonLength);
    KeySetRef made(larger);
    const std::size_t text = textOffset(index);
    const std::size_t jsonText = jsonOffset(index) + key.size();
    larger->copyKeys(*this, 0, index, 0, 0, textLength);
    larger->entries_[index] = {prefixOf(key), static_cast<std::uint32_t>(text),
                               static_cast<std::uint32_t>(key.size()), static_cast<std::uint32_t>(jsonText),
                               static_cast<std::uint32_t>(json.size())};
    std::copy(key.begin(), key.end(), larger->text_.get() + text);
    std::memcpy(larger->text_.get() + jsonText, json.data(), json.size());
    larger->copyKeys(*this, index, count_, index + 1, text + key.size(), jsonText + json.size());
    larger->anyKeyHasSpace_ = anyKeyHasSpace_ || key.find(' ') != std::string_view::npos;
    return made;
}

KeySetRef KeySet::makeRemoving(std::size_t index) const {
    const std::size_t textLength = textLength_ - entries_[index].length;
    const std::size_t jsonLength = jsonOffset(count_) - textLength_ - entries_[index].jsonLength;
    auto* const smaller = new KeySet(count_ - std::size_t{1}, textLength, jsonLength);
    KeySetRef made(smaller);
    smaller->copyKeys(*this, 0, index, 0, 0, textLength);
    smaller->copyKeys(*this, index + 1, count_, index, textOffset(index),
                      jsonOffset(index) - entries_[index].length);
    for (std::size_t i = 0; anyKeyHasSpace_ && !smaller->anyKeyHasSpace_ && i < smaller->count_; ++i) {
        smaller->anyKeyHasSpace_ = smaller->key(i).find(' ') != std::string_view::npos;
    }
    return made;
}

KeySet::Extension KeySet::adding(std::string_view key) const {
    for (const Transition* transition = transitions_.load(std::memory_order_acquire); transition != nullptr;
         transition = transition->next) {
        if (!transition->isRemoval && transition->target->key(transition->index) == key) {
            return {transition->target, transition->index};
        }
    }
    const std::size_t index = lowerBound(key);
    Extension extension{makeAdding(key, index), index};
    remember(extension.keys, index, false);
    return extension;
}

void KeySet::remember(const KeySetRef& target, std::size_t index, bool isRemoval) const {
    // What is asked for once only, as of the keys of a client that invents them, is not worth a place.
    const bool wasAsked = wasAsked_.exchange(true, std::memory_order_relaxed);
    const std::size_t bytes = target->heldBytes();
    if (!wasAsked || bytes > kMaximumBytesOfOne ||
        !countUpTo(count_ == 0 ? kMaximumTransitionsOfEmpty : kMaximumTransitionsOfOne, transitionCount_,
                   std::uint32_t{1})) {
        return;
    }
    if (!countUpTo(kMaximumBytesOfAll, bytesOfAll(), bytes)) {
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
    KeySetRef target = makeRemoving(index);
    remember(target, index, true);
    return target;
}

} // namespace tamblo
