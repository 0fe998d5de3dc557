#include "service/ClientUptime.h"

#include "platform/Platform.h"
#include "service/ZRReportingClientServerInstance.h"
#include "util/Log.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

namespace tamblo {

namespace {

/// Seconds from the start to now, either way round; −1 without a start.
Value uptimeSince(const std::optional<WallTime>& start, pid_t processIdentifier, const std::string& name) {
    if (!start) {
        log::standard(ZRReportingServiceDelegateCategory(),
                      "clientStartDate is nil. clientpid={} clientprocessname={}", processIdentifier, name);
        return -1;
    }
    const WallTime now = platform().clock.now();
    if (*start > now) {
        // The text says "past" for a start in the future; those who search the log know it so.
        log::standard(ZRReportingServiceDelegateCategory(),
                      "clientStartDate is in the past. clientpid={} clientprocessname={}", processIdentifier,
                      name);
    }
    return std::chrono::duration<double>(std::chrono::abs(now - *start)).count();
}

} // namespace

void reportClientUptime(const ClientRef& client, pid_t processIdentifier) {
    if (client != nullptr && !client->claimUptimeReport()) {
        return;
    }
    const std::optional<std::string> knownName =
        client != nullptr ? client->clientProcessName() : std::nullopt;
    const std::string name = knownName.value_or("unknown");
    const std::optional<WallTime> start = client != nullptr ? client->clientStartDate() : std::nullopt;
    const Value uptime = uptimeSince(start, processIdentifier, name);
    log::standard(ZRReportingServiceDelegateCategory(),
                  "invalidationHandler: connection exited process={} uptime_sec={}", name,
                  uptime.integerValue());
    if (!knownName) {
        log::standard(ZRReportingServiceDelegateCategory(), "clientProcessName is nil. clientpid={}",
                      processIdentifier);
        return;
    }
    platform().analyticsEvents.sendEventLazy("com.vandra.tamblo.zrreportingclientuptime", [&] {
        return Dictionary{{"processName", name}, {"seconds", uptime}};
    });
}

} // namespace tamblo
