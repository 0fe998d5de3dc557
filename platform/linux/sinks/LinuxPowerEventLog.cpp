#include "platform/linux/sinks/LinuxPowerEventLog.h"

#include "platform/linux/sinks/SinkLine.h"

namespace tamblo {

void LinuxPowerEventLog::postRegisteredPowerEvent(std::uint32_t subsystem, std::string_view eventName,
                                                  const Dictionary& payload) {
    file_.append([&](TextBuffer& line) {
        SinkLine(line, clock_.now())
            .number("subsystem", subsystem)
            .text("event", eventName)
            .value("payload", payload);
    });
}

} // namespace tamblo
