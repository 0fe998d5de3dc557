#pragma once

#include "metrics/ProtoWriter.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

namespace tamblo::qmxmetrics {

/// The number of the metric whose records these are.
inline constexpr std::uint32_t kAudioIssueMetric = 0x005B0003;

/// The metric record of one detected audio issue, a Protocol Buffers message (proto2).
/// `packaging/audio_issue_detected.proto` describes it for other programs.
///
/// Only the timestamp may be absent, which is something else than 0: the other fields are always written,
/// also when they are empty or 0.
struct AudioIssueDetected {
    enum Field : std::uint32_t { kTimestamp = 1, kDuration, kIssuetype, kNode, kRtaidclient };

    std::optional<std::uint64_t> timestamp;
    std::int32_t duration = 0;
    std::string issuetype;
    std::string node;
    std::string rtaidclient;

    /// In the order of the field numbers.
    void writeTo(ProtoWriter& writer) const;

    [[nodiscard]] bool operator==(const AudioIssueDetected& other) const noexcept = default;
};

void swap(AudioIssueDetected& first, AudioIssueDetected& second) noexcept;
/// Equal records have equal values. For sets and tables of records.
[[nodiscard]] std::size_t hash_value(const AudioIssueDetected& record) noexcept;

} // namespace tamblo::qmxmetrics
