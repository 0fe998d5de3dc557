#include "platform/linux/Health.h"

#include "base/NumberText.h"
#include "os/ServiceManager.h"

#include <cstdlib>
#include <utility>

#include <unistd.h>

namespace tamblo {

namespace {

constexpr std::chrono::seconds kTellingInterval{1};

std::optional<long> environmentNumber(const char* name) {
    const char* const text = std::getenv(name);
    return text != nullptr ? parseNumber<long>(text) : std::nullopt;
}

/// The watchdog's period, when it is meant for this process.
std::optional<std::chrono::microseconds> watchdogPeriod() {
    const auto process = environmentNumber("WATCHDOG_PID");
    const auto period = environmentNumber("WATCHDOG_USEC");
    if (!period || *period <= 0 || (process && *process != ::getpid())) {
        return std::nullopt;
    }
    return std::chrono::microseconds(*period);
}

} // namespace

Health::Health(EventLoop& loop, Status status)
    : loop_(loop),
      status_(std::move(status)),
      isManaged_(std::getenv("NOTIFY_SOCKET") != nullptr),
      period_(watchdogPeriod()) {}

void Health::watch(SerialQueue& serverQueue) {
    if (isManaged_ && period_) {
        giveSign(serverQueue);
    }
    update();
}

void Health::giveSign(SerialQueue& serverQueue) {
    // From the loop to the queue and back: the sign that follows shows that both are alive.
    serverQueue.post([this, &serverQueue] {
        loop_.post([this, &serverQueue] {
            tellNews(); // such as an outage that no batch of the server queue has told of
            notifyServiceManager("WATCHDOG=1");
            loop_.callAfter(std::chrono::duration_cast<std::chrono::milliseconds>(*period_ / 2),
                            [this, &serverQueue] { giveSign(serverQueue); });
        });
    });
}

void Health::update() {
    if (isManaged_ && !isTellingDue_.exchange(true)) {
        loop_.post([this] {
            loop_.callAfter(kTellingInterval, [this] {
                isTellingDue_ = false;
                tellNews();
            });
        });
    }
}

void Health::tellNews() {
    std::string now = status_();
    if (now != told_) {
        told_ = std::move(now);
        notifyServiceManager("STATUS=" + told_);
    }
}

} // namespace tamblo
