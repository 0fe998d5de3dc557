#pragma once

#include "metrics/AudioIssueDetected.h"
#include "tools/ProtoReader.h"

#include <string>

namespace tamblo::tools {

/// Adds what the bytes say to what the record says already. False when they are cut short or cannot be
/// understood; what was read before that stays. A field's end-group key ends the record.
[[nodiscard]] bool readRecord(ProtoReader& reader, qmxmetrics::AudioIssueDetected& record);

/// Appends the record in the Protocol Buffers text format, one field a line. Texts that are UTF-8 keep their
/// characters; in others, every byte that is not ASCII is escaped.
void appendRecordText(std::string& out, const qmxmetrics::AudioIssueDetected& record);

} // namespace tamblo::tools
