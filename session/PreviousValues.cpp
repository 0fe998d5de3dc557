#include "session/PreviousValues.h"

#include "base/AllocatedBytes.h"

#include <algorithm>
#include <map>
#include <string_view>
#include <utility>

namespace tamblo {

void PreviousValues::take(const Dictionary& payload, std::size_t bytes, bool isRecorded) {
    bytesOfKeysLeft_ = 0;
    if (payload.empty()) {
        return;
    }
    const KeySet* const keys = &payload.keys();
    const auto known = std::find_if(latest_.rbegin(), latest_.rend(),
                                    [keys](const Latest& latest) { return &latest.payload.keys() == keys; });
    const std::size_t held = bytes + keys->heldBytes();
    if (known != latest_.rend()) {
        bytes_ += held - known->bytes;
        *known = {payload, held, known->isRecorded || isRecorded};
        std::rotate(known.base() - 1, known.base(), latest_.end());
        return;
    }
    if (latest_.size() == kMostKeySets) {
        const Latest oldest = std::move(latest_.front());
        latest_.erase(latest_.begin());
        bytes_ -= oldest.bytes;
        takeApart(oldest);
        bytesOfKeysLeft_ = oldest.isRecorded ? oldest.payload.keys().heldBytes() : 0;
    }
    latest_.push_back({payload, held, isRecorded});
    bytes_ += held;
}

void PreviousValues::takeApart(const Latest& latest) {
    for (std::size_t i = 0; i < latest.payload.size(); ++i) {
        const std::string_view key = latest.payload.keyAt(i);
        const Value& value = latest.payload.valueAt(i);
        const auto found = older_.find(key);
        if (found != older_.end()) {
            bytes_ -= bytesOf(key, found->second);
            bytes_ += bytesOf(key, value);
            found->second = value;
        } else if (older_.size() < mostKeys_) {
            older_.emplace(key, value);
            bytes_ += bytesOf(key, value);
        } else {
            isFull_ = true;
        }
    }
}

void PreviousValues::clear() {
    latest_ = {};
    older_ = {};
    bytes_ = 0;
}

Dictionary PreviousValues::values() const {
    if (older_.empty() && latest_.size() == 1 && latest_.front().payload.size() <= mostKeys_) {
        return latest_.front().payload;
    }
    std::map<std::string_view, Value> values;
    const auto add = [&](std::string_view key, const Value& value) {
        const auto found = values.find(key);
        if (found != values.end()) {
            found->second = value;
        } else if (values.size() < mostKeys_) {
            values.emplace(key, value);
        }
    };
    for (const auto& [key, value] : older_) {
        add(key, value);
    }
    for (const Latest& latest : latest_) {
        for (std::size_t i = 0; i < latest.payload.size(); ++i) {
            add(latest.payload.keyAt(i), latest.payload.valueAt(i));
        }
    }
    return values.empty() ? Dictionary() : Dictionary::fromMap(values);
}

Dictionary PreviousValues::valuesOf(std::span<const std::string_view> keys) const {
    std::size_t most = older_.size();
    for (const Latest& latest : latest_) {
        most += latest.payload.size();
    }
    // Which keys are among the first ones that are remembered, only all of them together tell.
    const Dictionary all = most > mostKeys_ ? values() : Dictionary();
    std::map<std::string_view, Value> found;
    for (const std::string_view key : keys) {
        if (const Value* const value = most > mostKeys_ ? all.find(key) : find(key)) {
            found.emplace(key, *value);
        }
    }
    return found.empty() ? Dictionary() : Dictionary::fromMap(found);
}

const Value* PreviousValues::find(std::string_view key) const {
    for (auto latest = latest_.rbegin(); latest != latest_.rend(); ++latest) {
        if (const Value* const value = latest->payload.find(key)) {
            return value;
        }
    }
    const auto found = older_.find(key);
    return found != older_.end() ? &found->second : nullptr;
}

std::size_t PreviousValues::bytesOf(std::string_view key, const Value& value) noexcept {
    constexpr std::size_t kCapacityOfShortText = 15;
    const std::size_t text = key.size() > kCapacityOfShortText ? allocatedBytes(key.size() + 1) : 0;
    return allocatedBytes(sizeof(void*) + sizeof(Table::value_type)) + sizeof(void*) + text +
           value.heldBytes();
}

} // namespace tamblo
