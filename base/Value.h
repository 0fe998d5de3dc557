#pragma once

#include "base/AllocatedBytes.h"

#include <atomic>
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

    /// Texts and byte strings of so many bytes lie in the value.
    static constexpr std::size_t kInlineCapacity = 14;

    /// The boolean false.
    Value() noexcept;
    Value(bool value) noexcept { store<std::int64_t>(value ? 1 : 0, Kind::boolean); }
    Value(int value) noexcept : Value(static_cast<long long>(value)) {}
    Value(unsigned value) noexcept : Value(static_cast<long long>(value)) {}
    Value(long value) noexcept : Value(static_cast<long long>(value)) {}
    Value(long long value) noexcept { store<std::int64_t>(value, Kind::integer); }
    Value(unsigned long value) noexcept : Value(static_cast<unsigned long long>(value)) {}
    Value(unsigned long long value) noexcept {
        const bool fitsSigned = value >> 63U == 0;
        store<std::uint64_t>(value, fitsSigned ? Kind::integer : Kind::unsignedInteger);
    }
    Value(float value) noexcept { store(value, Kind::singleFloat); }
    Value(double value) noexcept { store(value, Kind::doubleFloat); }
    Value(const char* text) : Value(std::string_view(text)) {}
    Value(std::string_view text) { storeText(text, Kind::string); }
    Value(const std::string& text) : Value(std::string_view(text)) {}
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
    [[nodiscard]] std::string_view stringValue() const noexcept {
        return isString() ? textBytes() : std::string_view();
    }
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

    [[nodiscard]] bool operator==(const Value& other) const noexcept {
        return isSame(other) || equalsOtherBytes(other);
    }

    /// Whether both are the same bytes: of one kind, and of what lies in a block, the same block. Then they
    /// are equal; equal values need not be the same.
    [[nodiscard]] bool isSame(const Value& other) const noexcept {
        return std::memcmp(bytes_, other.bytes_, sizeof bytes_) == 0;
    }

    /// Bytes of memory of what the value refers to, whether or not others refer to it as well.
    [[nodiscard]] std::size_t heldBytes() const noexcept { return ownsBlock() ? bytesOfBlock(false) : 0; }

private:
    friend class Dictionary;

    /// A text or byte string too long for the value itself; the bytes follow the block.
    struct TextBlock {
        explicit TextBlock(std::uint32_t bytes) noexcept : length(bytes) {}
        [[nodiscard]] char* text() noexcept { return reinterpret_cast<char*>(this + 1); }
        [[nodiscard]] std::string_view view() const noexcept {
            return {reinterpret_cast<const char*>(this + 1), length};
        }

        std::atomic<std::uint32_t> references{1};
        std::uint32_t length;
    };
    struct ArrayBlock;

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
    void storeText(std::string_view text, Kind kind) {
        std::memset(bytes_, 0, sizeof bytes_);
        bytes_[kKindAt] = static_cast<std::uint8_t>(kind);
        if (text.size() > kInlineCapacity) {
            storeTextBlock(text);
        } else if (!text.empty()) {
            std::memcpy(bytes_, text.data(), text.size());
            bytes_[kLengthAt] = static_cast<std::uint8_t>(text.size());
        }
    }
    void storeTextBlock(std::string_view text);
    [[nodiscard]] std::string_view textBytes() const noexcept;
    [[nodiscard]] bool ownsBlock() const noexcept;
    void retain() const noexcept {
        if (!ownsBlock()) {
            return;
        }
        if (kind() < Kind::array) {
            load<TextBlock*>()->references.fetch_add(1, std::memory_order_relaxed);
        } else {
            retainLargeBlock();
        }
    }
    void retainLargeBlock() const noexcept;
    void release() noexcept;
    void releaseLargeBlock() noexcept;
    void freeTextBlock() noexcept;
    [[nodiscard]] std::size_t bytesOfBlock(bool sharesCountHalf) const noexcept {
        return kind() < Kind::array ? bytesOfTextBlock(sharesCountHalf) : bytesOfLargeBlock(sharesCountHalf);
    }
    [[nodiscard]] std::size_t bytesOfTextBlock(bool sharesCountHalf) const noexcept {
        // Longer texts are never shared by the messages that clients send one by one. Others may be held
        // twice by what reads them (`KeySetCache`), which keeps no message's text.
        constexpr std::size_t kLongestSharedText = 96;
        constexpr std::uint32_t kHoldersOfOneMessagesText = 3;
        const auto* const text = load<const TextBlock*>();
        const std::size_t bytes = allocatedBytes(sizeof(TextBlock) + text->length);
        const bool isShared = sharesCountHalf && text->length <= kLongestSharedText &&
                              text->references.load(std::memory_order_relaxed) > kHoldersOfOneMessagesText;
        return isShared ? bytes / 2 : bytes;
    }
    [[nodiscard]] std::size_t bytesOfLargeBlock(bool sharesCountHalf) const noexcept;
    [[nodiscard]] bool equalsOtherBytes(const Value& other) const noexcept;
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

inline std::string_view Value::textBytes() const noexcept {
    if (bytes_[kLengthAt] == kInBlock) {
        return load<const TextBlock*>()->view();
    }
    return {reinterpret_cast<const char*>(bytes_), bytes_[kLengthAt]};
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
    if (!ownsBlock()) {
        return;
    }
    if (kind() >= Kind::array) {
        releaseLargeBlock();
    } else if (load<TextBlock*>()->references.fetch_sub(1, std::memory_order_acq_rel) == 1) {
        freeTextBlock();
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
    if (isSame(other)) {
        return *this;
    }
    // By way of a copy: the other may lie in a block that only this one holds.
    return *this = Value(other);
}

} // namespace tamblo
