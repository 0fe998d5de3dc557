#include "base/Value.h"

#include "base/Dictionary.h"
#include "base/NumberText.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>
#include <new>
#include <utility>

namespace tamblo {

struct Value::ArrayBlock {
    std::atomic<std::uint32_t> references{1};
    Array elements;

    explicit ArrayBlock(Array values) : elements(std::move(values)) {}
};

namespace {

/// The power of two that follows the integer's range.
template <typename Integer>
constexpr double kBehindLast = std::is_signed_v<Integer> ? 9223372036854775808.0 : 18446744073709551616.0;

/// The number at the beginning of a text, after white space, as far as it reads; 0 when there is none.
double leadingNumber(std::string_view text) noexcept {
    const std::size_t start = text.find_first_not_of(" \t\n\v\f\r");
    if (start == std::string_view::npos) {
        return 0.0;
    }
    text.remove_prefix(start);
    const bool negative = text.front() == '-';
    if (negative || text.front() == '+') {
        text.remove_prefix(1);
    }
    // Words such as "inf" or "nan" are no numbers here, though the library would read them.
    if (text.empty() || !((text.front() >= '0' && text.front() <= '9') || text.front() == '.')) {
        return 0.0;
    }
    const double number = nearestDouble(text);
    return negative ? -number : number;
}

template <typename Integer> Integer clamped(double number) noexcept {
    if (std::isnan(number)) {
        return 0;
    }
    if (number >= kBehindLast<Integer>) {
        return std::numeric_limits<Integer>::max();
    }
    if (number <= static_cast<double>(std::numeric_limits<Integer>::min())) {
        return std::numeric_limits<Integer>::min();
    }
    return static_cast<Integer>(number);
}

/// An integer at the beginning of a text, exact where a double would round.
template <typename Integer> Integer leadingInteger(std::string_view text, double asDouble) noexcept {
    const std::size_t start = text.find_first_not_of(" \t\n\v\f\r");
    if (start != std::string_view::npos) {
        text.remove_prefix(start);
        if (text.starts_with('+') && !text.starts_with("+-")) {
            text.remove_prefix(1);
        }
        Integer number = 0;
        const auto result = std::from_chars(text.data(), text.data() + text.size(), number);
        text.remove_prefix(static_cast<std::size_t>(result.ptr - text.data()));
        if (text.starts_with('.')) {
            text.remove_prefix(std::min(text.find_first_not_of("0123456789", 1), text.size()));
        }
        const bool hasExponent = text.starts_with('e') || text.starts_with('E');
        if (result.ec == std::errc{} && !hasExponent) {
            return number;
        }
    }
    return clamped<Integer>(asDouble);
}

template <typename Integer> bool equalsWhole(double number, Integer integer) noexcept {
    return number >= static_cast<double>(std::numeric_limits<Integer>::min()) &&
           number < kBehindLast<Integer> && static_cast<Integer>(number) == integer &&
           static_cast<double>(integer) == number;
}

bool beginsWithYes(std::string_view text) noexcept {
    for (const std::string_view yes : {"YES", "yes", "TRUE", "true"}) {
        if (text.starts_with(yes)) {
            return true;
        }
    }
    return false;
}

} // namespace

Value::Value(Array elements) {
    store(new ArrayBlock(std::move(elements)), Kind::array);
}

Value::Value(Dictionary dictionary) noexcept {
    store(std::exchange(dictionary.block_, nullptr), Kind::dictionary);
}

Value Value::date(double secondsSince1970) noexcept {
    Value value;
    value.store(secondsSince1970, Kind::date);
    return value;
}

Value Value::data(std::span<const std::uint8_t> bytes) {
    Value value;
    value.storeText({reinterpret_cast<const char*>(bytes.data()), bytes.size()}, Kind::data);
    return value;
}

void Value::storeTextBlock(std::string_view text) {
    void* memory = ::operator new(sizeof(TextBlock) + text.size());
    auto* block = new (memory) TextBlock(static_cast<std::uint32_t>(text.size()));
    std::memcpy(block->text(), text.data(), text.size());
    std::memcpy(bytes_, &block, sizeof block);
    bytes_[kLengthAt] = kInBlock;
}

void Value::retainLargeBlock() const noexcept {
    if (kind() == Kind::array) {
        load<ArrayBlock*>()->references.fetch_add(1, std::memory_order_relaxed);
    } else {
        Dictionary::retain(load<Dictionary::Block*>());
    }
}

void Value::releaseLargeBlock() noexcept {
    if (kind() == Kind::dictionary) {
        Dictionary::release(load<Dictionary::Block*>());
        return;
    }
    auto* const block = load<ArrayBlock*>();
    if (block->references.fetch_sub(1, std::memory_order_acq_rel) == 1) {
        delete block;
    }
}

void Value::freeTextBlock() noexcept {
    auto* const block = load<TextBlock*>();
    block->~TextBlock();
    ::operator delete(block);
}

std::size_t Value::bytesOfLargeBlock(bool sharesCountHalf) const noexcept {
    if (kind() == Kind::array) {
        const Array& elements = load<const ArrayBlock*>()->elements;
        std::size_t bytes =
            allocatedBytes(sizeof(ArrayBlock)) + allocatedBytes(elements.capacity() * sizeof(Value));
        for (const Value& element : elements) {
            bytes += element.ownsBlock() ? element.bytesOfBlock(sharesCountHalf) : 0;
        }
        return bytes;
    }
    const Dictionary& inner = dictionaryValue();
    const std::size_t keys = inner.keys().heldBytes();
    return sharesCountHalf ? inner.bytesOfValues(Dictionary::Shared::inProportion) +
                                 (inner.keys().isShared() ? keys / 2 : keys)
                           : inner.bytesOfValues(Dictionary::Shared::inFull) + keys;
}

double Value::doubleValue() const noexcept {
    switch (kind()) {
    case Kind::boolean:
    case Kind::integer:
        return static_cast<double>(rawInteger());
    case Kind::unsignedInteger:
        return static_cast<double>(rawUnsigned());
    case Kind::singleFloat:
        return static_cast<double>(rawSingle());
    case Kind::doubleFloat:
        return rawDouble();
    case Kind::string:
        return leadingNumber(textBytes());
    default:
        return 0.0;
    }
}

std::int64_t Value::integerValue() const noexcept {
    switch (kind()) {
    case Kind::boolean:
    case Kind::integer:
        return rawInteger();
    case Kind::unsignedInteger:
        return std::numeric_limits<std::int64_t>::max();
    case Kind::string:
        return leadingInteger<std::int64_t>(textBytes(), doubleValue());
    default:
        return clamped<std::int64_t>(doubleValue());
    }
}

std::uint64_t Value::unsignedValue() const noexcept {
    switch (kind()) {
    case Kind::boolean:
    case Kind::integer:
        return rawInteger() < 0 ? 0 : static_cast<std::uint64_t>(rawInteger());
    case Kind::unsignedInteger:
        return rawUnsigned();
    case Kind::string:
        return leadingInteger<std::uint64_t>(textBytes(), doubleValue());
    default:
        return clamped<std::uint64_t>(doubleValue());
    }
}

bool Value::boolValue() const noexcept {
    if (kind() == Kind::string) {
        return beginsWithYes(textBytes()) || leadingNumber(textBytes()) != 0.0;
    }
    const double number = doubleValue();
    return number != 0.0 && !std::isnan(number);
}

double Value::dateSeconds() const noexcept {
    return kind() == Kind::date ? load<double>() : 0.0;
}

std::span<const std::uint8_t> Value::dataValue() const noexcept {
    if (kind() != Kind::data) {
        return {};
    }
    const std::string_view bytes = textBytes();
    return {reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()};
}

std::span<const Value> Value::arrayValue() const noexcept {
    if (kind() != Kind::array) {
        return {};
    }
    return load<const ArrayBlock*>()->elements;
}

const Dictionary& Value::dictionaryValue() const noexcept {
    static const Dictionary none;
    if (kind() != Kind::dictionary) {
        return none;
    }
    // A dictionary is one pointer to its block, and so are the first bytes of a value that holds one.
    static_assert(sizeof(Dictionary) == sizeof(void*));
    return *std::launder(reinterpret_cast<const Dictionary*>(bytes_));
}

bool Value::numberEquals(const Value& other) const noexcept {
    const auto isDouble = [](Kind kind) { return kind == Kind::singleFloat || kind == Kind::doubleFloat; };
    const auto isUnsigned = [](Kind kind) { return kind == Kind::unsignedInteger; };
    if (isDouble(kind()) && isDouble(other.kind())) {
        const double mine = doubleValue();
        const double theirs = other.doubleValue();
        return mine == theirs || (std::isnan(mine) && std::isnan(theirs));
    }
    if (isDouble(kind())) {
        return isUnsigned(other.kind()) ? equalsWhole(doubleValue(), other.rawUnsigned())
                                        : equalsWhole(doubleValue(), other.rawInteger());
    }
    if (isDouble(other.kind())) {
        return other.numberEquals(*this);
    }
    // An unsigned integer lies above the signed range, so it equals only another one.
    return isUnsigned(kind()) == isUnsigned(other.kind()) && rawUnsigned() == other.rawUnsigned();
}

bool Value::equalsOtherBytes(const Value& other) const noexcept {
    if (isNumber() || other.isNumber()) {
        return isNumber() && other.isNumber() && numberEquals(other);
    }
    if (kind() != other.kind()) {
        return false;
    }
    switch (kind()) {
    case Kind::date: {
        const double mine = dateSeconds();
        const double theirs = other.dateSeconds();
        return mine == theirs || (std::isnan(mine) && std::isnan(theirs));
    }
    case Kind::array: {
        const std::span<const Value> mine = arrayValue();
        const std::span<const Value> theirs = other.arrayValue();
        return std::equal(mine.begin(), mine.end(), theirs.begin(), theirs.end());
    }
    case Kind::dictionary:
        return dictionaryValue() == other.dictionaryValue();
    default:
        return textBytes() == other.textBytes();
    }
}

} // namespace tamblo
