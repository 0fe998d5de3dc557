#pragma once

#include "metrics/AudioIssueDetected.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace tamblo::tools {

/// Reads the Protocol Buffers wire format (see `ProtoWriter`) from bytes that nobody vouches for: a cursor
/// that never leaves them, and that stays at its first error.
class ProtoReader {
public:
    explicit ProtoReader(std::span<const std::uint8_t> bytes) noexcept : bytes_(bytes) {}
    ProtoReader(const ProtoReader&) = delete;
    ProtoReader& operator=(const ProtoReader&) = delete;

    [[nodiscard]] std::size_t position() const noexcept { return position_; }
    [[nodiscard]] bool atEnd() const noexcept { return position_ == bytes_.size(); }
    /// Set for good when the bytes end before what is read does.
    [[nodiscard]] bool hasError() const noexcept { return hasError_; }

    /// 0 after an error. A varint of more than ten bytes reads as 0, too, which is no error: its first ten
    /// bytes are then behind the cursor.
    [[nodiscard]] std::uint64_t readVarint() noexcept;
    /// A length and that many bytes, in place; none after an error.
    [[nodiscard]] std::string_view readString() noexcept;

    struct Key {
        std::uint64_t field = 0;
        std::uint8_t wireType = 0;
    };
    [[nodiscard]] Key readKey() noexcept;
    /// Steps over the value of the key that was just read. False for one that is cut short, of a wire type
    /// that does not exist, or a group that is not closed by its own number or holds others too deeply.
    [[nodiscard]] bool skipValue(const Key& key) noexcept { return skipValue(key, kMaximumDepth); }

    static constexpr std::uint8_t kVarint = 0;
    static constexpr std::uint8_t kEightBytes = 1;
    static constexpr std::uint8_t kLengthDelimited = 2;
    static constexpr std::uint8_t kStartGroup = 3;
    static constexpr std::uint8_t kEndGroup = 4;
    static constexpr std::uint8_t kFourBytes = 5;
    /// Groups within groups; the usual limit of readers of this format.
    static constexpr int kMaximumDepth = 100;

private:
    [[nodiscard]] bool skipValue(const Key& key, int depth) noexcept;
    [[nodiscard]] bool skipGroup(std::uint64_t field, int depth) noexcept;
    bool skipBytes(std::uint64_t count) noexcept;

    const std::span<const std::uint8_t> bytes_;
    std::size_t position_ = 0;
    bool hasError_ = false;
};

/// Adds what the bytes say to what the record says already. False when they are cut short or cannot be
/// understood; what was read before that stays. A field's end-group key ends the record.
[[nodiscard]] bool readRecord(ProtoReader& reader, qmxmetrics::AudioIssueDetected& record);

/// Appends the record in the Protocol Buffers text format, one field a line. Texts that are UTF-8 keep their
/// characters; in others, every byte that is not ASCII is escaped.
void appendRecordText(std::string& out, const qmxmetrics::AudioIssueDetected& record);

} // namespace tamblo::tools
