#pragma once

#include "base/Json.h"
#include "base/JsonTokens.h"
#include "base/Value.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

namespace tamblo {

/// A value in a JSON text that is read element by element, and, for an array or object, the first of the
/// items that it consists of: they follow it, in the order of the text.
struct JsonItem {
    enum class Kind : std::uint8_t { null, scalar, text, array, object };

    std::string_view key;  ///< of an object's member
    std::string_view text; ///< of a text
    Value scalar;          ///< a number or boolean
    std::size_t count = 1; ///< of the items it takes, itself included
    Kind kind = Kind::null;

    /// The elements or members of an array or object: from `first` to `end`, each `next` to the one before.
    [[nodiscard]] const JsonItem* first() const noexcept { return this + 1; }
    [[nodiscard]] const JsonItem* end() const noexcept { return this + count; }
    [[nodiscard]] const JsonItem* next() const noexcept { return this + count; }
    /// An object's member. Null without one, and for a member that is null.
    [[nodiscard]] const JsonItem* find(std::string_view name) const noexcept;
};

/// Reads a JSON array, by the rules of `readJson`, one element at a time and without making values of it: for
/// texts that are turned into something else at once. What is wrong with the text is found when reading gets
/// there, so that elements count only after the last of them was read without an error.
class JsonElements {
public:
    explicit JsonElements(std::string_view text) noexcept : text_(text), tokens_(text) {}

    /// Null behind the last one and after an error. Lives until the next call, the texts in it as long as
    /// this object and the JSON text.
    [[nodiscard]] const JsonItem* next();
    [[nodiscard]] const std::optional<JsonError>& error() const noexcept {
        return error_ ? error_ : tokens_.error();
    }

private:
    bool readItem(std::string_view key, int depth);
    bool readArray(std::size_t array, int depth);
    bool readMembers(std::size_t object, int depth);
    bool failAsValue(const char* otherwise);

    std::string_view text_;
    JsonTokens tokens_;
    bool isBegun_ = false;
    bool isEnded_ = false;
    std::vector<JsonItem> items_; ///< of one element
    std::optional<JsonError> error_;
};

} // namespace tamblo
