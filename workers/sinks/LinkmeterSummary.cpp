#include "workers/sinks/LinkmeterSummary.h"

#include "base/Json.h"
#include "base/KeySet.h"
#include "base/TextBuffer.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

namespace tamblo {

namespace {

constexpr std::string_view kServiceTypeKey = "ZR_Session_Summary_Event";

struct Joined {
    TextBuffer text;
    bool hasValues = false;
};

class Joiner {
public:
    /// The payload must outlive the joiner.
    void add(const Dictionary& payload) {
        const std::vector<Joined*>& joined = joinedOf(payload.keys());
        for (std::size_t i = 0; i < joined.size(); ++i) {
            append(*joined[i], payload.valueAt(i));
        }
    }
    void add(std::string_view key, const Value& value) { append(joined_[std::string(key)], value); }

    [[nodiscard]] Dictionary result() const {
        std::vector<std::string_view> keys;
        std::vector<Value> values;
        for (const auto& [key, joined] : joined_) {
            keys.push_back(key);
            values.emplace_back(joined.text.view());
        }
        return Dictionary::fromSorted(keys, values);
    }

private:
    /// Most payloads share one of a few key sets: where their values go is found once for each.
    const std::vector<Joined*>& joinedOf(const KeySet& keys) {
        const auto [found, isNew] = byKeys_.try_emplace(&keys);
        if (isNew) {
            for (std::size_t i = 0; i < keys.size(); ++i) {
                found->second.push_back(&joined_[std::string(keys.key(i))]);
            }
        }
        return found->second;
    }

    static void append(Joined& joined, const Value& value) {
        if (std::exchange(joined.hasValues, true)) {
            joined.text.append(',');
        }
        if (value.isString()) {
            joined.text.append(value.stringValue());
        } else {
            appendJson(joined.text, value);
        }
    }

    std::map<std::string, Joined> joined_;
    std::unordered_map<const KeySet*, std::vector<Joined*>> byKeys_;
};

} // namespace

Dictionary linkmeterSummary(std::span<const MessageRef> messages, AudioServiceType serviceType) {
    Joiner joiner;
    joiner.add(kServiceTypeKey, Value(std::uint64_t{serviceType}));
    for (const MessageRef& message : messages) {
        if (message->isSessionStarted && !message->isRedundant) {
            joiner.add(message->payload());
        }
    }
    return joiner.result();
}

} // namespace tamblo
