#include "base/Json.h"

#include "base/Format.h"
#include "base/KeySetCache.h"
#include "base/Utf8.h"

#include <algorithm>
#include <charconv>
#include <cstdint>
#include <optional>
#include <span>
#include <utility>

namespace tamblo {

namespace {

constexpr int kMaximumDepth = 32;

bool isDigit(char character) noexcept {
    return character >= '0' && character <= '9';
}

std::string nameOf(char character) {
    if (character == '\'') {
        return "an apostrophe";
    }
    if (character > ' ' && character < 0x7F) {
        return formatted("'{}'", std::string_view(&character, 1));
    }
    return formatted("the byte {}", static_cast<unsigned>(static_cast<unsigned char>(character)));
}

/// Line and column of an offset; a column is a character, not a byte.
JsonError errorAt(std::string_view text, std::size_t offset, std::string message) {
    JsonError error{1, 1, std::move(message)};
    for (const char character : text.substr(0, offset)) {
        if (character == '\n') {
            ++error.line;
            error.column = 1;
        } else if (!isUtf8Continuation(character)) {
            ++error.column;
        }
    }
    return error;
}

/// Whether a number that no double can hold is too small for one, not too large: what counts is the power of
/// ten in front of which its first digit that is not 0 stands.
bool isTiny(std::string_view number) noexcept {
    const std::size_t exponentAt = std::min(number.find_first_of("eE"), number.size());
    const std::string_view digits = number.substr(0, exponentAt);
    const std::size_t point = std::min(digits.find('.'), digits.size());
    const std::size_t first = digits.find_first_of("123456789");
    if (first == std::string_view::npos) {
        return true;
    }
    if (exponentAt == number.size()) {
        return first > point;
    }
    number.remove_prefix(exponentAt + 1);
    const bool negative = number.starts_with('-');
    if (!isDigit(number.front())) {
        number.remove_prefix(1);
    }
    std::int64_t exponent = 0;
    const auto result = std::from_chars(number.data(), number.data() + number.size(), exponent);
    if (result.ec != std::errc()) {
        return negative;
    }
    return (negative ? -exponent : exponent) + static_cast<std::int64_t>(point) -
               static_cast<std::int64_t>(first) <
           0;
}

void appendUtf8(std::string& out, std::uint32_t code) {
    const auto unit = [&out](std::uint32_t byte) { out += static_cast<char>(byte); };
    if (code < 0x80) {
        unit(code);
    } else if (code < 0x800) {
        unit(0xC0U | code >> 6U);
        unit(0x80U | (code & 0x3FU));
    } else if (code < 0x10000) {
        unit(0xE0U | code >> 12U);
        unit(0x80U | (code >> 6U & 0x3FU));
        unit(0x80U | (code & 0x3FU));
    } else {
        unit(0xF0U | code >> 18U);
        unit(0x80U | (code >> 12U & 0x3FU));
        unit(0x80U | (code >> 6U & 0x3FU));
        unit(0x80U | (code & 0x3FU));
    }
}

/// One pass over one text; stays at its first error.
class Reader {
public:
    Reader(std::string_view text, JsonReadOptions options) noexcept : text_(text), options_(options) {}

    std::variant<Value, JsonError> readDocument();

private:
    /// Nothing stands for `null`.
    using Item = std::optional<Value>;
    struct Member {
        std::string key;
        std::size_t offset;
        Item item;
    };

    [[nodiscard]] bool atEnd() const noexcept { return at_ == text_.size(); }
    [[nodiscard]] char peek() const noexcept { return atEnd() ? '\0' : text_[at_]; }
    [[nodiscard]] std::string found() const;
    bool failAt(std::size_t offset, std::string message);
    bool fail(std::string message) { return failAt(at_, std::move(message)); }

    void skipSpace() noexcept;
    bool take(char character) noexcept;
    bool readItem(Item& item, int depth);
    bool readLiteral(std::string_view literal, Item value, Item& item);
    bool readNumber(Item& item);
    bool takeDigits();
    bool takeNumber(bool& isInteger);
    bool readString(std::string& out);
    bool readEscape(std::string& out);
    bool readCodeUnit(std::uint32_t& unit);
    bool readUnicodeEscape(std::string& out, std::size_t start);
    bool readArray(Item& item, int depth);
    bool readObject(Item& item, int depth);
    bool readMember(int depth);
    bool buildDictionary(std::span<Member> members, Item& item);
    bool buildDictionarySorted(std::span<Member> members, Item& item);
    bool nextOrClose(char close, bool& closed);

