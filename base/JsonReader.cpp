#include "base/JsonReader.h"

#include "base/Format.h"
#include "base/KeySetCache.h"
#include "base/NumberText.h"
#include "base/Utf8.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <utility>

namespace tamblo {

namespace {

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

void appendUtf8(std::string& out, std::uint32_t code) {
    const unsigned following = code < 0x80 ? 0 : code < 0x800 ? 1 : code < 0x10000 ? 2 : 3;
    const std::uint32_t lead = following == 0 ? 0U : 0xFFU << (7U - following);
    out += static_cast<char>(lead | code >> 6U * following);
    for (unsigned left = following; left-- > 0;) {
        out += static_cast<char>(0x80U | (code >> 6U * left & 0x3FU));
    }
}

/// Of each byte whether it stands for itself in a text, and is ASCII.
constexpr auto kIsPlainAscii = [] {
    std::array<bool, 256> isPlain{};
    for (std::size_t byte = 0x20; byte < 0x80; ++byte) {
        isPlain[byte] = byte != '"' && byte != '\\';
    }
    return isPlain;
}();

bool isPlainAscii(char character) noexcept {
    return kIsPlainAscii[static_cast<unsigned char>(character)];
}

} // namespace

const JsonItem* JsonItem::find(std::string_view name) const noexcept {
    for (const JsonItem* member = first(); member != end(); member = member->next()) {
        if (member->key == name) {
            return member->kind != Kind::null ? member : nullptr;
        }
    }
    return nullptr;
}

const JsonItem* JsonReader::readWhole() {
    items_.clear();
    return readItem({}, 0, 0) && takeEnd() ? items_.data() : nullptr;
}

const JsonItem* JsonReader::readElement() {
    bool isClosed = false;
    if (!isBegun_) {
        isBegun_ = true;
        skipSpace();
        if (peek() != '[') {
            if (readWhole() != nullptr) {
                failAt(0, "not an array");
            }
            return nullptr;
        }
        (void)takeOpening(1);
        skipSpace();
        isClosed = take(']');
    } else if (isEnded_ || error_ || !takeCommaOrClosing(']', isClosed)) {
        return nullptr;
    }
    if (isClosed) {
        isEnded_ = true;
        (void)takeEnd();
        return nullptr;
    }
    items_.clear();
    return readItem({}, 0, 1) ? items_.data() : nullptr;
}

bool JsonReader::readItem(std::string_view key, std::uint32_t keyOffset, int depth) {
    const std::size_t index = items_.size();
    JsonItem& item = items_.emplace_back();
    item.key = key;
    item.keyOffset = keyOffset;
    item.kind = JsonItem::Kind::scalar;
    skipSpace();
    switch (peek()) {
    case '{':
        item.kind = JsonItem::Kind::object;
        return readObject(index, depth + 1);
    case '[':
        item.kind = JsonItem::Kind::array;
        return readArray(index, depth + 1);
    case '"':
        item.kind = JsonItem::Kind::text;
        return takeString(item.text);
    case 't':
        item.scalar = true;
        return takeLiteral("true");
    case 'f':
        return takeLiteral("false");
    case 'n':
        item.kind = JsonItem::Kind::null;
        return options_.refuseNull ? fail("null has no place here") : takeLiteral("null");
    default:
        return takeNumber(item.scalar);
    }
}

bool JsonReader::readArray(std::size_t array, int depth) {
    if (!takeOpening(depth)) {
        return false;
    }
    skipSpace();
    for (bool isClosed = take(']'); !isClosed;) {
        if (!readItem({}, 0, depth) || !takeCommaOrClosing(']', isClosed)) {
            return false;
        }
    }
    items_[array].count = static_cast<std::uint32_t>(items_.size() - array);
    return true;
}

bool JsonReader::readObject(std::size_t object, int depth) {
    if (!takeOpening(depth)) {
        return false;
    }
    skipSpace();
    for (bool isClosed = take('}'); !isClosed;) {
        std::string_view key;
        skipSpace();
        const auto offset = static_cast<std::uint32_t>(at_);
        if (!takeKey(key) || !readItem(key, offset, depth) || !takeCommaOrClosing('}', isClosed)) {
            return false;
        }
    }
    items_[object].count = static_cast<std::uint32_t>(items_.size() - object);
    return requireDistinctKeys(items_[object]);
}

/// Its keys one beside another, equal ones in the order of the text.
bool JsonReader::requireDistinctKeys(const JsonItem& object) {
    members_.clear();
    for (const JsonItem* member = object.first(); member != object.end(); member = member->next()) {
        members_.push_back(member);
    }
    std::sort(members_.begin(), members_.end(), [](const JsonItem* a, const JsonItem* b) {
        const int order = a->key.compare(b->key);
        return order != 0 ? order < 0 : a < b;
    });
    const auto twice =
        std::adjacent_find(members_.begin(), members_.end(),
                           [](const JsonItem* a, const JsonItem* b) { return a->key == b->key; });
    if (twice == members_.end()) {
        return true;
    }
    const JsonItem& second = **std::next(twice);
    return failAt(second.keyOffset, formatted("the key \"{}\" stands here a second time", second.key));
}

void JsonReader::skipSpace() noexcept {
    while (!atEnd() &&
           (text_[at_] == ' ' || text_[at_] == '\n' || text_[at_] == '\r' || text_[at_] == '\t')) {
        ++at_;
    }
}

bool JsonReader::take(char character) noexcept {
    if (atEnd() || text_[at_] != character) {
        return false;
    }
    ++at_;
    return true;
}

std::string JsonReader::found() const {
    return atEnd() ? "the end of the text" : nameOf(peek());
}

bool JsonReader::failAt(std::size_t offset, std::string message) {
    if (!error_) {
        error_ = errorAt(text_, offset, std::move(message));
    }
    return false;
}

bool JsonReader::failExpecting(std::string_view what) {
    return fail(formatted("{}, not {}", what, found()));
}

bool JsonReader::takeLiteral(std::string_view literal) {
    if (!text_.substr(at_).starts_with(literal)) {
        return fail(formatted("a value is expected; a word that begins like this can only be {}", literal));
    }
    at_ += literal.size();
    return true;
}

bool JsonReader::takeDigits() {
    if (!isDigit(peek())) {
        return failExpecting("a digit is expected");
    }
    while (isDigit(peek())) {
        ++at_;
    }
    return true;
}

bool JsonReader::takeNumberText(bool& isInteger) {
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

/// A signed integer, where all of the number is one; takes nothing otherwise.
bool JsonReader::takeSignedInteger(Value& number) {
    const char* const begin = text_.data() + at_;
    const char* const end = text_.data() + text_.size();
    std::int64_t integer = 0;
    const auto [behind, failure] = std::from_chars(begin, end, integer);
    if (failure != std::errc()) {
        return false;
    }
    const char* const digits = *begin == '-' ? begin + 1 : begin;
    const bool hasMore = behind != end && (*behind == '.' || *behind == 'e' || *behind == 'E');
    if (hasMore || (*digits == '0' && behind != digits + 1)) {
        return false;
    }
    at_ += static_cast<std::size_t>(behind - begin);
    number = Value(integer);
    return true;
}

bool JsonReader::takeNumber(Value& number) {
    if (peek() != '-' && !isDigit(peek())) {
        return failExpecting("a value is expected");
    }
    if (takeSignedInteger(number)) {
        return true;
    }
    const std::size_t start = at_;
    bool isInteger = false;
    if (!takeNumberText(isInteger)) {
        return false;
    }
    const std::string_view text = text_.substr(start, at_ - start);
    const char* const begin = text.data();
    const char* const end = begin + text.size();
    if (std::uint64_t integer = 0; isInteger && std::from_chars(begin, end, integer).ec == std::errc()) {
        number = Value(integer);
        return true;
    }
    const bool isNegative = text.front() == '-';
    const double magnitude = nearestDouble(text.substr(isNegative ? 1 : 0));
    if (std::isinf(magnitude)) {
        return failAt(start, "the number is too large");
    }
    number = Value(isNegative ? -magnitude : magnitude);
    return true;
}

/// A text in quotes, the first of which is the next character.
bool JsonReader::takeString(std::string_view& text) {
    const std::size_t start = at_++;
    return takePlain(start, text) && (take('"') || takeEscaped(start, text));
}

/// The rest of a text, of which the next character is not plain, behind what was taken of it already.
bool JsonReader::takeEscaped(std::size_t start, std::string_view& text) {
    std::string& whole = unescaped_.emplace_back(text);
    while (!take('"')) {
        if (atEnd()) {
            return failAt(start, "the text that begins here does not end");
        }
        if (!take('\\')) {
            return fail(formatted("{} must be escaped in a text", found()));
        }
        std::string_view plain;
        if (!takeEscape(whole) || !takePlain(start, plain)) {
            return false;
        }
        whole += plain;
    }
    text = whole;
    return true;
}

/// The run of a text that begins at `start` up to what is not plain.
bool JsonReader::takePlain(std::size_t start, std::string_view& plain) {
    const char* const first = text_.data() + at_;
    const char* const end = text_.data() + text_.size();
    const char* last = std::find_if_not(first, end, isPlainAscii);
    const bool isAscii = last == end || static_cast<unsigned char>(*last) < 0x80;
    if (!isAscii) {
        last = std::find_if_not(last, end, [](char character) {
            return isPlainAscii(character) || static_cast<unsigned char>(character) >= 0x80;
        });
    }
    plain = {first, static_cast<std::size_t>(last - first)};
    at_ += plain.size();
    return isAscii || isUtf8(plain) || failAt(start, "the text that begins here is not UTF-8");
}

bool JsonReader::takeEscape(std::string& out) {
    const std::size_t start = at_ - 1;
    if (atEnd()) {
        return fail("the text ends in an escape");
    }
    constexpr std::string_view escapes = "\"\\/bfnrt";
    constexpr std::string_view characters = "\"\\/\b\f\n\r\t";
    const char escape = text_[at_++];
    if (escape == 'u') {
        return takeUnicodeEscape(out, start);
    }
    const std::size_t known = escapes.find(escape);
    if (known == std::string_view::npos) {
        return failAt(start, formatted("there is no escape of {}", nameOf(escape)));
    }
    out += characters[known];
    return true;
}

bool JsonReader::takeCodeUnit(std::uint32_t& unit) {
    const std::string_view digits = text_.substr(at_, 4);
    const auto result = std::from_chars(digits.data(), digits.data() + digits.size(), unit, 16);
    if (digits.size() != 4 || result.ec != std::errc() || result.ptr != digits.data() + 4) {
        return fail("four hexadecimal digits are expected");
    }
    at_ += 4;
    return true;
}

bool JsonReader::takeUnicodeEscape(std::string& out, std::size_t start) {
    std::uint32_t code = 0;
    if (!takeCodeUnit(code)) {
        return false;
    }
    if (code >= 0xD800 && code < 0xE000) {
        std::uint32_t low = 0;
        const bool paired = code < 0xDC00 && text_.substr(at_).starts_with("\\u");
        at_ += paired ? 2 : 0;
        if (paired && !takeCodeUnit(low)) {
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

/// A member's name and the colon behind it.
bool JsonReader::takeKey(std::string_view& key) {
    if (peek() != '"') {
        return failExpecting("a key in quotes is expected");
    }
    if (!takeString(key)) {
        return false;
    }
    skipSpace();
    return take(':') || failExpecting("a colon is expected behind the key");
}

/// The bracket that opens an array or object at a depth, counted from 1.
bool JsonReader::takeOpening(int depth) {
    if (depth > options_.mostLevels) {
        return fail(formatted("values are nested deeper than {}", options_.mostLevels));
    }
    ++at_;
    return true;
}

/// What stands behind an element or member.
bool JsonReader::takeCommaOrClosing(char closing, bool& isClosed) {
    skipSpace();
    isClosed = take(closing);
    return isClosed || take(',') ||
           failExpecting(formatted("a comma or '{}' is expected", std::string_view(&closing, 1)));
}

/// Nothing but white space up to the end.
bool JsonReader::takeEnd() {
    skipSpace();
    return atEnd() || fail(formatted("{} stands behind the end of the value", found()));
}

namespace {

Value valueOf(const JsonItem& item) {
    Array values;
    std::vector<std::string_view> keys;
    for (const JsonItem* inner = item.first(); inner != item.end(); inner = inner->next()) {
        if (inner->kind != JsonItem::Kind::null) {
            values.push_back(valueOf(*inner));
            keys.push_back(inner->key);
        }
    }
    switch (item.kind) {
    case JsonItem::Kind::text:
        return item.text;
    case JsonItem::Kind::array:
        return values;
    case JsonItem::Kind::object: {
        Dictionary dictionary;
        (void)KeySetCache::makeDictionaryOnce(keys, values, 0, dictionary); // the keys are known to differ
        return dictionary;
    }
    default:
        return item.scalar;
    }
}

} // namespace

std::variant<Value, JsonError> readJson(std::string_view text, JsonReadOptions options) {
    JsonReader reader(text, options);
    const JsonItem* const whole = reader.readWhole();
    if (whole == nullptr) {
        return *reader.error();
    }
    if (whole->kind == JsonItem::Kind::null) {
        return JsonError{1, 1, "null is not a value here"};
    }
    return valueOf(*whole);
}

} // namespace tamblo
