#pragma once

#include "base/Dictionary.h"
#include "base/KeySetCache.h"
#include "base/TextBuffer.h"
#include "base/Value.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace tamblo {

/// What is wrong with bytes that should be CBOR. The first two say that they are not well-formed (RFC 8949,
/// section 5.3.1); the others, that a well-formed item is none of the values that are accepted.
enum class CborError : std::uint8_t {
    none,
    truncated,
    malformed,
    tooDeep,
    nullValue,
    unsupportedTag,
    unsupportedSimple,
    keyNotText,
    duplicateKey,
    notUtf8,
    integerOutOfRange,
    // What the reader's limits forbid.
    tooManyEntries,
    keyTooLong,
    keysTooLong,
    tooLarge,
};

/// For people: "a map holds a key twice".
[[nodiscard]] std::string_view describe(CborError error) noexcept;

/// What a reader accepts at most. The bytes are those of the values in memory, about: an empty array is one
/// byte of CBOR, and sixty-four here.
struct CborLimits {
    std::size_t entries = static_cast<std::size_t>(-1); ///< of all maps together
    std::size_t keyBytes = static_cast<std::size_t>(-1);
    std::size_t bytesOfKeys = static_cast<std::size_t>(-1); ///< of all maps together
    std::size_t decodedBytes = static_cast<std::size_t>(-1);
};

/// Writes CBOR items in their shortest heads, definite lengths, maps in key order.
class CborWriter {
public:
    explicit CborWriter(TextBuffer& out) noexcept : out_(out) {}

    void arrayHead(std::uint64_t count) { head(4, count); }
    void mapHead(std::uint64_t count) { head(5, count); }
    void unsignedInteger(std::uint64_t value) { head(0, value); }
    void integer(std::int64_t value);
    void boolean(bool value) { out_.append(value ? '\xF5' : '\xF4'); }
    void null() { out_.append('\xF6'); }
    void text(std::string_view text);
    void value(const Value& value);
    void dictionary(const Dictionary& dictionary);

private:
    void head(unsigned major, std::uint64_t argument);

    TextBuffer& out_;
};

/// Reads CBOR (RFC 8949) that nobody vouches for: a cursor over bytes that it never leaves, that allocates
/// nothing from a declared count, and that stays at its first error. Definite and indefinite lengths are
/// accepted.
///
/// The values accepted are those that `Value` has: text, integers from −2^63 to 2^64−1, floats, booleans,
/// dates (tag 1), byte strings, arrays and maps with text keys, each key once; nesting to a depth of 32.
class CborReader {
public:
    static constexpr int kMaximumDepth = 32;

    enum class Type : std::uint8_t {
        unsignedInteger,
        negativeInteger,
        bytes,
        text,
        array,
        map,
        tag,
        simple,
        end
    };

    /// `decodedBefore` is what counts already of the same frame.
    explicit CborReader(std::span<const std::uint8_t> bytes, KeySetCache* keySets = nullptr,
                        const CborLimits& limits = {}, std::size_t decodedBefore = 0) noexcept
        : position_(bytes.data()),
          end_(bytes.data() + bytes.size()),
          keySets_(keySets),
          limits_(limits),
          decodedBytes_(decodedBefore) {}
    CborReader(const CborReader&) = delete;
    CborReader& operator=(const CborReader&) = delete;

    [[nodiscard]] CborError error() const noexcept { return error_; }
    [[nodiscard]] bool atEnd() const noexcept { return position_ == end_; }
    /// What the values that were read take, as the limits count it.
    [[nodiscard]] std::size_t decodedBytes() const noexcept { return decodedBytes_; }
    /// The type of the next item; `end` at the end of the bytes or after an error.
    [[nodiscard]] Type peek() const noexcept;
    [[nodiscard]] bool nextIsNull() const noexcept { return position_ != end_ && *position_ == 0xF6; }

    /// Each reads the next item when it is of that kind; otherwise leaves it and answers nothing, without an
    /// error.
    [[nodiscard]] std::optional<std::uint64_t> readUnsigned() noexcept;
    [[nodiscard]] std::optional<std::int64_t> readInteger() noexcept;
    /// A text that stands in the bytes themselves (definite length), UTF-8.
    [[nodiscard]] std::optional<std::string_view> readText() noexcept;
    [[nodiscard]] bool readNull() noexcept;

    /// The head of an array; its elements follow. `count` is what the head declares and is trusted for
    /// nothing; without it the length is indefinite. Ask `moreElements` before each element.
    struct ArrayHead {
        std::optional<std::uint64_t> count;
        std::uint64_t read = 0;
    };
    [[nodiscard]] std::optional<ArrayHead> readArrayHead() noexcept;
    [[nodiscard]] bool moreElements(ArrayHead& array) noexcept;

    /// The next item as a value; nothing after an error. `spare` is room for keys that are yet to be added to
    /// it.
    [[nodiscard]] std::optional<Value> readValue();
    [[nodiscard]] std::optional<Dictionary> readDictionary(std::size_t spare = 0);
    /// Steps over one well-formed item, whatever it is and however deep, acceptable as a value or not.
    bool skip();

private:
    static constexpr std::uint8_t kIndefinite = 31; ///< in a head's info: the length is not declared

    struct Head {
        Type major;
        std::uint8_t info;
        std::uint64_t argument;
    };

    bool fail(CborError error) noexcept;
    bool readHead(Head& head) noexcept;
    bool readLongHead(Head& head) noexcept;
    [[nodiscard]] bool takeShortText(std::string_view& text) noexcept;
    [[nodiscard]] bool takeOrdinary(Value& value);
    [[nodiscard]] bool takeKnownText(const Value& known, Value& value);
    bool readItem(Value& value, int depth);
    bool readSimple(const Head& head, Value& value) noexcept;
    bool readString(const Head& head, Value& value);
    bool readKey(std::string_view& key);
    bool takeBytes(const Head& head, std::string_view& bytes) noexcept;
    /// One definite piece of a text or byte string of indefinite length.
    bool takeChunk(Type major, std::string_view& chunk) noexcept;
    /// All of them; put together, those of a text have to be texts.
    bool takeChunks(Type major, std::string* bytes);
    bool readDate(const Head& head, Value& value);
    bool readArray(const Head& head, Value& value, int depth);
    bool readMap(const Head& head, Dictionary& dictionary, int depth, std::size_t spare);
    bool readEntries(const Head& head, int depth, std::uint64_t first);
    bool takeExpected(KeySetCache::Expected& expected, std::span<Value> values, int depth,
                      std::uint64_t& taken);
    [[nodiscard]] bool isNext(const std::uint8_t* bytes, std::size_t count) const noexcept;
    bool countEntry(std::size_t keyBytes) noexcept;
    bool makeDictionary(Dictionary& dictionary, std::size_t firstEntry, std::size_t spare, int depth);
    bool atBreak() noexcept;
    [[nodiscard]] MapEntries& entries() noexcept;
    /// Counts what a value takes, before it is made.
    bool charge(std::size_t bytes) noexcept {
        decodedBytes_ += bytes;
        return decodedBytes_ <= limits_.decodedBytes || fail(CborError::tooLarge);
    }

    const std::uint8_t* position_;
    const std::uint8_t* end_;
    KeySetCache* keySets_;
    const CborLimits limits_;
    std::size_t decodedBytes_ = 0;
    std::size_t entriesRead_ = 0;
    std::size_t keyBytesRead_ = 0;
    MapEntries ownEntries_; ///< without a cache
    CborError error_ = CborError::none;
};

} // namespace tamblo
