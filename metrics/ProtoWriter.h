#pragma once

#include "base/TextBuffer.h"

#include <bit>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace tamblo {

/// Appends fields in the Protocol Buffers wire format, each with its key:
///
///   field    key value
///   key      varint: field number << 3 | wire type
///   value    by wire type: 0 varint, 1 eight bytes, 2 varint length and that many bytes,
///            3 fields up to the key of the same number with wire type 4, 5 four bytes
///   varint   groups of seven bits, the lowest first; the top bit says that another follows
class ProtoWriter {
public:
    explicit ProtoWriter(TextBuffer& out) noexcept : out_(out) {}

    void unsigned64(std::uint32_t field, std::uint64_t value) {
        varint(std::uint64_t{field} << 3U);
        varint(value);
    }
    /// A negative number takes ten bytes, as one of 64 bits would.
    void signed32(std::uint32_t field, std::int32_t value) {
        unsigned64(field, static_cast<std::uint64_t>(std::int64_t{value}));
    }
    void double64(std::uint32_t field, double value) {
        varint(std::uint64_t{field} << 3U | 1U);
        for (auto bits = std::bit_cast<std::uint64_t>(value), i = std::uint64_t{0}; i != 8; ++i) {
            out_.append(static_cast<char>(bits >> 8 * i));
        }
    }
    void string(std::uint32_t field, std::string_view bytes) {
        beginNested(field, bytes.size());
        out_.append(bytes);
    }
    /// What stands before a message in a stream of them.
    void length(std::size_t bytes) { varint(bytes); }
    /// A message within this one, of which so many bytes follow.
    void beginNested(std::uint32_t field, std::size_t bytes) {
        varint(std::uint64_t{field} << 3U | 2U);
        varint(bytes);
    }
    /// The bytes that a varint takes.
    [[nodiscard]] static constexpr std::size_t varintSize(std::uint64_t value) noexcept {
        constexpr std::size_t kBits = 7;
        return (static_cast<std::size_t>(std::bit_width(value | 1U)) + kBits - 1) / kBits;
    }

private:
    void varint(std::uint64_t value) {
        for (; value >= 0x80; value >>= 7U) {
            out_.append(static_cast<char>(value | 0x80U));
        }
        out_.append(static_cast<char>(value));
    }

    TextBuffer& out_;
};

} // namespace tamblo
