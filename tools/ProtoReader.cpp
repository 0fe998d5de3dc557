#include "tools/ProtoReader.h"

namespace tamblo::tools {

std::uint64_t ProtoReader::readVarint() noexcept {
    constexpr unsigned longest = 10;
    std::uint64_t value = 0;
    for (unsigned i = 0; i < longest; ++i) {
        if (hasError_ || atEnd()) {
            hasError_ = true;
            return 0;
        }
        const std::uint8_t byte = bytes_[position_++];
        value |= static_cast<std::uint64_t>(byte & 0x7FU) << (7 * i);
        if ((byte & 0x80U) == 0) {
            return value;
        }
    }
    return 0;
}

std::string_view ProtoReader::readString() noexcept {
    const std::uint64_t length = readVarint();
    const std::size_t start = position_;
    if (!skipBytes(length)) {
        return {};
    }
    const auto bytes = bytes_.subspan(start, position_ - start);
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

ProtoReader::Key ProtoReader::readKey() noexcept {
    const std::uint64_t key = readVarint();
    return {.field = key >> 3U, .wireType = static_cast<std::uint8_t>(key & 7U)};
}

bool ProtoReader::skipValue(const Key& key, int depth) noexcept {
    switch (key.wireType) {
    case kVarint:
        (void)readVarint();
        return !hasError_;
    case kEightBytes:
        return skipBytes(8);
    case kLengthDelimited:
        return skipBytes(readVarint());
    case kStartGroup:
        return depth > 0 && skipGroup(key.field, depth - 1);
    case kFourBytes:
        return skipBytes(4);
    default:
        return false;
    }
}

bool ProtoReader::skipGroup(std::uint64_t field, int depth) noexcept {
    while (true) {
        const Key key = readKey();
        if (hasError_) {
            return false;
        }
        if (key.wireType == kEndGroup) {
            return key.field == field;
        }
        if (!skipValue(key, depth)) {
            return false;
        }
    }
}

bool ProtoReader::skipBytes(std::uint64_t count) noexcept {
    if (hasError_ || count > bytes_.size() - position_) {
        hasError_ = true;
        return false;
    }
    position_ += static_cast<std::size_t>(count);
    return true;
}

} // namespace tamblo::tools
