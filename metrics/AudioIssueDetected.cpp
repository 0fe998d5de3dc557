#include "metrics/AudioIssueDetected.h"

#include <functional>
#include <utility>

namespace tamblo::qmxmetrics {

void AudioIssueDetected::writeTo(ProtoWriter& writer) const {
    if (timestamp) {
        writer.unsigned64(kTimestamp, *timestamp);
    }
    writer.signed32(kDuration, duration);
    writer.string(kIssuetype, issuetype);
    writer.string(kNode, node);
    writer.string(kRtaidclient, rtaidclient);
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
