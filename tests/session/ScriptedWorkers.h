#pragma once

#include "session/WorkerClass.h"
#include "session/ZRReportingSession.h"

#include <functional>
#include <map>
#include <mutex>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo {

/// What the workers of the tests' own class list do, and what they saw. The classes, in order, with the roles
/// and answers that the real ones have in all combinations:
///
///     Only (worker only)   Producer   Both (producer, consumer)   Init (consumer, start on init, single
///     message) Redundant (consumer, start on init, takes redundant messages)   Absent (no factory, start on
///     init) Late (consumer, single message)
///
/// "Only" and "Redundant" implement no start; the others answer true unless told otherwise.
class WorkerScript {
public:
    using Act = std::function<void(ZRReportingSession&)>;

    /// The script of the process.
    static WorkerScript& current();
    void reset();

    /// Classes whose factory refuses, and whose start answers false.
    std::set<std::string, std::less<>> refusing;
    std::set<std::string, std::less<>> notStarting;
    /// What a class's worker does in its stop.
    std::map<std::string, Act, std::less<>> atStop;

    void saw(std::string event);
    /// "start Late", "stop Late", "message Late 14/11" since the last call.
    [[nodiscard]] std::vector<std::string> take();
    [[nodiscard]] std::size_t count(std::string_view event) const;

private:
    mutable std::mutex mutex_;
    std::vector<std::string> events_;
};

} // namespace tamblo
