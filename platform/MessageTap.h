#pragma once

#include "base/Dictionary.h"
#include "platform/Clock.h"
#include "platform/ZRReportingServiceProtocol.h"

#include <atomic>
#include <cstdint>
#include <string_view>

namespace tamblo {

/// A message that a session has recorded, for as long as it is offered.
struct TappedMessage {
    /// Who made it: a client, or a worker amid the session's run; a worker at the session's stop; the session
    /// itself, of its start and stop.
    enum class Origin : std::uint8_t { sent, derived, session };

    ReporterID reporterID = 0;
    bool isSessionStarted = false;
    Origin origin = Origin::sent;
    std::string_view serviceName;
    std::uint32_t category = 0;
    std::uint16_t type = 0;
    const Dictionary& payload;
    WallTime time{};
};

/// Those who watch messages while they are recorded, and may miss some of them. A session asks `isOpen` for
/// each message and offers it only then, so that a service that nobody watches pays for one load.
class MessageTap {
public:
    virtual ~MessageTap() = default;
    [[nodiscard]] bool isOpen() const noexcept { return isOpen_.load(std::memory_order_relaxed); }
    /// On the server queue; waits for nobody. What is to be kept is copied.
    virtual void offer(const TappedMessage& message) = 0;

protected:
    /// From any thread.
    void setOpen(bool isOpen) noexcept { isOpen_.store(isOpen, std::memory_order_relaxed); }

private:
    std::atomic<bool> isOpen_{false};
};

/// Where nobody can watch.
class NoMessageTap final : public MessageTap {
public:
    void offer(const TappedMessage&) override {}
};

} // namespace tamblo
