#pragma once

#include "session/WorkerClass.h"
#include "session/ZRReportingSession.h"

#include <algorithm>
#include <functional>
#include <map>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

/// What the workers of the tests' own class list do, and what they saw. The classes, in order, have the roles
/// and answers of the real ones in all combinations: Only (worker only), Producer, Both (producer, consumer),
/// Init (consumer, start on init, single message), Redundant (consumer, start on init, takes redundant
/// messages), Absent (no factory, start on init), Late (consumer, single message). "Only" and "Redundant"
/// implement no start; the others answer true unless told otherwise.
class WorkerScript {
public:
    /// The script of the process.
    static WorkerScript& current();
    void reset() { *this = WorkerScript(); }

    /// Classes whose factory refuses, and whose start answers false.
    std::set<std::string> refusing;
    std::set<std::string> notStarting;
    /// What a class's worker does in its stop.
    std::map<std::string, std::function<void(ZRReportingSession&)>> atStop;

    void saw(std::string event) { events_.push_back(std::move(event)); }
    /// "start Late", "stop Late", "message Late 14/11" since the last call.
    [[nodiscard]] std::vector<std::string> take() { return std::exchange(events_, {}); }
    [[nodiscard]] std::size_t count(std::string_view event) const {
        return static_cast<std::size_t>(std::count(events_.begin(), events_.end(), event));
    }

private:
    std::vector<std::string> events_;
};

} // namespace tamblo
