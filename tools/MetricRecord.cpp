#include "tools/MetricRecord.h"

#include "base/Format.h"
#include "base/Utf8.h"

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

namespace {

using qmxmetrics::AudioIssueDetected;

/// A field is read as what it should be, whatever wire type its key names.
void readField(ProtoReader& reader, std::uint64_t field, AudioIssueDetected& record) {
    switch (field) {
    case AudioIssueDetected::kTimestamp:
        record.timestamp = reader.readVarint();
        break;
    case AudioIssueDetected::kDuration:
        record.duration = static_cast<std::int32_t>(static_cast<std::uint32_t>(reader.readVarint()));
        break;
    case AudioIssueDetected::kIssuetype:
        record.issuetype = reader.readString();
        break;
    case AudioIssueDetected::kNode:
        record.node = reader.readString();
        break;
    default:
        record.rtaidclient = reader.readString();
        break;
    }
}

void appendEscaped(std::string& out, char character, bool keepsNonAscii) {
    constexpr std::string_view plain = "\n\r\t\"'\\";
    constexpr std::string_view letters = "nrt\"'\\";
    const auto byte = static_cast<unsigned char>(character);
    if (const std::size_t known = plain.find(character); known != std::string_view::npos) {
        out += '\\';
        out += letters[known];
    } else if (byte < 0x20 || byte == 0x7F || (byte >= 0x80 && !keepsNonAscii)) {
        out += '\\';
        for (const unsigned shift : {6U, 3U, 0U}) {
            out += static_cast<char>('0' + ((byte >> shift) & 7U));
        }
    } else {
        out += character;
    }
}

void appendField(std::string& out, std::string_view name, std::string_view bytes) {
    appendFormatted(out, "  {}: \"", name);
    const bool keepsNonAscii = isUtf8(bytes);
    for (const char character : bytes) {
        appendEscaped(out, character, keepsNonAscii);
    }
    out += "\"\n";
}

} // namespace

bool readRecord(ProtoReader& reader, AudioIssueDetected& record) {
    while (!reader.atEnd() && !reader.hasError()) {
        const ProtoReader::Key key = reader.readKey();
        if (reader.hasError() || key.wireType == ProtoReader::kEndGroup) {
            break;
        }
        if (key.field >= AudioIssueDetected::kTimestamp && key.field <= AudioIssueDetected::kRtaidclient) {
            readField(reader, key.field, record);
        } else if (!reader.skipValue(key)) {
            return false;
        }
    }
    return !reader.hasError();
}

void appendRecordText(std::string& out, const AudioIssueDetected& record) {
    appendFormatted(out, "AudioIssueDetected {\n  duration: {}\n", record.duration);
    appendField(out, "issuetype", record.issuetype);
    appendField(out, "node", record.node);
    appendField(out, "rtaidclient", record.rtaidclient);
    if (record.timestamp) {
        appendFormatted(out, "  timestamp: {}\n", *record.timestamp);
    }
    out += "}\n";
}

} // namespace tamblo::tools
