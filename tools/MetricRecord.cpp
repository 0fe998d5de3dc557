#include "tools/MetricRecord.h"

#include "base/Format.h"
#include "base/Utf8.h"

#include <cstdint>
#include <string_view>

namespace tamblo::tools {

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
