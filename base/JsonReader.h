#pragma once

#include "base/Json.h"
#include "base/Value.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// A value in a JSON text, and, for an array or object, the first of the items that it consists of: they
/// follow it, in the order of the text.
struct JsonItem {
    enum class Kind : std::uint8_t { null, scalar, text, array, object };

    std::string_view key;        ///< of an object's member
    std::string_view text;       ///< of a text
    Value scalar;                ///< a number or boolean
    std::uint32_t keyOffset = 0; ///< where the key begins in the JSON text
    std::uint32_t count = 1;     ///< of the items it takes, itself included
    Kind kind = Kind::null;

    /// The elements or members of an array or object: from `first` to `end`, each `next` to the one before.
    [[nodiscard]] const JsonItem* first() const noexcept { return this + 1; }
    [[nodiscard]] const JsonItem* end() const noexcept { return this + count; }
    [[nodiscard]] const JsonItem* next() const noexcept { return this + count; }
    /// An object's member. Null without one, and for a member that is null.
    [[nodiscard]] const JsonItem* find(std::string_view name) const noexcept;
};

/// Reads one JSON text by the rules of `readJson` without making values of it: either all of it, or, when it
/// is an array that is turned into something else at once, element by element, so that only one of them is
/// held. What is wrong with the text is found when reading gets there: elements count only after the last of
/// them was read without an error. Stays at the first error.
///
/// An item lives until the next one is read, the texts in it as long as this object and the JSON text.
class JsonReader {
public:
    explicit JsonReader(std::string_view text, JsonReadOptions options = {}) noexcept
        : text_(text), options_(options) {}

    /// The whole text as one item; null after an error.
    [[nodiscard]] const JsonItem* readWhole();
    /// The next element of a text that is an array; null behind the last one and after an error.
    [[nodiscard]] const JsonItem* readElement();
    [[nodiscard]] const std::optional<JsonError>& error() const noexcept { return error_; }

private:
    // What takes something off the text answers false after an error, so that its caller can return that.
    bool readItem(std::string_view key, std::uint32_t keyOffset, int depth);
    bool readArray(std::size_t array, int depth);
    bool readObject(std::size_t object, int depth);
    bool requireDistinctKeys(const JsonItem& object);

    [[nodiscard]] bool atEnd() const noexcept { return at_ == text_.size(); }
    [[nodiscard]] char peek() const noexcept { return atEnd() ? '\0' : text_[at_]; }
    [[nodiscard]] std::string found() const;
    void skipSpace() noexcept;
    bool take(char character) noexcept;
    bool takeLiteral(std::string_view literal);
    bool takeNumber(Value& number);
    bool takeSignedInteger(Value& number);
    bool takeNumberText(bool& isInteger);
    bool takeDigits();
    bool takeString(std::string_view& text);
    bool takePlain(std::size_t start, std::string_view& plain);
    bool takeEscaped(std::size_t start, std::string_view& text);
    bool takeEscape(std::string& out);
    bool takeUnicodeEscape(std::string& out, std::size_t start);
    bool takeCodeUnit(std::uint32_t& unit);
    bool takeKey(std::string_view& key);
    bool takeOpening(int depth);
    bool takeCommaOrClosing(char closing, bool& isClosed);
    bool takeEnd();

    bool failAt(std::size_t offset, std::string message);
    bool fail(std::string message) { return failAt(at_, std::move(message)); }
    bool failExpecting(std::string_view what);

    std::string_view text_;
    JsonReadOptions options_;
    std::size_t at_ = 0;
    bool isBegun_ = false;
    bool isEnded_ = false;
    std::vector<JsonItem> items_;          ///< of what was read last
    std::vector<const JsonItem*> members_; ///< of the object whose keys are compared
    std::deque<std::string> unescaped_;    ///< the texts that had escapes
    std::optional<JsonError> error_;
};

} // namespace tamblo
