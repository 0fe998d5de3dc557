#pragma once

#include "base/Mutex.h"
#include "platform/Counters.h"
#include "platform/LogOrigin.h"
#include "platform/StructuredLog.h"
#include "platform/WorkQueue.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace tamblo {

/// A serial queue for work that takes its time, made with the first piece, on which only so many pieces may
/// wait, and only so many of one user's (`LogOrigin`), so that a user who asks for many leaves room for the
/// others: those beyond are dropped and counted. That is one error line when it begins and one, with the
/// count, once no piece waits any more. Member of a platform service, which outlives the queues; any thread.
class LimitedQueue {
public:
    struct Limit {
        std::size_t waiting;   ///< besides the piece that runs
        std::size_t ofUser;    ///< of those
        std::string_view what; ///< the pieces' name in the log: "stack captures"
        std::string_view categoryCode;
        counters::Counter counted; ///< of what is dropped
    };

    /// The limit's texts must be constants.
    LimitedQueue(WorkQueues& workQueues, std::string label, Limit limit, StructuredLog& log)
        : limit_(limit), label_(std::move(label)), workQueues_(workQueues), log_(log) {}

    void post(Work work) TAMBLO_EXCLUDES(mutex_);

private:
    using User = std::optional<uid_t>; ///< none: the service itself
    void begin(User user) TAMBLO_EXCLUDES(mutex_);

    const Limit limit_;
    const std::string label_;
    WorkQueues& workQueues_;
    StructuredLog& log_;

    Mutex mutex_;
    std::size_t waiting_ TAMBLO_GUARDED_BY(mutex_) = 0;
    std::map<User, std::size_t> waitingOf_ TAMBLO_GUARDED_BY(mutex_); ///< each user's, unless none
    std::uint64_t dropped_ TAMBLO_GUARDED_BY(mutex_) = 0;             ///< since none waited
    std::unique_ptr<SerialQueue> queue_ TAMBLO_GUARDED_BY(mutex_);
};

} // namespace tamblo
