#pragma once

#include "platform/Clock.h"
#include "platform/PowerEventLog.h"
#include "platform/linux/sinks/AppendOnlyFile.h"

#include <string>

namespace tamblo {

/// The power-event log as a sink file, `power-events.jsonl`.
class LinuxPowerEventLog final : public PowerEventLog {
public:
    /// Clock and log must outlive it.
    LinuxPowerEventLog(const std::string& logsDirectory, const Clock& clock, StructuredLog& log,
                       FileOperations& operations = FileOperations::system())
        : clock_(clock), file_(logsDirectory + "/power-events.jsonl", "zrrp", log, operations) {}

    void postRegisteredPowerEvent(std::uint32_t subsystem, std::string_view eventName,
                                  const Dictionary& payload) override;
    /// What was recorded goes to the file.
    void flush() { file_.flush(); }

private:
    const Clock& clock_;
    AppendOnlyFile file_;
};

} // namespace tamblo
