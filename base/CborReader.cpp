#include "base/Cbor.h"

#include "base/Utf8.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstring>
#include <limits>

namespace tamblo {

namespace {

enum Major : std::uint8_t { kUnsigned, kNegative, kBytes, kText, kArray, kMap, kTag, kSimple };

constexpr std::uint8_t kIndefinite = 31;
constexpr std::uint8_t kBreak = 0xFF;
constexpr std::uint64_t kDateTag = 1;

// A map beyond these is no ordinary message; remembering its keys would cost memory and help nobody.
constexpr std::size_t kMostRememberedKeys = 64;
constexpr std::size_t kMostRememberedKeyBytes = 4096;

std::uint64_t loadBigEndian(const std::uint8_t* from, unsigned count) noexcept {
    std::uint64_t value = 0;
    for (unsigned i = 0; i < count; ++i) {
        value = value << 8 | from[i];
    }
    return value;
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

std::uint64_t mix(std::uint64_t hash, std::uint64_t word) noexcept {
    hash = (hash ^ word) * 0x9E3779B97F4A7C15U;
    return hash ^ hash >> 29;
}

/// A hash of keys in their order, good enough to tell the kinds of messages apart: of each key its length and
/// up to sixteen of its bytes. What it answers is verified key by key.
std::uint64_t hashKeys(std::span<const std::string_view> keys) noexcept {
    std::uint64_t hash = keys.size();
    for (const std::string_view key : keys) {
        std::uint64_t first = 0;
        std::uint64_t last = 0;
        if (key.size() >= 8) {
            std::memcpy(&first, key.data(), 8);
            std::memcpy(&last, key.data() + key.size() - 8, 8);
        } else {
            for (const char character : key) {
                first = first << 8 | static_cast<std::uint8_t>(character);
            }
        }
        hash = mix(hash, first + (last << 1 | last >> 63) + key.size());
    }
    return hash;
}

} // namespace

/// The keys of a map as they came, and where each stands among the sorted ones.
struct KeySetCache::Shape {
    std::uint64_t hash;
    KeySetRef keys;
    std::vector<std::uint32_t> places;

