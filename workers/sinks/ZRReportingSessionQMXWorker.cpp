#include "workers/sinks/ZRReportingSessionQMXWorker.h"

#include "metrics/AudioIssueDetected.h"
#include "util/AudioEvents.h"
#include "util/Log.h"
#include "util/MessageKeys.h"

namespace tamblo {

namespace {

/// The value of the key, or nothing, which is logged.
const Value* wanted(const Dictionary& payload, std::string_view key) {
    const Value* value = payload.find(key);
    if (value == nullptr) {
        log::error(ZRReportingQMXLogCategory(), "Failed to get {} for AudioIssueDetected", key);
    }
    return value;
}

void readText(std::string& text, const Dictionary& payload, std::string_view key) {
    if (const Value* value = wanted(payload, key)) {
        appendText(text, *value);
    }
}

qmxmetrics::AudioIssueDetected recordOf(const Dictionary& payload) {
    qmxmetrics::AudioIssueDetected record;
    readText(record.issuetype, payload, kIssueTypeKey);
    readText(record.rtaidclient, payload, "rtaid_client");
    readText(record.node, payload, "node");
    if (const Value* seconds = wanted(payload, "any_channel_silence_seconds")) {
        // The low half, should a number be that large.
        record.duration = static_cast<std::int32_t>(seconds->integerValue());
    }
    return record;
}

} // namespace

void ZRReportingSessionQMXWorker::handleMessage(const MessageRef& message) {
    if (message == nullptr || message->type() != AudioEventTypeIssueDetector) {
        return;
    }
    TextBuffer bytes;
    ProtoWriter writer(bytes);
    recordOf(message->payload()).writeTo(writer);
    platform().diagnosticsMetrics->SubmitMetricRecord(qmxmetrics::kAudioIssueMetric, bytes.bytes());
}

} // namespace tamblo
