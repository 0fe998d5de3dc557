#include "base/Dictionary.h"

#include "base/AllocatedBytes.h"

#include <algorithm>
#include <cstring>
#include <memory>
#include <new>
#include <vector>

namespace tamblo {

Dictionary::Block* Dictionary::Block::make(std::size_t capacity, KeySetRef keys) {
    void* memory = ::operator new(sizeof(Block) + capacity * sizeof(Value));
    return new (memory) Block(capacity, std::move(keys));
}

void Dictionary::Block::free(Block* block) noexcept {
    block->~Block();
    ::operator delete(block);
}

namespace {

/// Up to this many keys are added one after the other, which is a look-up where it was done before; more of
/// them at once, so that the time it takes does not grow with the square of their number.
constexpr std::size_t kMaximumKeysAddedSingly = 8;

/// A value is sixteen bytes that may be moved as bytes, the place left behind being uninitialised.
void relocate(Value* to, const Value* from, std::size_t count) noexcept {
    std::memmove(static_cast<void*>(to), static_cast<const void*>(from), count * sizeof(Value));
}

} // namespace

Dictionary::Dictionary(std::initializer_list<Entry> entries) {
    if (entries.size() != 0) {
        detach(entries.size());
    }
    for (const Entry& entry : entries) {
        set(entry.first, entry.second);
    }
}

Dictionary& Dictionary::operator=(const Dictionary& other) noexcept {
    // The other may lie in a value of this one and go with it.
    Block* const incoming = other.block_;
    retain(incoming);
    release(block_);
    block_ = incoming;
    return *this;
}

void Dictionary::destroy(Block* block) noexcept {
    std::destroy_n(block->values(), block->count());
    Block::free(block);
}

const Value* Dictionary::find(std::string_view key) const noexcept {
    if (block_ == nullptr) {
        return nullptr;
    }
    const std::size_t index = block_->keys->find(key);
    return index == KeySet::kNotFound ? nullptr : block_->values() + index;
}

void Dictionary::detach(std::size_t capacity) {
    if (block_ == nullptr) {
        block_ = Block::make(std::max<std::size_t>(capacity, 4), KeySet::empty());
        return;
    }
    const bool isShared = block_->references.load(std::memory_order_acquire) != 1;
    if (!isShared && block_->capacity >= capacity) {
        return;
    }
    const std::size_t room = capacity > block_->capacity ? capacity + capacity / 4 : capacity;
    Block* mine = Block::make(std::max(room, block_->count()), block_->keys);
    if (isShared) {
        std::uninitialized_copy_n(block_->values(), block_->count(), mine->values());
        release(block_);
    } else {
        relocate(mine->values(), block_->values(), block_->count());
        Block::free(block_);
    }
    block_ = mine;
}

void Dictionary::setValueAt(std::size_t index, Value value) {
    detach(block_->count());
    block_->values()[index] = std::move(value);
}

void Dictionary::set(std::string_view key, Value value) {
    const std::size_t found = block_ == nullptr ? KeySet::kNotFound : block_->keys->find(key);
    if (found != KeySet::kNotFound) {
        setValueAt(found, std::move(value));
        return;
    }
    const std::size_t count = size();
    detach(count + 1);
    KeySet::Extension extension = block_->keys->adding(key);
    Value* values = block_->values();
    relocate(values + extension.index + 1, values + extension.index, count - extension.index);
    new (values + extension.index) Value(std::move(value));
    block_->keys = std::move(extension.keys);
}

void Dictionary::addKeys(const KeySetRef& keys, std::span<const Addition> added) {
    detach(keys->size());
    Value* const values = block_->values();
    std::size_t from = block_->count();
    std::size_t to = keys->size();
    for (std::size_t i = added.size(); i != 0; --i) {
        const Addition& addition = added[i - 1];
        const std::size_t behind = to - addition.index - 1;
        from -= behind;
        relocate(values + addition.index + 1, values + from, behind);
        new (values + addition.index) Value(addition.value);
        to = addition.index;
    }
    block_->keys = keys;
}

bool Dictionary::remove(std::string_view key) {
    const std::size_t index = block_ == nullptr ? KeySet::kNotFound : block_->keys->find(key);
    if (index == KeySet::kNotFound) {
        return false;
    }
    detach(block_->count());
    const std::size_t count = block_->count();
    Value* values = block_->values();
    values[index].~Value();
    relocate(values + index, values + index + 1, count - index - 1);
    block_->keys = block_->keys->removing(index);
    return true;
}

void Dictionary::merge(const Dictionary& other) {
    if (other.empty() || block_ == other.block_) {
        return;
    }
    if (empty()) {
        *this = other;
        return;
    }
    // Held, as the other may lie in a value of this one that is replaced.
    const Dictionary source(other);
    const KeySet& theirs = source.keys();
    const std::span<const Value> incoming = source.values();
    detach(block_->count());
    if (block_->keys.get() == &theirs) {
        std::copy_n(incoming.data(), theirs.size(), block_->values());
        return;
    }
    // Both are sorted: each key is looked for from where the one before was found.
    std::size_t missing = 0;
    std::size_t mine = 0;
    for (std::size_t i = 0; i < theirs.size(); ++i) {
        mine = block_->keys->findFrom(mine, theirs, i);
        if (mine < block_->count() && block_->keys->sameKey(mine, theirs, i)) {
            block_->values()[mine] = incoming[i];
        } else {
            ++missing;
        }
    }
    if (missing > kMaximumKeysAddedSingly) {
        addAll(source);
        return;
    }
    mine = 0;
    for (std::size_t i = 0; missing != 0 && i < theirs.size(); ++i) {
        mine = block_->keys->findFrom(mine, theirs, i);
        if (mine == block_->count() || !block_->keys->sameKey(mine, theirs, i)) {
            set(theirs.key(i), incoming[i]);
            --missing;
        }
    }
}

void Dictionary::addAll(const Dictionary& other) {
    const KeySet& theirs = other.keys();
    const std::size_t count = block_->count();
    std::vector<std::string_view> merged;
    std::vector<Value> mergedValues;
    const auto add = [&](std::string_view key, const Value& value) {
        merged.push_back(key);
        mergedValues.push_back(value);
    };
    std::size_t mine = 0;
    for (std::size_t i = 0; i < theirs.size(); ++i) {
        const std::size_t place = block_->keys->findFrom(mine, theirs, i);
        for (; mine < place; ++mine) {
            add(keyAt(mine), valueAt(mine));
        }
        if (mine == count || !block_->keys->sameKey(mine, theirs, i)) {
            add(theirs.key(i), other.valueAt(i));
        }
    }
    for (; mine < count; ++mine) {
        add(keyAt(mine), valueAt(mine));
    }
    *this = fromSorted(merged, mergedValues);
}

Dictionary Dictionary::fromKeySet(KeySetRef keys, std::span<Value> values,
                                  std::span<const std::uint32_t> places, std::size_t spare) {
    Dictionary dictionary;
    dictionary.block_ = Block::make(values.size() + spare, std::move(keys));
    Value* to = dictionary.block_->values();
    for (std::size_t i = 0; i < values.size(); ++i) {
        new (to + places[i]) Value(std::move(values[i]));
    }
    return dictionary;
}

Dictionary::Unfilled Dictionary::fromKeySet(KeySetRef keys, std::size_t spare) {
    const std::size_t count = keys->size();
    Unfilled unfilled;
    Block* const block = Block::make(count + spare, std::move(keys));
    unfilled.dictionary.block_ = block;
    unfilled.values = {block->values(), count};
    std::uninitialized_default_construct_n(block->values(), count);
    return unfilled;
}

Dictionary Dictionary::fromSorted(std::span<const std::string_view> keys, std::span<Value> values,
                                  std::size_t spare) {
    Dictionary dictionary;
    dictionary.block_ = Block::make(values.size() + spare, KeySet::make(keys));
    std::uninitialized_move(values.begin(), values.end(), dictionary.block_->values());
    return dictionary;
}

std::size_t Dictionary::bytesOfValues(Shared shared) const noexcept {
    if (block_ == nullptr) {
        return 0;
    }
    std::size_t bytes = allocatedBytes(sizeof(Block) + block_->capacity * sizeof(Value));
    for (const Value& value : values()) {
        if (value.ownsBlock()) {
            bytes += value.bytesOfBlock(shared == Shared::inProportion);
        }
    }
    return bytes;
}

std::size_t heldBytes(const Dictionary& dictionary) noexcept {
    return dictionary.bytesOfValues(Dictionary::Shared::inFull) + dictionary.keys().heldBytes();
}

bool Dictionary::operator==(const Dictionary& other) const noexcept {
    if (block_ == other.block_) {
        return true;
    }
    const std::span<const Value> mine = values();
    const std::span<const Value> theirs = other.values();
    return keys() == other.keys() && std::equal(mine.begin(), mine.end(), theirs.begin(), theirs.end());
}

bool Dictionary::equalsIgnoring(const Dictionary& other,
                                std::span<const std::string_view> ignoredKeys) const noexcept {
    if (block_ == other.block_) {
        return true;
    }
    const auto isIgnored = [ignoredKeys](std::string_view key) {
        return std::find(ignoredKeys.begin(), ignoredKeys.end(), key) != ignoredKeys.end();
    };
    const KeySet& mine = keys();
    const KeySet& theirs = other.keys();
    if (&mine == &theirs) {
        for (std::size_t i = 0; i < mine.size(); ++i) {
            if (!(valueAt(i) == other.valueAt(i)) && !isIgnored(mine.key(i))) {
                return false;
            }
        }
        return true;
    }
    std::size_t i = 0;
    std::size_t j = 0;
    for (;;) {
        while (i < mine.size() && isIgnored(mine.key(i))) {
            ++i;
        }
        while (j < theirs.size() && isIgnored(theirs.key(j))) {
            ++j;
        }
        if (i == mine.size() || j == theirs.size()) {
            return i == mine.size() && j == theirs.size();
        }
        if (mine.key(i) != theirs.key(j) || !(valueAt(i) == other.valueAt(j))) {
            return false;
        }
        ++i;
        ++j;
    }
}

} // namespace tamblo
