#include "service/ClientUptime.h"

#include "service/ZRReportingClientServerInstance.h"
#include "util/Log.h"

#include <chrono>
#include <optional>
#include <string>

namespace tamblo {

namespace {

/// Seconds from the start to the end, either way round; −1 without a start.
Value uptimeBetween(const std::optional<WallTime>& start, WallTime end, pid_t processIdentifier,
                    const std::string& name) {
    if (!start) {
        log::standard(ZRReportingServiceDelegateCategory(),
                      "clientStartDate is nil. clientpid={} clientprocessname={}", processIdentifier, name);
        return -1;
    }
    if (*start > end) {
        // The text says "past" for a start in the future; those who search the log know it so.
        log::standard(ZRReportingServiceDelegateCategory(),
                      "clientStartDate is in the past. clientpid={} clientprocessname={}", processIdentifier,
                      name);
    }
    return std::chrono::duration<double>(std::chrono::abs(end - *start)).count();
}

} // namespace

void reportClientUptime(const Context& context, const ClientRef& client, pid_t processIdentifier,
                        WallTime end) {
    if (client != nullptr && !client->claimUptimeReport()) {
        return;
    }
    const std::optional<std::string> knownName =
        client != nullptr ? client->clientProcessName() : std::nullopt;
    const std::string name = knownName.value_or("unknown");
    const std::optional<WallTime> start = client != nullptr ? client->clientStartDate() : std::nullopt;
    const Value uptime = uptimeBetween(start, end, processIdentifier, name);
    log::standard(ZRReportingServiceDelegateCategory(),
                  "invalidationHandler: connection exited process={} uptime_sec={}", name,
                  uptime.integerValue());
    if (!knownName) {
        log::standard(ZRReportingServiceDelegateCategory(), "clientProcessName is nil. clientpid={}",
                      processIdentifier);
        return;
    }
    context.platform().analyticsEvents->sendEventLazy("com.vandra.tamblo.zrreportingclientuptime", [&] {
        return Dictionary{{"processName", name}, {"seconds", uptime}};
    });
}

} // namespace tamblo
