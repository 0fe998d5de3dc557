#pragma once

#include "Bench.h"
#include "Payloads.h"

#include <cstddef>
#include <string_view>
#include <vector>

namespace tamblo::bench {

/// A session that holds many messages when it is stopped.
struct LargeSession {
    std::size_t messages = 0;
    double messagesPerSecond = 0; ///< by the reporter's clock; the last one is of the present
    Message (*make)(std::size_t number) = nullptr;
    /// The general names of the summaries that are derived: "Volume.Summary".
    std::vector<std::string_view> summaries = {};
};

/// What one stop costs, and what it derives.
struct LargeStop {
    double cpuMilliseconds = 0;        ///< of the service, until it has nothing left to do
    double cpuMillisecondsOfReply = 0; ///< until the reply
    double wallMilliseconds = 0;       ///< likewise
    std::vector<std::size_t> summaries;
};

/// Each starts a service of its own, sends the messages and waits until all of them are in the sinks.
[[nodiscard]] LargeStop measureLargeStop(const ServiceProcess::Settings& settings,
                                         const LargeSession& session);
/// Milliseconds of each round trip that another client makes, one after the other.
struct OthersWaits {
    std::vector<double> before;     ///< with nothing else to do for the service
    std::vector<double> meanwhile;  ///< from the stop's request to its reply
    std::vector<double> afterwards; ///< while the service does what it has put off
};
/// Adds those of one stop.
void measureOthersWaits(const ServiceProcess::Settings& settings, const LargeSession& session,
                        OthersWaits& waits);

/// Sets the figures of both in a row, with the targets that a stop has: how much of the service's processor
/// time it takes, and how long another client waits.
void setLargeStop(ResultRow& row, const std::vector<LargeStop>& stops, const OthersWaits& waits,
                  double mostCpuMilliseconds);

} // namespace tamblo::bench