    [[nodiscard]] bool matches(std::uint64_t otherHash,
                               std::span<const std::string_view> arrived) const noexcept {
        if (hash != otherHash || places.size() != arrived.size()) {
            return false;
        }
        for (std::size_t i = 0; i < arrived.size(); ++i) {
            if (keys->key(places[i]) != arrived[i]) {
                return false;
            }
        }
        return true;
    }
};

KeySetCache::KeySetCache() = default;
KeySetCache::~KeySetCache() = default;

std::string_view describe(CborError error) noexcept {
    switch (error) {
    case CborError::none:
        return "no error";
    case CborError::truncated:
        return "the item ends too early";
    case CborError::malformed:
        return "not well-formed";
    case CborError::tooDeep:
        return "nested deeper than 32";
    case CborError::nullValue:
        return "null or undefined is no value here";
    case CborError::unsupportedTag:
        return "a tag other than 1 (a date), or a date that is no number";
    case CborError::unsupportedSimple:
        return "a simple value other than true and false";
    case CborError::keyNotText:
        return "a key of a map is not text";
    case CborError::duplicateKey:
        return "a map holds a key twice";
    case CborError::notUtf8:
        return "text that is not UTF-8";
    case CborError::integerOutOfRange:
        return "an integer below -2^63";
    }
    return "unknown error";
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
    head.major = *position_ >> 5;
    head.info = *position_ & 0x1F;
    ++position_;
    if (head.info < 24) {
        head.argument = head.info;
        return true;
    }
    if (head.info == kIndefinite) {
        head.argument = 0;
        const bool mayBeIndefinite = head.major >= kBytes && head.major <= kMap;
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
    const bool isReservedSimple = head.major == kSimple && head.info == 24 && head.argument < 32;
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

std::optional<bool> CborReader::readBoolean() noexcept {
    if (peek() != Type::simple || (*position_ != 0xF4 && *position_ != 0xF5)) {
        return std::nullopt;
    }
    return *position_++ == 0xF5;
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
    case kUnsigned:
        value = Value(head.argument);
        return true;
    case kNegative:
        if (head.argument > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
            return fail(CborError::integerOutOfRange);
        }
        value = Value(-1 - static_cast<std::int64_t>(head.argument));
        return true;
    case kBytes:
    case kText:
        return readString(head, value);
    case kArray:
        return readArray(head, value, depth + 1);
    case kMap: {
        Dictionary dictionary;
        if (!readMap(head, dictionary, depth + 1, 0)) {
            return false;
        }
        value = Value(std::move(dictionary));
        return true;
    }
    case kTag:
        return readDate(head, value, depth + 1);
    default:
        return readSimple(head, value);
    }
}

bool CborReader::readSimple(const Head& head, Value& value) noexcept {
    if (head.info >= 25) {
        return readFloatingPoint(head, value);
    }
    switch (head.argument) {
    case 20:
        value = Value(false);
        return true;
    case 21:
        value = Value(true);
        return true;
    case 22:
    case 23:
        return fail(CborError::nullValue);
    default:
        return fail(CborError::unsupportedSimple);
    }
}

bool CborReader::readFloatingPoint(const Head& head, Value& value) noexcept {
    switch (head.info) {
    case 25:
        value = Value(halfToSingle(static_cast<std::uint16_t>(head.argument)));
        return true;
    case 26:
        value = Value(std::bit_cast<float>(static_cast<std::uint32_t>(head.argument)));
        return true;
    default:
        value = Value(std::bit_cast<double>(head.argument));
        return true;
    }
}

bool CborReader::takeBytes(const Head& head, std::string_view& bytes) noexcept {
    if (static_cast<std::uint64_t>(end_ - position_) < head.argument) {
        return fail(CborError::truncated);
    }
    bytes = {reinterpret_cast<const char*>(position_), static_cast<std::size_t>(head.argument)};
    position_ += head.argument;
    return true;
}

bool CborReader::assembleChunks(std::uint8_t major, std::string& bytes) {
    while (!atBreak()) {
        Head head{};
        std::string_view chunk;
        if (!readHead(head)) {
            return false;
        }
        if (head.major != major || head.info == kIndefinite) {
            return fail(CborError::malformed);
        }
        if (!takeBytes(head, chunk)) {
            return false;
        }
        // Each chunk of a text is a text of its own (RFC 8949, section 3.2.3).
        if (major == kText && !isUtf8(chunk)) {
            return fail(CborError::notUtf8);
        }
        bytes += chunk;
    }
    return true;
}

bool CborReader::readString(const Head& head, Value& value) {
    std::string_view bytes;
    std::string assembled;
    if (head.info == kIndefinite) {
        if (!assembleChunks(head.major, assembled)) {
            return false;
        }
        bytes = assembled;
    } else {
        if (!takeBytes(head, bytes)) {
            return false;
        }
        if (head.major == kText && !isUtf8(bytes)) {
            return fail(CborError::notUtf8);
        }
    }
    if (head.major == kText) {
        value = Value(bytes);
    } else {
        value = Value::data({reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()});
    }
    return true;
}

bool CborReader::readDate(const Head& head, Value& value, int depth) {
    if (head.argument != kDateTag) {
        return fail(CborError::unsupportedTag);
    }
    if (depth > kMaximumDepth) {
        return fail(CborError::tooDeep);
    }
    const Type type = peek();
    const bool mayBeNumber =
        type == Type::unsignedInteger || type == Type::negativeInteger || type == Type::simple;
    if (!mayBeNumber) {
        return fail(type == Type::end ? CborError::truncated : CborError::unsupportedTag);
    }
    Value seconds;
    if (!readItem(seconds, depth)) {
        return false;
    }
    if (seconds.kind() == Value::Kind::boolean) {
        return fail(CborError::unsupportedTag);
    }
    value = Value::date(seconds.doubleValue());
    return true;
}

bool CborReader::readArray(const Head& head, Value& value, int depth) {
    if (depth > kMaximumDepth) {
        return fail(CborError::tooDeep);
    }
    Array elements;
    const bool isIndefinite = head.info == kIndefinite;
    for (std::uint64_t i = 0; isIndefinite ? !atBreak() : i < head.argument; ++i) {
        if (!readItem(elements.emplace_back(), depth)) {
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
    detail::MapScratch& scratch = this->scratch();
    const std::size_t first = scratch.keys.size();
    const std::size_t assembled = scratch.assembledKeys.size();
    const bool isRead = readEntries(head, depth) && buildDictionary(dictionary, first, spare);
    scratch.keys.resize(first);
    scratch.values.resize(first);
    scratch.assembledKeys.resize(assembled);
    return isRead;
}

detail::MapScratch& CborReader::scratch() noexcept {
    return keySets_ != nullptr ? keySets_->scratch_ : ownScratch_;
}

bool CborReader::readEntries(const Head& head, int depth) {
    detail::MapScratch& scratch = this->scratch();
    const bool isIndefinite = head.info == kIndefinite;
    for (std::uint64_t i = 0; isIndefinite ? !atBreak() : i < head.argument; ++i) {
        std::string_view key;
        Value value;
        if (!readKey(key) || !readItem(value, depth)) {
            return false;
        }
        scratch.keys.push_back(key);
        scratch.values.push_back(std::move(value));
    }
    return true;
}

bool CborReader::readKey(std::string_view& key) {
    Head head{};
    if (!readHead(head)) {
        return false;
    }
    if (head.major != kText) {
        return fail(CborError::keyNotText);
    }
    if (head.info != kIndefinite) {
        return takeBytes(head, key);
    }
    detail::MapScratch& scratch = this->scratch();
    std::string assembled;
    if (!assembleChunks(kText, assembled)) {
        return false;
    }
    key = scratch.assembledKeys.emplace_back(std::move(assembled));
    return true;
}

bool CborReader::buildDictionary(Dictionary& dictionary, std::size_t firstEntry, std::size_t spare) {
    detail::MapScratch& scratch = this->scratch();
    const std::span<const std::string_view> arrived = std::span(scratch.keys).subspan(firstEntry);
    const std::span<Value> values = std::span(scratch.values).subspan(firstEntry);
    std::unique_ptr<KeySetCache::Shape>* slot = nullptr;
    std::uint64_t hash = 0;
    if (keySets_ != nullptr) {
        hash = hashKeys(arrived);
        slot = &keySets_->slots_[hash % KeySetCache::kSlots];
        if (*slot && (*slot)->matches(hash, arrived)) {
            dictionary = Dictionary::adopt((*slot)->keys, values, (*slot)->places, spare);
            return true;
        }
    }

    std::vector<std::uint32_t> order(arrived.size());
    std::size_t keyBytes = 0;
    for (std::size_t i = 0; i < order.size(); ++i) {
        order[i] = static_cast<std::uint32_t>(i);
        keyBytes += arrived[i].size();
        if (!isUtf8(arrived[i])) {
            return fail(CborError::notUtf8);
        }
    }
    std::sort(order.begin(), order.end(),
              [arrived](std::uint32_t a, std::uint32_t b) { return arrived[a] < arrived[b]; });
    std::vector<std::string_view> sorted(arrived.size());
    std::vector<std::uint32_t> places(arrived.size());
    for (std::size_t i = 0; i < order.size(); ++i) {
        sorted[i] = arrived[order[i]];
        places[order[i]] = static_cast<std::uint32_t>(i);
        if (i != 0 && sorted[i] == sorted[i - 1]) {
            return fail(CborError::duplicateKey);
        }
    }
    KeySetRef keys = sorted.empty() ? KeySet::empty() : KeySet::make(sorted);
    dictionary = Dictionary::adopt(keys, values, places, spare);
    if (slot != nullptr && sorted.size() <= kMostRememberedKeys && keyBytes <= kMostRememberedKeyBytes) {
        slot->reset(new KeySetCache::Shape{hash, std::move(keys), std::move(places)});
    }
    return true;
}

bool CborReader::skip() {
    // What is still open, innermost last: how many items are to come, or, for indefinite lengths, how many
    // have.
    struct Open {
        std::uint64_t items;
        bool isIndefinite;
        bool isMap;
    };
    std::vector<Open> open;
    do {
        if (!open.empty() && open.back().isIndefinite && atBreak()) {
            if (open.back().isMap && open.back().items % 2 != 0) {
                return fail(CborError::malformed);
            }
            open.pop_back();
        } else {
            if (!open.empty()) {
                Open& container = open.back();
                container.items += container.isIndefinite ? 1 : static_cast<std::uint64_t>(-1);
            }
            Head head{};
            if (!readHead(head)) {
                return false;
            }
            const bool isIndefinite = head.info == kIndefinite;
            std::string_view bytes;
            switch (head.major) {
            case kBytes:
            case kText:
                if (isIndefinite ? !skipChunks(head.major) : !takeBytes(head, bytes)) {
                    return false;
                }
                break;
            case kArray:
                open.push_back({head.argument, isIndefinite, false});
                break;
            case kMap:
                // Every item takes a byte, so a count that overflows when doubled cannot be there in full.
                if (head.argument > static_cast<std::uint64_t>(end_ - position_)) {
                    return fail(CborError::truncated);
                }
                open.push_back({head.argument * 2, isIndefinite, true});
                break;
            case kTag:
                open.push_back({1, false, false});
                break;
            default:
                break;
            }
        }
        while (!open.empty() && !open.back().isIndefinite && open.back().items == 0) {
            open.pop_back();
        }
    } while (!open.empty());
    return true;
}

bool CborReader::skipChunks(std::uint8_t major) noexcept {
    while (!atBreak()) {
        Head head{};
        std::string_view chunk;
        if (!readHead(head)) {
            return false;
        }
        if (head.major != major || head.info == kIndefinite) {
            return fail(CborError::malformed);
        }
        if (!takeBytes(head, chunk)) {
            return false;
        }
    }
    return true;
}

} // namespace tamblo
