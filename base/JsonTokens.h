#pragma once

#include "base/Json.h"
#include "base/Value.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// The tokens of one JSON text, taken one after the other: what the readers of JSON have in common, which
/// differ in what they make of them. Stays at the first error; whoever takes tokens then returns.
///
/// Texts that it gives out live as long as this object and the JSON text: most of them lie in it.
class JsonTokens {
public:
    explicit JsonTokens(std::string_view text) noexcept : text_(text) {}

    [[nodiscard]] std::size_t offset() const noexcept { return at_; }
    /// The next character; 0 at the end.
    [[nodiscard]] char peek() const noexcept { return atEnd() ? '\0' : text_[at_]; }
    [[nodiscard]] const std::optional<JsonError>& error() const noexcept { return error_; }

    /// Keeps an error, unless there is one already. These return false, so that a reader can return it.
    bool failAt(std::size_t offset, std::string message);
    bool fail(std::string message) { return failAt(at_, std::move(message)); }

    void skipSpace() noexcept;
    bool take(char character) noexcept;
    /// A word that the next character begins, as `null`.
    bool takeLiteral(std::string_view literal);
    bool takeNumber(Value& number);
    /// A text in quotes, the first of which is the next character.
    bool takeString(std::string_view& text);
    /// A member's name and the colon behind it.
    bool takeKey(std::string_view& key);
    /// The bracket that opens an array or object at a depth, counted from 1.
    bool takeOpening(int depth);
    /// What stands behind an element or member.
    bool takeCommaOrClosing(char closing, bool& isClosed);
    /// Nothing but white space up to the end.
    bool takeEnd();

private:
    [[nodiscard]] bool atEnd() const noexcept { return at_ == text_.size(); }
    [[nodiscard]] std::string found() const;

    bool failExpecting(std::string_view what);
    bool failAtSeparator(char closing);
    bool takeEscaped(std::size_t start, std::string_view& text);
    bool takePlain(std::size_t start, std::string_view& plain);
    bool takeUsualInteger(Value& number);
    bool takeDigits();
    bool takeNumberText(bool& isInteger);
    bool takeEscape(std::string& out);
    bool takeCodeUnit(std::uint32_t& unit);
    bool takeUnicodeEscape(std::string& out, std::size_t start);

    std::string_view text_;
    std::size_t at_ = 0;
    std::deque<std::string> unescaped_; ///< the texts that had escapes
    std::optional<JsonError> error_;
};

inline void JsonTokens::skipSpace() noexcept {
    while (!atEnd() && (peek() == ' ' || peek() == '\n' || peek() == '\r' || peek() == '\t')) {
        ++at_;
    }
}

inline bool JsonTokens::take(char character) noexcept {
    if (atEnd() || text_[at_] != character) {
        return false;
    }
    ++at_;
    return true;
}

inline bool JsonTokens::takeString(std::string_view& text) {
    const std::size_t start = at_++;
    return takePlain(start, text) && (take('"') || takeEscaped(start, text));
}

inline bool JsonTokens::takeKey(std::string_view& key) {
    if (peek() != '"') {
        return failExpecting("a key in quotes is expected");
    }
    if (!takeString(key)) {
        return false;
    }
    skipSpace();
    return take(':') || failExpecting("a colon is expected behind the key");
}

inline bool JsonTokens::takeCommaOrClosing(char closing, bool& isClosed) {
    skipSpace();
    isClosed = take(closing);
    return isClosed || take(',') || failAtSeparator(closing);
}

} // namespace tamblo
