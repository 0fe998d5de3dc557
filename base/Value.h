#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <initializer_list>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

class Dictionary;
class Value;
using Array = std::vector<Value>;

/// One property-list value, in sixteen bytes.
///
/// Texts and byte strings of up to 14 bytes lie in the value itself; longer ones, arrays and dictionaries are
/// immutable, reference-counted blocks, so that a copy of any value costs at most one atomic increment.
/// Values may be copied to and destroyed on any thread.
///
/// Numbers, booleans among them, are equal by numeric value across kinds: 1, 1.0 and true are the same value.
/// A not-a-number equals itself, so that a message that repeats one is still seen as a repeat.
class Value {
public:
    enum class Kind : std::uint8_t {
        boolean,
        integer,         ///< signed 64-bit
        unsignedInteger, ///< above the signed range; smaller ones are stored as `integer`
        singleFloat,
        doubleFloat,
        string, ///< UTF-8
        date,   ///< seconds since 1970-01-01 UTC
        data,   ///< bytes
        array,
        dictionary,
    };

    /// The boolean false.
    Value() noexcept;
    Value(bool value) noexcept;
    Value(int value) noexcept;
    Value(unsigned value) noexcept;
    Value(long value) noexcept;
    Value(long long value) noexcept;
    Value(unsigned long value) noexcept;
    Value(unsigned long long value) noexcept;
    Value(float value) noexcept;
    Value(double value) noexcept;
    Value(const char* text);
    Value(std::string_view text);
    Value(const std::string& text);
    Value(Array elements);
    Value(Dictionary dictionary) noexcept;
    static Value date(double secondsSince1970) noexcept;
    static Value data(std::span<const std::uint8_t> bytes);

    Value(const Value& other) noexcept;
    Value(Value&& other) noexcept;
    Value& operator=(const Value& other) noexcept;
    Value& operator=(Value&& other) noexcept;
    ~Value();

    [[nodiscard]] Kind kind() const noexcept { return static_cast<Kind>(bytes_[kKindAt]); }
    [[nodiscard]] bool isNumber() const noexcept { return kind() <= Kind::doubleFloat; }
    [[nodiscard]] bool isString() const noexcept { return kind() == Kind::string; }
    [[nodiscard]] bool isDictionary() const noexcept { return kind() == Kind::dictionary; }
    [[nodiscard]] bool isArray() const noexcept { return kind() == Kind::array; }

    /// Readings that never fail. A text is read by its leading number (after white space), a number by its
    /// value; anything else, and what is no number, is 0. Integers are truncated towards zero and kept within
    /// their range. A date is not a number and reads as 0; its seconds are had from `dateSeconds`.
    [[nodiscard]] double doubleValue() const noexcept;
    [[nodiscard]] std::int64_t integerValue() const noexcept;
    [[nodiscard]] std::uint64_t unsignedValue() const noexcept;
    /// True for a number other than 0, and for a text that begins so, or with "YES", "yes", "TRUE" or "true".
    [[nodiscard]] bool boolValue() const noexcept;
    /// The text itself; empty for every other kind. Lives as long as the value stands unchanged.
    [[nodiscard]] std::string_view stringValue() const noexcept;
    /// The seconds of a date, else 0.
    [[nodiscard]] double dateSeconds() const noexcept;
    /// The bytes of a byte string; empty for every other kind.
    [[nodiscard]] std::span<const std::uint8_t> dataValue() const noexcept;
    /// The elements of an array; empty for every other kind.
    [[nodiscard]] std::span<const Value> arrayValue() const noexcept;
    /// The dictionary; an empty one for every other kind.
    [[nodiscard]] const Dictionary& dictionaryValue() const noexcept;

    /// The exact content of a number kind; only for the kind that `kind()` names.
    [[nodiscard]] std::int64_t rawInteger() const noexcept { return load<std::int64_t>(); }
    [[nodiscard]] std::uint64_t rawUnsigned() const noexcept { return load<std::uint64_t>(); }
    [[nodiscard]] double rawDouble() const noexcept { return load<double>(); }
    [[nodiscard]] float rawSingle() const noexcept { return load<float>(); }

    [[nodiscard]] bool operator==(const Value& other) const noexcept;

    /// Bytes of memory of what the value refers to, whether or not others refer to it as well.
    [[nodiscard]] std::size_t heldBytes() const noexcept { return ownsBlock() ? bytesOfBlock(false) : 0; }

private:
    friend class Dictionary;

    struct TextBlock;
    struct ArrayBlock;

    static constexpr std::size_t kInlineCapacity = 14;
    static constexpr std::size_t kLengthAt = 14;
    static constexpr std::size_t kKindAt = 15;
    /// In the length byte: the text lies in a block, its pointer in the first eight bytes.
    static constexpr std::uint8_t kInBlock = 0xFF;

    template <typename T> [[nodiscard]] T load() const noexcept {
        T value;
        std::memcpy(&value, bytes_, sizeof(T));
        return value;
    }
    template <typename T> void store(T value, Kind kind) noexcept {
        std::memset(bytes_, 0, sizeof bytes_);
        std::memcpy(bytes_, &value, sizeof(T));
        bytes_[kKindAt] = static_cast<std::uint8_t>(kind);
    }
    void storeText(std::string_view text, Kind kind);
    [[nodiscard]] std::string_view textBytes() const noexcept;
    [[nodiscard]] bool ownsBlock() const noexcept;
    void retain() const noexcept;
    void release() noexcept;
    void releaseBlock() noexcept;
    [[nodiscard]] std::size_t bytesOfBlock(bool sharesCountHalf) const noexcept;
    [[nodiscard]] bool numberEquals(const Value& other) const noexcept;

    alignas(8) std::uint8_t bytes_[16];
};

static_assert(sizeof(Value) == 16);

inline bool Value::ownsBlock() const noexcept {
    const Kind k = kind();
    if (k == Kind::string || k == Kind::data) {
        return bytes_[kLengthAt] == kInBlock;
    }
    return k >= Kind::array;
}

inline Value::Value() noexcept {
    std::memset(bytes_, 0, sizeof bytes_);
}

inline Value::Value(Value&& other) noexcept {
    std::memcpy(bytes_, other.bytes_, sizeof bytes_);
    std::memset(other.bytes_, 0, sizeof other.bytes_);
}

inline Value::Value(const Value& other) noexcept {
    std::memcpy(bytes_, other.bytes_, sizeof bytes_);
    retain();
}

inline void Value::release() noexcept {
    if (ownsBlock()) {
        releaseBlock();
    }
}

inline Value::~Value() {
    release();
}

inline Value& Value::operator=(Value&& other) noexcept {
    if (this != &other) {
        release();
        std::memcpy(bytes_, other.bytes_, sizeof bytes_);
        std::memset(other.bytes_, 0, sizeof other.bytes_);
    }
    return *this;
}

inline Value& Value::operator=(const Value& other) noexcept {
    // The same bytes are the same value and hold the same block, if any: what a client repeats costs nothing.
    if (std::memcmp(bytes_, other.bytes_, sizeof bytes_) == 0) {
        return *this;
    }
    // By way of a copy: the other may lie in a block that only this one holds.
    return *this = Value(other);
}

} // namespace tamblo
