#include "workers/sinks/LinkmeterSummary.h"

#include "base/BoundedCache.h"
#include "base/Json.h"
#include "base/KeySet.h"
#include "base/TextBuffer.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

namespace {

/// Beyond these, values are left out: of a key's text, and of all of them.
constexpr std::size_t kMostBytesOfKey = 1U << 20U;
constexpr std::size_t kMostBytes = 4U << 20U;
/// Stands where the first value is left out.
constexpr std::string_view kLeftOutMark = "(...)";
constexpr std::string_view kServiceTypeKey = "ZR_Session_Summary_Event";

struct Joined {
    TextBuffer text;
    Value last;                ///< of the values
    std::size_t lastBegin = 0; ///< of its text, which the next one may have, too
    bool hasValues = false;
    bool isFull = false;
};

class Joiner {
public:
    void add(const Dictionary& payload) {
        const std::vector<Joined*>& joined = joinedOf(payload.keys());
        for (std::size_t i = 0; i < joined.size(); ++i) {
            append(*joined[i], payload.valueAt(i));
        }
    }
    void add(std::string_view key, const Value& value) { append(joined_[std::string(key)], value); }

    [[nodiscard]] LinkmeterSummary result() {
        std::vector<std::string_view> keys;
        std::vector<Value> values;
        for (auto& [key, joined] : joined_) {
            keys.push_back(key);
            values.emplace_back(joined.text.view());
            joined.text.reset();
        }
        return {Dictionary::fromSorted(keys, values), leftOut_};
    }

private:
    struct Known {
        KeySetRef keys; ///< held, so that no other can come to stand at its address
        std::vector<Joined*> joined;
    };

    /// Most payloads share one of a few key sets: where their values go is found once for those of late.
    const std::vector<Joined*>& joinedOf(const KeySet& keys) {
        const auto build = [&] {
            Known known{KeySetRef(&keys), {}};
            for (std::size_t i = 0; i < keys.size(); ++i) {
                known.joined.push_back(&joined_[std::string(keys.key(i))]);
            }
            return known;
        };
        return byKeys_.get(reinterpret_cast<std::uintptr_t>(&keys), build).joined;
    }

    void append(Joined& joined, const Value& value) {
        if (joined.isFull) {
            ++leftOut_;
            return;
        }
        const std::size_t before = joined.text.size();
        const bool isFirst = !std::exchange(joined.hasValues, true);
        if (!isFirst) {
            joined.text.append(',');
        }
        if (before >= kMostBytesOfKey || bytes_ >= kMostBytes) {
            joined.text.append(kLeftOutMark);
            joined.isFull = true;
            ++leftOut_;
            return;
        }
        const std::size_t begin = joined.text.size();
        if (!isFirst && joined.last.isSame(value)) {
            joined.text.appendAgain(joined.lastBegin, before);
        } else {
            if (value.isString()) {
                joined.text.append(value.stringValue());
            } else {
                appendJson(joined.text, value);
            }
            joined.last = value;
        }
        joined.lastBegin = begin;
        bytes_ += joined.text.size() - before;
    }

    std::map<std::string, Joined> joined_;
    BoundedCache<Known, 16> byKeys_;
    std::size_t bytes_ = 0;
    std::uint64_t leftOut_ = 0;
};

} // namespace

LinkmeterSummary LinkmeterSummary::of(std::vector<Dictionary> payloads, AudioServiceType serviceType) {
    Joiner joiner;
    joiner.add(kServiceTypeKey, Value(std::uint64_t{serviceType}));
    for (Dictionary& payload : payloads) {
        joiner.add(payload);
        payload = Dictionary();
    }
    return joiner.result();
}

} // namespace tamblo
