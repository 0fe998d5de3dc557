#pragma once

#include "base/Dictionary.h"
#include "base/UniqueFunction.h"
#include "platform/ClientIdentity.h"
#include "platform/Clock.h"
#include "platform/ZRReportingServiceProtocol.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// A client as it is shown to those who run the service.
struct ClientRow {
    std::uint64_t order = 0; ///< its place in the order of acceptance
    ClientIdentity identity;
    std::optional<std::string> processName;
    std::optional<WallTime> connected;
    std::uint64_t requests = 0;
    std::uint64_t bytes = 0; ///< received
    std::uint64_t messages = 0;
    std::chrono::nanoseconds time{0}; ///< of the processor, for its requests
    std::size_t sessions = 0;
    std::size_t startedSessions = 0;
    std::size_t retainedBytes = 0;
};

/// A session, likewise.
struct SessionRow {
    std::uint64_t clientOrder = 0; ///< 0: the single-message session
    ClientIdentity owner;
    std::optional<std::string> processName;
    ReporterID reporterID = 0;
    std::uint16_t serviceType = 0;
    std::string_view serviceName;
    std::string application;
    bool isStarted = false;
    bool isStopping = false;
    std::optional<WallTime> start;
    /// From the start to the stop, or to now; below zero where the clock was set back meanwhile.
    std::optional<std::chrono::nanoseconds> length;
    std::uint64_t messages = 0;       ///< that were sent to it
    std::uint64_t bytes = 0;          ///< of their values
    std::uint64_t recorded = 0;       ///< since the last stop
    std::uint64_t dropped = 0;        ///< of these, let go for a limit
    std::chrono::nanoseconds time{0}; ///< of the processor, for requests for it
    std::size_t retainedBytes = 0;
};

/// All that there is to show of a session.
struct SessionDetail {
    SessionRow row;
    Dictionary configuration;
    Dictionary previousValues;
    std::vector<std::string> workers;
};

/// What a user's clients hold together on the server queue.
struct UserRow {
    uid_t user = 0;
    std::size_t sessions = 0;
    std::size_t configurationBytes = 0;
    std::size_t retainedBytes = 0;
};

/// Whom the platform asks for the service's state, to show it. The answers come later, on some thread; those
/// with many rows are gathered in slices, between which the server queue does what clients ask for, so that
/// they show each row as it was when its slice came. Any thread; a question that is still open when the
/// service goes is not answered.
class StatusSource {
public:
    template <typename Answer> using Reply = UniqueFunction<void(Answer)>;

    virtual ~StatusSource() = default;
    virtual void clients(Reply<std::vector<ClientRow>> reply) = 0;
    virtual void sessions(Reply<std::vector<SessionRow>> reply) = 0;
    /// Of every client that has a session under the ID.
    virtual void session(ReporterID reporterID, Reply<std::vector<SessionDetail>> reply) = 0;
    virtual void users(Reply<std::vector<UserRow>> reply) = 0;
};

} // namespace tamblo
