#pragma once

#include "base/Dictionary.h"
#include "bridge/common/Time.h"
#include "client/Vocabulary.h"

#include <cstdint>
#include <string>

namespace tamblo::bridge {

using client::EventCategory;
using client::EventKind;
using client::EventType;
using client::ServiceType;
using client::Subsystem;

/// A session of the reporting service, as long as the service is reached; never used for another one.
using SessionID = std::int64_t;
inline constexpr SessionID kNoSession = 0;

/// Where reports go. One thread, the loop's; nothing waits.
///
/// What is reported while the service is away is lost, which is meant: it tells of a time that nobody asked
/// about. When the service is back, its listeners say anew what goes on.
class Reporter {
public:
    virtual ~Reporter() = default;

    /// Whether anybody hears. Sessions can be begun only then.
    [[nodiscard]] virtual bool isReachable() const = 0;
    /// A started session; `kNoSession` while nobody hears.
    [[nodiscard]] virtual SessionID begin(ServiceType serviceType, const std::string& application) = 0;
    /// A message of a session, with its time. Nothing for a session that is gone.
    virtual void send(SessionID session, EventCategory category, EventType type, Dictionary payload,
                      WallTime at) = 0;
    /// Stops the session, which then derives its summaries, and destroys it.
    virtual void end(SessionID session) = 0;
};

/// Who reports, and has to know whether anybody hears.
class ReporterListener {
public:
    virtual ~ReporterListener() = default;
    /// The service can be reached, and knows of no sessions: those that go on are to be begun anew.
    virtual void reporterCame() = 0;
    /// The sessions have ended with the connection; the service has derived their summaries.
    virtual void reporterWent() = 0;
};

} // namespace tamblo::bridge