    std::string_view text_;
    JsonReadOptions options_;
    std::size_t at_ = 0;
    /// Of the objects that are being read, those of the inner ones on top.
    std::vector<Member> members_;
    /// Objects of one kind, as the elements of an array mostly are, share their keys.
    KeySetCache keySets_;
    std::vector<std::string_view> keys_;
    std::vector<Value> values_;
    std::optional<JsonError> error_;
};

std::variant<Value, JsonError> Reader::readDocument() {
    Item item;
    if (readItem(item, 0)) {
        skipSpace();
        if (!atEnd()) {
            fail(formatted("{} stands behind the end of the value", found()));
        } else if (!item) {
            failAt(0, "null is not a value here");
        }
    }
    if (error_) {
        return *std::move(error_);
    }
    return *std::move(item);
}

std::string Reader::found() const {
    return atEnd() ? "the end of the text" : nameOf(peek());
}

bool Reader::failAt(std::size_t offset, std::string message) {
    if (!error_) {
        error_ = errorAt(text_, offset, std::move(message));
    }
    return false;
}

void Reader::skipSpace() noexcept {
    while (!atEnd() && (peek() == ' ' || peek() == '\n' || peek() == '\r' || peek() == '\t')) {
        ++at_;
    }
}

bool Reader::take(char character) noexcept {
    if (atEnd() || text_[at_] != character) {
        return false;
    }
    ++at_;
    return true;
}

bool Reader::readItem(Item& item, int depth) {
    skipSpace();
    switch (peek()) {
    case '{':
        return readObject(item, depth + 1);
    case '[':
        return readArray(item, depth + 1);
    case '"': {
        std::string text;
        if (!readString(text)) {
            return false;
        }
        item.emplace(text);
        return true;
    }
    case 't':
        return readLiteral("true", Value(true), item);
    case 'f':
        return readLiteral("false", Value(false), item);
    case 'n':
        if (options_.refuseNull) {
            return fail("null has no place here");
        }
        return readLiteral("null", std::nullopt, item);
    default:
        return readNumber(item);
    }
}

bool Reader::readLiteral(std::string_view literal, Item value, Item& item) {
    if (!text_.substr(at_).starts_with(literal)) {
        return fail(formatted("a value is expected; a word that begins like this can only be {}", literal));
    }
    at_ += literal.size();
    item = std::move(value);
    return true;
}

bool Reader::takeDigits() {
    if (!isDigit(peek())) {
        return fail(formatted("a digit is expected, not {}", found()));
    }
    while (isDigit(peek())) {
        ++at_;
    }
    return true;
}

bool Reader::takeNumber(bool& isInteger) {
    isInteger = true;
    take('-');
    if (take('0')) {
        if (isDigit(peek())) {
            return fail("a number does not begin with 0");
        }
    } else if (!takeDigits()) {
        return false;
    }
    if (take('.')) {
        isInteger = false;
        if (!takeDigits()) {
            return false;
        }
    }
    if (take('e') || take('E')) {
        isInteger = false;
        if (!take('+')) {
            take('-');
        }
        return takeDigits();
    }
    return true;
}

bool Reader::readNumber(Item& item) {
    if (peek() != '-' && !isDigit(peek())) {
        return fail(formatted("a value is expected, not {}", found()));
    }
    const std::size_t start = at_;
    bool isInteger = false;
    if (!takeNumber(isInteger)) {
        return false;
    }
    const std::string_view number = text_.substr(start, at_ - start);
    const char* const begin = number.data();
    const char* const end = begin + number.size();
    if (std::int64_t integer = 0; isInteger && std::from_chars(begin, end, integer).ec == std::errc()) {
        item.emplace(integer);
        return true;
    }
    if (std::uint64_t integer = 0; isInteger && std::from_chars(begin, end, integer).ec == std::errc()) {
        item.emplace(integer);
        return true;
    }
    double real = 0;
    if (std::from_chars(begin, end, real).ec != std::errc()) {
        if (!isTiny(number)) {
            return failAt(start, "the number is too large");
        }
        real = number.front() == '-' ? -0.0 : 0.0;
    }
    item.emplace(real);
    return true;
}

bool Reader::readString(std::string& out) {
    const std::size_t start = at_++;
    while (true) {
        const std::size_t plain = at_;
        while (!atEnd() && text_[at_] != '"' && text_[at_] != '\\' &&
               static_cast<unsigned char>(text_[at_]) >= 0x20) {
            ++at_;
        }
        const std::string_view run = text_.substr(plain, at_ - plain);
        if (!isUtf8(run)) {
            return failAt(start, "the text that begins here is not UTF-8");
        }
        out += run;
        if (take('"')) {
            return true;
        }
        if (atEnd()) {
            return failAt(start, "the text that begins here does not end");
        }
        if (!take('\\')) {
            return fail(formatted("{} must be escaped in a text", found()));
        }
        if (!readEscape(out)) {
            return false;
        }
    }
}

bool Reader::readEscape(std::string& out) {
    const std::size_t start = at_ - 1;
    if (atEnd()) {
        return fail("the text ends in an escape");
    }
    const char escape = text_[at_++];
    switch (escape) {
    case '"':
    case '\\':
    case '/':
        out += escape;
        return true;
    case 'b':
        out += '\b';
        return true;
    case 'f':
        out += '\f';
        return true;
    case 'n':
        out += '\n';
        return true;
    case 'r':
        out += '\r';
        return true;
    case 't':
        out += '\t';
        return true;
    case 'u':
        return readUnicodeEscape(out, start);
    default:
        return failAt(start, formatted("there is no escape of {}", nameOf(escape)));
    }
}

bool Reader::readCodeUnit(std::uint32_t& unit) {
    const std::string_view digits = text_.substr(at_, 4);
    const auto result = std::from_chars(digits.data(), digits.data() + digits.size(), unit, 16);
    if (digits.size() != 4 || result.ec != std::errc() || result.ptr != digits.data() + 4) {
        return fail("four hexadecimal digits are expected");
    }
    at_ += 4;
    return true;
}

bool Reader::readUnicodeEscape(std::string& out, std::size_t start) {
    std::uint32_t code = 0;
    if (!readCodeUnit(code)) {
        return false;
    }
    if (code >= 0xD800 && code < 0xE000) {
        std::uint32_t low = 0;
        const bool paired = code < 0xDC00 && text_.substr(at_).starts_with("\\u");
        at_ += paired ? 2 : 0;
        if (paired && !readCodeUnit(low)) {
            return false;
        }
        if (low < 0xDC00 || low >= 0xE000) {
            return failAt(start, "half of a surrogate pair stands alone");
        }
        code = 0x10000 + ((code - 0xD800) << 10U) + (low - 0xDC00);
    }
    appendUtf8(out, code);
    return true;
}

bool Reader::nextOrClose(char close, bool& closed) {
    skipSpace();
    closed = take(close);
    if (closed || take(',')) {
        return true;
    }
    return fail(formatted("a comma or '{}' is expected, not {}", std::string_view(&close, 1), found()));
}

bool Reader::readArray(Item& item, int depth) {
    if (depth > kMaximumDepth) {
        return fail(formatted("values are nested deeper than {}", kMaximumDepth));
    }
    ++at_;
    Array elements;
    skipSpace();
    for (bool closed = take(']'); !closed;) {
        Item element;
        if (!readItem(element, depth) || !nextOrClose(']', closed)) {
            return false;
        }
        if (element) {
            elements.push_back(*std::move(element));
        }
    }
    item.emplace(std::move(elements));
    return true;
}

bool Reader::readObject(Item& item, int depth) {
    if (depth > kMaximumDepth) {
        return fail(formatted("values are nested deeper than {}", kMaximumDepth));
    }
    ++at_;
    const std::size_t first = members_.size();
    skipSpace();
    for (bool closed = take('}'); !closed;) {
        if (!readMember(depth) || !nextOrClose('}', closed)) {
            return false;
        }
    }
    const bool isBuilt = buildDictionary(std::span(members_).subspan(first), item);
    members_.resize(first);
    return isBuilt;
}

bool Reader::readMember(int depth) {
    skipSpace();
    if (peek() != '"') {
        return fail(formatted("a key in quotes is expected, not {}", found()));
    }
    Member member{{}, at_, {}};
    if (!readString(member.key)) {
        return false;
    }
    skipSpace();
    if (!take(':')) {
        return fail(formatted("a colon is expected behind the key, not {}", found()));
    }
    if (!readItem(member.item, depth)) {
        return false;
    }
    members_.push_back(std::move(member));
    return true;
}

bool Reader::buildDictionary(std::span<Member> members, Item& item) {
    keys_.clear();
    values_.clear();
    for (Member& member : members) {
        if (!member.item) {
            return buildDictionarySorted(members, item);
        }
        keys_.push_back(member.key);
        values_.push_back(*member.item);
    }
    Dictionary dictionary;
    if (!keys_.empty() &&
        keySets_.makeDictionary(keys_, values_, 0, dictionary) != KeySetCache::Fault::none) {
        return buildDictionarySorted(members, item);
    }
    item.emplace(std::move(dictionary));
    return true;
}

/// For objects with members that are null, or with a key that stands twice.
bool Reader::buildDictionarySorted(std::span<Member> members, Item& item) {
    std::sort(members.begin(), members.end(), [](const Member& a, const Member& b) {
        const int order = a.key.compare(b.key);
        return order != 0 ? order < 0 : a.offset < b.offset;
    });
    const auto twice = std::adjacent_find(members.begin(), members.end(),
                                          [](const Member& a, const Member& b) { return a.key == b.key; });
    if (twice != members.end()) {
        return failAt(std::next(twice)->offset,
                      formatted("the key \"{}\" stands here a second time", twice->key));
    }
    std::vector<std::string_view> keys;
    std::vector<Value> values;
    std::vector<std::uint32_t> places;
    for (Member& member : members) {
        if (member.item) {
            places.push_back(static_cast<std::uint32_t>(keys.size()));
            keys.push_back(member.key);
            values.push_back(*std::move(member.item));
        }
    }
    item.emplace(keys.empty() ? Dictionary() : Dictionary::adopt(KeySet::make(keys), values, places));
    return true;
}

} // namespace

std::variant<Value, JsonError> readJson(std::string_view text, JsonReadOptions options) {
    return Reader(text, options).readDocument();
}

} // namespace tamblo
