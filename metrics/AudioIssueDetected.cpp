#include "metrics/AudioIssueDetected.h"

#include <functional>
#include <utility>

namespace tamblo::qmxmetrics {

namespace {

constexpr std::uint32_t kTimestamp = 1;
constexpr std::uint32_t kDuration = 2;
constexpr std::uint32_t kIssuetype = 3;
constexpr std::uint32_t kNode = 4;
constexpr std::uint32_t kRtaidclient = 5;

} // namespace

bool AudioIssueDetected::readFrom(ProtoReader& reader) {
    while (!reader.atEnd() && !reader.hasError()) {
        const ProtoReader::Key key = reader.readKey();
        if (reader.hasError() || key.wireType == ProtoReader::kEndGroup) {
            break;
        }
        if (key.field >= kTimestamp && key.field <= kRtaidclient) {
            readField(reader, key.field);
        } else if (!reader.skipValue(key)) {
            return false;
        }
    }
    return !reader.hasError();
}

/// A field is read as what it should be, whatever wire type its key names.
void AudioIssueDetected::readField(ProtoReader& reader, std::uint64_t field) {
    switch (field) {
    case kTimestamp:
        timestamp = reader.readVarint();
        break;
    case kDuration:
        duration = static_cast<std::int32_t>(static_cast<std::uint32_t>(reader.readVarint()));
        break;
    case kIssuetype:
        issuetype = reader.readString();
        break;
    case kNode:
        node = reader.readString();
        break;
    default:
        rtaidclient = reader.readString();
        break;
    }
}

void AudioIssueDetected::writeTo(ProtoWriter& writer) const {
    if (timestamp) {
        writer.unsigned64(kTimestamp, *timestamp);
    }
    writer.signed32(kDuration, duration);
    writer.string(kIssuetype, issuetype);
    writer.string(kNode, node);
    writer.string(kRtaidclient, rtaidclient);
}

void AudioIssueDetected::formatText(ProtoTextFormatter& formatter, std::string_view name) const {
    formatter.beginObject(name);
    formatter.signed32("duration", duration);
    formatter.string("issuetype", issuetype);
    formatter.string("node", node);
    formatter.string("rtaidclient", rtaidclient);
    if (timestamp) {
        formatter.unsigned64("timestamp", *timestamp);
    }
    formatter.endObject();
}

bool AudioIssueDetected::operator==(const AudioIssueDetected& other) const noexcept {
    return timestamp == other.timestamp && duration == other.duration && issuetype == other.issuetype &&
           node == other.node && rtaidclient == other.rtaidclient;
}

void swap(AudioIssueDetected& first, AudioIssueDetected& second) noexcept {
    std::swap(first, second);
}

std::size_t hash_value(const AudioIssueDetected& record) noexcept {
    const std::hash<std::string> hash;
    return static_cast<std::size_t>(record.timestamp.value_or(0)) ^
           static_cast<std::size_t>(record.duration) ^ hash(record.issuetype) ^ hash(record.node) ^
           hash(record.rtaidclient);
}

} // namespace tamblo::qmxmetrics
