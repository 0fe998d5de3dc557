#pragma once

#include "base/Hash.h"
#include "base/JsonReader.h"
#include "base/Utf8.h"
#include "base/Value.h"

#include <array>
#include <cstddef>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace tamblo::report {

/// Makes values of texts that sessions repeat, so that equal ones mostly share their memory. Remembers some
/// thousand texts, whatever it is given.
class SharedTexts {
public:
    /// Longer ones are cut, and end with an ellipsis.
    static constexpr std::size_t kLongest = 200;

    [[nodiscard]] const Value& of(std::string_view text) {
        Value& known = known_[hash_(text) % kPlaces];
        if (text.size() > kLongest) {
            known = Value(std::string(cutUtf8(text, kLongest)) + "…");
        } else if (known.stringValue() != text) {
            known = Value(text);
        }
        return known;
    }
    /// A number, boolean or text as it is; arrays and objects are told by what they are.
    [[nodiscard]] Value of(const JsonItem& item) {
        switch (item.kind) {
        case JsonItem::Kind::scalar:
            return item.scalar;
        case JsonItem::Kind::text:
            return of(item.text);
        case JsonItem::Kind::array:
            return {"[…]"};
        case JsonItem::Kind::object:
            return {"{…}"};
        case JsonItem::Kind::null:
            break;
        }
        return {"null"};
    }

private:
    static constexpr std::size_t kPlaces = 4096;

    SeededTextHash hash_;
    std::vector<Value> known_ = std::vector<Value>(kPlaces, Value(""));
};

/// The payload keys that were met, numbered, up to a limit.
class KeyNames {
public:
    static constexpr std::size_t kMost = 2048;
    static constexpr std::size_t kLongest = 100;
    static constexpr std::size_t kNone = static_cast<std::size_t>(-1);

    /// `kNone` for one that is too long, or new when there are enough.
    [[nodiscard]] std::size_t of(std::string_view name) {
        if (const auto known = numbers_.find(name); known != numbers_.end()) {
            return known->second;
        }
        if (names_.size() == kMost || name.size() > kLongest) {
            ++leftOut_;
            return kNone;
        }
        names_.emplace_back(name);
        numbers_.emplace(name, names_.size() - 1);
        return names_.size() - 1;
    }
    [[nodiscard]] const std::vector<std::string>& names() const noexcept { return names_; }
    /// How often one was.
    [[nodiscard]] std::uint64_t leftOut() const noexcept { return leftOut_; }

private:
    std::unordered_map<std::string, std::size_t, SeededTextHash, std::equal_to<>> numbers_;
    std::vector<std::string> names_;
    std::uint64_t leftOut_ = 0;
};

} // namespace tamblo::report
