#include "base/Cbor.h"

#include "base/Utf8.h"

#include <array>
#include <bit>
#include <cmath>
#include <cstring>
#include <limits>

namespace tamblo {

namespace {

constexpr std::uint8_t kBreak = 0xFF;
constexpr unsigned kShortText = 0x60; ///< to 0x77: a text whose length is in its first byte
constexpr unsigned kLongText = KeySetCache::kLongText;
constexpr std::uint64_t kDateTag = 1;

// What values take in memory, about: a value in a list, and the blocks of those that have one.
constexpr std::size_t kElementBytes = sizeof(Value);
constexpr std::size_t kEntryBytes = 2 * sizeof(Value); ///< and its part of a key set
constexpr std::size_t kBlockBytes = 64;

std::uint64_t loadBigEndian(const std::uint8_t* from, unsigned count) noexcept {
    std::uint64_t value = 0;
    for (unsigned i = 0; i < count; ++i) {
        value = value << 8 | from[i];
    }
    return value;
}

std::uint64_t loadWord(const std::uint8_t* from) noexcept {
    std::uint64_t word;
    std::memcpy(&word, from, sizeof word);
    return word;
}

std::uint64_t loadBigEndian64(const std::uint8_t* from) noexcept {
    const std::uint64_t word = loadWord(from);
    return std::endian::native == std::endian::little ? __builtin_bswap64(word) : word;
}

/// The bits of a word's first bytes, as they lie in memory; of all of them from eight on.
std::uint64_t firstBytes(std::size_t count) noexcept {
    if (count >= sizeof(std::uint64_t)) {
        return ~std::uint64_t{0};
    }
    const std::uint64_t low = (std::uint64_t{1} << (8 * count)) - 1;
    return std::endian::native == std::endian::little ? low : ~(~std::uint64_t{0} >> (8 * count));
}

/// An IEEE 754 half-precision number, exactly.
float halfToSingle(std::uint16_t half) noexcept {
    const int exponent = half >> 10 & 0x1F;
    const int mantissa = half & 0x3FF;
    float magnitude = 0;
    if (exponent == 0) {
        magnitude = std::ldexp(static_cast<float>(mantissa), -24);
    } else if (exponent != 31) {
        magnitude = std::ldexp(static_cast<float>(mantissa + 1024), exponent - 25);
    } else {
        magnitude =
            mantissa == 0 ? std::numeric_limits<float>::infinity() : std::numeric_limits<float>::quiet_NaN();
    }
    return (half & 0x8000) != 0 ? -magnitude : magnitude;
}

} // namespace

std::string_view describe(CborError error) noexcept {
    constexpr std::array<std::string_view, 15> texts{
        "no error",
        "the item ends too early",
        "not well-formed",
        "nested deeper than 32",
        "null or undefined is no value here",
        "a tag other than 1 (a date), or a date that is no number",
        "a simple value other than true and false",
        "a key of a map is not text",
        "a map holds a key twice",
        "text that is not UTF-8",
        "an integer below -2^63",
        "too many entries",
        "a key that is too long",
        "keys that are too long together",
        "values that take too much memory",
    };
    static_assert(texts.size() == static_cast<std::size_t>(CborError::tooLarge) + 1);
    return texts[static_cast<std::size_t>(error)];
}

bool CborReader::fail(CborError error) noexcept {
    if (error_ == CborError::none) {
        error_ = error;
    }
    return false;
}

CborReader::Type CborReader::peek() const noexcept {
    if (error_ != CborError::none || position_ == end_) {
        return Type::end;
    }
    return static_cast<Type>(*position_ >> 5);
}

bool CborReader::readHead(Head& head) noexcept {
    if (error_ != CborError::none || position_ == end_) {
        return fail(CborError::truncated);
    }
    head.major = static_cast<Type>(*position_ >> 5);
    head.info = *position_ & 0x1F;
    ++position_;
    head.argument = head.info;
    return head.info < 24 || readLongHead(head);
}

bool CborReader::readLongHead(Head& head) noexcept {
    if (head.info == kIndefinite) {
        head.argument = 0;
        const bool mayBeIndefinite = head.major >= Type::bytes && head.major <= Type::map;
        return mayBeIndefinite || fail(CborError::malformed);
    }
    if (head.info > 27) {
        return fail(CborError::malformed);
    }
    const unsigned length = 1U << (head.info - 24);
    if (static_cast<std::size_t>(end_ - position_) < length) {
        return fail(CborError::truncated);
    }
    head.argument = loadBigEndian(position_, length);
    position_ += length;
    const bool isReservedSimple = head.major == Type::simple && length == 1 && head.argument < 32;
    return !isReservedSimple || fail(CborError::malformed);
}

bool CborReader::atBreak() noexcept {
    if (position_ != end_ && *position_ == kBreak) {
        ++position_;
        return true;
    }
    return false;
}

std::optional<std::uint64_t> CborReader::readUnsigned() noexcept {
    Head head{};
    if (peek() != Type::unsignedInteger || !readHead(head)) {
        return std::nullopt;
    }
    return head.argument;
}

std::optional<std::int64_t> CborReader::readInteger() noexcept {
    const Type type = peek();
    if (type != Type::unsignedInteger && type != Type::negativeInteger) {
        return std::nullopt;
    }
    const std::uint8_t* const start = position_;
    Head head{};
    if (!readHead(head)) {
        return std::nullopt;
    }
    if (head.argument > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
        position_ = start;
        return std::nullopt;
    }
    const auto magnitude = static_cast<std::int64_t>(head.argument);
    return type == Type::negativeInteger ? -1 - magnitude : magnitude;
}

std::optional<std::string_view> CborReader::readText() noexcept {
    if (peek() != Type::text || (*position_ & 0x1F) == kIndefinite) {
        return std::nullopt;
    }
    Head head{};
    std::string_view text;
    if (!readHead(head) || !takeBytes(head, text)) {
        return std::nullopt;
    }
    if (!isUtf8(text)) {
        fail(CborError::notUtf8);
        return std::nullopt;
    }
    return text;
}

bool CborReader::readNull() noexcept {
    if (error_ != CborError::none || !nextIsNull()) {
        return false;
    }
    ++position_;
    return true;
}

std::optional<CborReader::ArrayHead> CborReader::readArrayHead() noexcept {
    Head head{};
    if (peek() != Type::array || !readHead(head)) {
        return std::nullopt;
    }
    ArrayHead array;
    if (head.info != kIndefinite) {
        array.count = head.argument;
    }
    return array;
}

bool CborReader::moreElements(ArrayHead& array) noexcept {
    if (error_ != CborError::none) {
        return false;
    }
    if (array.count ? array.read == *array.count : atBreak()) {
        return false;
    }
    ++array.read;
    return position_ != end_ || fail(CborError::truncated);
}

std::optional<Value> CborReader::readValue() {
    Value value;
    if (!readItem(value, 0)) {
        return std::nullopt;
    }
    return value;
}

std::optional<Dictionary> CborReader::readDictionary(std::size_t spare) {
    Head head{};
    Dictionary dictionary;
    if (peek() != Type::map || !readHead(head) || !readMap(head, dictionary, 1, spare)) {
        return std::nullopt;
    }
    return dictionary;
}

bool CborReader::readItem(Value& value, int depth) {
    Head head{};
    if (!readHead(head)) {
        return false;
    }
    switch (head.major) {
    case Type::unsignedInteger:
        value = Value(head.argument);
        return true;
    case Type::negativeInteger:
        if (head.argument > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
            return fail(CborError::integerOutOfRange);
        }
        value = Value(-1 - static_cast<std::int64_t>(head.argument));
        return true;
    case Type::bytes:
    case Type::text:
        return readString(head, value);
    case Type::array:
        return readArray(head, value, depth + 1);
    case Type::map: {
        Dictionary dictionary;
        if (!readMap(head, dictionary, depth + 1, 0)) {
            return false;
        }
        value = Value(std::move(dictionary));
        return true;
    }
    case Type::tag:
        return readDate(head, value);
    default:
        return readSimple(head, value);
    }
}

bool CborReader::readSimple(const Head& head, Value& value) noexcept {
    switch (head.info) {
    case 20:
    case 21:
        value = Value(head.info == 21);
        return true;
    case 22:
    case 23:
        return fail(CborError::nullValue);
    case 25:
        value = Value(halfToSingle(static_cast<std::uint16_t>(head.argument)));
        return true;
    case 26:
        value = Value(std::bit_cast<float>(static_cast<std::uint32_t>(head.argument)));
        return true;
    case 27:
        value = Value(std::bit_cast<double>(head.argument));
        return true;
    default:
        return fail(CborError::unsupportedSimple);
    }
}

bool CborReader::takeBytes(const Head& head, std::string_view& bytes) noexcept {
    if (static_cast<std::uint64_t>(end_ - position_) < head.argument) {
        return fail(CborError::truncated);
    }
    if (!charge(head.argument)) {
        return false;
    }
    bytes = {reinterpret_cast<const char*>(position_), static_cast<std::size_t>(head.argument)};
    position_ += head.argument;
    return true;
}

bool CborReader::takeChunk(Type major, std::string_view& chunk) noexcept {
    Head head{};
    if (!readHead(head)) {
        return false;
    }
    if (head.major != major || head.info == kIndefinite) {
        return fail(CborError::malformed);
    }
    return takeBytes(head, chunk);
}

bool CborReader::takeChunks(Type major, std::string* bytes) {
    while (!atBreak()) {
        std::string_view chunk;
        if (!takeChunk(major, chunk)) {
            return false;
        }
        if (bytes == nullptr) {
            continue;
        }
        // Each chunk of a text is a text of its own (RFC 8949, section 3.2.3).
        if (major == Type::text && !isUtf8(chunk)) {
            return fail(CborError::notUtf8);
        }
        *bytes += chunk;
    }
    return true;
}

bool CborReader::readString(const Head& head, Value& value) {
    std::string_view bytes;
    std::string assembled;
    if (head.info != kIndefinite) {
        if (!takeBytes(head, bytes)) {
            return false;
        }
    } else if (takeChunks(head.major, &assembled)) {
        bytes = assembled;
    } else {
        return false;
    }
    if (head.major == Type::bytes) {
        value = Value::data({reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()});
        return true;
    }
    if (keySets_ != nullptr) {
        std::optional<Value> text = keySets_->textValue(bytes);
        if (!text) {
            return fail(CborError::notUtf8);
        }
        value = *std::move(text);
        return true;
    }
    value = Value(bytes);
    return isUtf8(bytes) || fail(CborError::notUtf8);
}

bool CborReader::readDate(const Head& head, Value& value) {
    if (head.argument != kDateTag) {
        return fail(CborError::unsupportedTag);
    }
    const Type type = peek();
    if (type == Type::end) {
        return fail(CborError::truncated);
    }
    const bool mayBeNumber =
        type == Type::unsignedInteger || type == Type::negativeInteger || type == Type::simple;
    Value seconds;
    if (!mayBeNumber || !readItem(seconds, 0) || seconds.kind() == Value::Kind::boolean) {
        return fail(CborError::unsupportedTag);
    }
    value = Value::date(seconds.doubleValue());
    return true;
}

bool CborReader::readArray(const Head& head, Value& value, int depth) {
    if (depth > kMaximumDepth) {
        return fail(CborError::tooDeep);
    }
    if (!charge(kBlockBytes)) {
        return false;
    }
    Array elements;
    const bool isIndefinite = head.info == kIndefinite;
    for (std::uint64_t i = 0; isIndefinite ? !atBreak() : i < head.argument; ++i) {
        if (!charge(kElementBytes) || !readItem(elements.emplace_back(), depth)) {
            return false;
        }
    }
    value = Value(std::move(elements));
    return true;
}

bool CborReader::readMap(const Head& head, Dictionary& dictionary, int depth, std::size_t spare) {
    if (depth > kMaximumDepth) {
        return fail(CborError::tooDeep);
    }
    if (!charge(kBlockBytes)) {
        return false;
    }
    // Most messages have the keys that the last one of their size had, and are then read into their place.
    std::uint64_t taken = 0;
    KeySetCache::Expected* expected = nullptr;
    if (keySets_ != nullptr && head.info != kIndefinite && depth == 1) {
        expected = &keySets_->expected(head.argument);
    }
    MapEntries& entries = this->entries();
    const MapEntries::Own own(entries);
    if (expected != nullptr && expected->shape != nullptr &&
        expected->shape->places.size() == head.argument) {
        const KeySetCache::Shape& shape = *expected->shape;
        Dictionary::Unfilled map = Dictionary::fromKeySet(shape.keys, spare);
        if (!takeExpected(*expected, map.values, depth, taken)) {
            return false;
        }
        if (taken == head.argument) {
            dictionary = std::move(map.dictionary);
            return true;
        }
        for (std::uint64_t i = 0; i < taken; ++i) {
            entries.keys.push_back(shape.keys->key(shape.places[i]));
            entries.values.push_back(std::move(map.values[shape.places[i]]));
        }
    }
    return readEntries(head, depth, taken) && makeDictionary(dictionary, own.first, spare, depth);
}

MapEntries& CborReader::entries() noexcept {
    return keySets_ != nullptr ? keySets_->entries() : ownEntries_;
}

bool CborReader::makeDictionary(Dictionary& dictionary, std::size_t firstEntry, std::size_t spare,
                                int depth) {
    MapEntries& entries = this->entries();
    const auto keys = std::span<const std::string_view>(entries.keys).subspan(firstEntry);
    const auto values = std::span(entries.values).subspan(firstEntry);
    switch (keySets_ != nullptr ? keySets_->makeDictionary(keys, values, spare, depth != 1, dictionary)
                                : KeySetCache::makeDictionaryOnce(keys, values, spare, dictionary)) {
    case KeySetCache::Fault::none:
        return true;
    case KeySetCache::Fault::notUtf8:
        return fail(CborError::notUtf8);
    case KeySetCache::Fault::duplicateKey:
        return fail(CborError::duplicateKey);
    }
    return false;
}

/// Takes entries for as long as they have the keys that are expected. False after an error.
bool CborReader::takeExpected(KeySetCache::Expected& expected, std::span<Value> values, int depth,
                              std::uint64_t& taken) {
    const KeySetCache::Shape& shape = *expected.shape;
    const std::uint64_t count = shape.places.size();
    const auto* key = reinterpret_cast<const std::uint8_t*>(shape.encoded.data());
    std::uint32_t begin = 0;
    for (taken = 0; taken < count; ++taken) {
        const std::uint32_t length = shape.ends[taken] - begin;
        if (!isNext(key, length)) {
            return true;
        }
        begin += length;
        key += length;
        position_ += length;
        const std::size_t keyBytes = shape.keys->key(shape.places[taken]).size();
        if (keyBytes >= kLongText && !charge(keyBytes)) {
            return false;
        }
        Value& value = values[shape.places[taken]];
        if (!takeOrdinary(value) && !takeKnownText(expected.texts[taken], value)) {
            if (!readItem(value, depth)) {
                return false;
            }
            if (KeySetCache::isRemembered(value.stringValue().size())) {
                expected.texts[taken] = value;
            }
        }
        if (!countEntry(keyBytes)) {
            return false;
        }
    }
    return true;
}

/// Whether these bytes come next. Some more may be read behind them.
bool CborReader::isNext(const std::uint8_t* bytes, std::size_t count) const noexcept {
    const auto left = static_cast<std::size_t>(end_ - position_);
    if (left < count + sizeof(std::uint64_t)) {
        return left >= count && std::memcmp(position_, bytes, count) == 0;
    }
    std::size_t at = 0;
    for (; count - at > sizeof(std::uint64_t); at += sizeof(std::uint64_t)) {
        if (loadWord(position_ + at) != loadWord(bytes + at)) {
            return false;
        }
    }
    return ((loadWord(position_ + at) ^ loadWord(bytes + at)) & firstBytes(count - at)) == 0;
}

bool CborReader::countEntry(std::size_t keyBytes) noexcept {
    keyBytesRead_ += keyBytes;
    if (++entriesRead_ > limits_.entries) {
        return fail(CborError::tooManyEntries);
    }
    if (keyBytes > limits_.keyBytes) {
        return fail(CborError::keyTooLong);
    }
    if (keyBytesRead_ > limits_.bytesOfKeys) {
        return fail(CborError::keysTooLong);
    }
    return charge(kEntryBytes);
}

bool CborReader::readEntries(const Head& head, int depth, std::uint64_t first) {
    MapEntries& entries = this->entries();
    const bool isIndefinite = head.info == kIndefinite;
    for (std::uint64_t i = first; isIndefinite ? !atBreak() : i < head.argument; ++i) {
        std::string_view key;
        Value value;
        // The commonest items of a message are taken without looking at all that an item may be.
        if (!(takeShortText(key) || readKey(key)) || !(takeOrdinary(value) || readItem(value, depth))) {
            return false;
        }
        if (!countEntry(key.size())) {
            return false;
        }
        entries.keys.push_back(key);
        entries.values.push_back(std::move(value));
    }
    return true;
}

bool CborReader::takeShortText(std::string_view& text) noexcept {
    if (position_ == end_) {
        return false;
    }
    const unsigned length = *position_ - kShortText;
    if (length >= kLongText || static_cast<std::size_t>(end_ - position_) <= length) {
        return false;
    }
    text = {reinterpret_cast<const char*>(position_ + 1), length};
    position_ += 1 + length;
    return true;
}

/// Takes the next item where it is one of those that messages mostly consist of, numbers, booleans and texts
/// that lie in their value, and there is enough behind it that none can reach beyond the end.
bool CborReader::takeOrdinary(Value& value) {
    constexpr std::uint8_t smallest = 0x18; // an integer whose number is not in its head
    constexpr std::uint8_t falseItem = 0xF4;
    constexpr std::uint8_t doubleItem = 0xFB;
    if (end_ - position_ < 24) {
        return false;
    }
    const std::uint8_t head = *position_;
    if (head == doubleItem) {
        value = Value(std::bit_cast<double>(loadBigEndian64(position_ + 1)));
        position_ += 9;
    } else if (head < smallest) {
        value = Value(unsigned{head});
        position_ += 1;
    } else if (head < smallest + 4) {
        const unsigned bytes = 1U << (head - smallest);
        value = Value(loadBigEndian64(position_ + 1) >> (64 - 8 * bytes));
        position_ += 1 + bytes;
    } else if ((head & 0xFE) == falseItem) {
        value = Value(head != falseItem);
        position_ += 1;
    } else {
        const unsigned length = head - kShortText;
        constexpr std::uint64_t highBits = 0x8080'8080'8080'8080;
        constexpr unsigned kWord = sizeof(std::uint64_t);
        if (length > Value::kInlineCapacity) {
            return false;
        }
        const std::uint64_t first = loadWord(position_ + 1) & firstBytes(length);
        const std::uint64_t second =
            length > kWord ? loadWord(position_ + 1 + kWord) & firstBytes(length - kWord) : 0;
        if (((first | second) & highBits) != 0 || decodedBytes_ + length > limits_.decodedBytes) {
            return false;
        }
        decodedBytes_ += length;
        value = Value(std::string_view(reinterpret_cast<const char*>(position_ + 1), length));
        position_ += 1 + length;
    }
    return true;
}

/// Takes the next item where it is that text.
bool CborReader::takeKnownText(const Value& known, Value& value) {
    const std::string_view text = known.stringValue();
    const auto left = static_cast<std::size_t>(end_ - position_);
    const std::size_t head = text.size() < kLongText ? 1 : 2;
    if (text.empty() || left < head + text.size()) {
        return false;
    }
    const bool isLong = position_[0] == kShortText + kLongText && position_[1] == text.size();
    if (!(head == 1 ? position_[0] == kShortText + text.size() : isLong) ||
        std::memcmp(position_ + head, text.data(), text.size()) != 0 ||
        decodedBytes_ + text.size() > limits_.decodedBytes) {
        return false;
    }
    decodedBytes_ += text.size();
    position_ += head + text.size();
    value = known;
    return true;
}

bool CborReader::readKey(std::string_view& key) {
    Head head{};
    if (!readHead(head)) {
        return false;
    }
    if (head.major != Type::text) {
        return fail(CborError::keyNotText);
    }
    if (head.info != kIndefinite) {
        return takeBytes(head, key);
    }
    MapEntries& entries = this->entries();
    std::string assembled;
    if (!takeChunks(Type::text, &assembled)) {
        return false;
    }
    key = entries.assembledKeys.emplace_back(std::move(assembled));
    return true;
}

} // namespace tamblo
