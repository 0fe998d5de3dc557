#include "metrics/ProtoWriter.h"

#include "metrics/ProtoReader.h"

namespace tamblo {

void ProtoWriter::unsigned64(std::uint32_t field, std::uint64_t value) {
    key(field, ProtoReader::kVarint);
    varint(value);
}

void ProtoWriter::signed32(std::uint32_t field, std::int32_t value) {
    unsigned64(field, static_cast<std::uint64_t>(std::int64_t{value}));
}

void ProtoWriter::string(std::uint32_t field, std::string_view bytes) {
    key(field, ProtoReader::kLengthDelimited);
    varint(bytes.size());
    out_.append(bytes);
}

void ProtoWriter::key(std::uint32_t field, std::uint8_t wireType) {
    varint(std::uint64_t{field} << 3U | wireType);
}

void ProtoWriter::varint(std::uint64_t value) {
    for (; value >= 0x80; value >>= 7U) {
        out_.append(static_cast<char>(value | 0x80U));
    }
    out_.append(static_cast<char>(value));
}

} // namespace tamblo
