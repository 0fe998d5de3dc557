#pragma once

#include "base/TextBuffer.h"

#include <cstdint>
#include <string_view>

namespace tamblo {

/// Appends fields in the Protocol Buffers wire format (see `ProtoReader`), each with its key.
class ProtoWriter {
public:
    explicit ProtoWriter(TextBuffer& out) noexcept : out_(out) {}

    void unsigned64(std::uint32_t field, std::uint64_t value);
    /// A negative number takes ten bytes, as one of 64 bits would.
    void signed32(std::uint32_t field, std::int32_t value);
    void string(std::uint32_t field, std::string_view bytes);

private:
    void key(std::uint32_t field, std::uint8_t wireType);
    void varint(std::uint64_t value);

    TextBuffer& out_;
};

} // namespace tamblo
