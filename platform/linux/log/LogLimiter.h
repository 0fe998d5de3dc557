#pragma once

#include "base/Mutex.h"
#include "platform/ClientIdentity.h"
#include "platform/StructuredLog.h"

#include <array>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <vector>

namespace tamblo {

/// How many lines clients may cause in a second: so many of each kind for each client, and so many of all
/// kinds for all clients of a user together. Errors have a share of their own, so that a stream of others
/// hides none.
///
/// What is refused is counted by kind, and handed out to be told once the second is over. A user's second
/// begins with its first line after the one before; no timer runs. The tables have fixed sizes: users beyond
/// those that fit share a place, and so do a user's kinds and clients. Owned by the log; any thread, the lock
/// is held for a look through a table.
class LogLimiter {
public:
    using Time = std::chrono::steady_clock::time_point;

    static constexpr std::chrono::seconds kPeriod{1};
    static constexpr unsigned kLinesOfKind = 10;
    static constexpr unsigned kLinesOfUser = 40;  ///< of the levels below error
    static constexpr unsigned kErrorsOfUser = 20; ///< and faults
    static constexpr std::size_t kUsers = 32;     ///< who log within the same second
    static constexpr std::size_t kTallies = 64;   ///< of one user in a second: more than lines are written

    /// Lines of one kind that were not admitted, of one client or of all of a user.
    struct LeftOut {
        LogKind kind;
        ClientIdentity last; ///< who would have caused the last of them
        std::uint64_t lines = 0;
    };

    LogLimiter() { users_.reserve(kUsers); }

    [[nodiscard]] bool admits(ClientIdentity client, const LogKind& kind, Time now) noexcept
        TAMBLO_EXCLUDES(mutex_);
    /// Whether there is anything to take, now or later. Costs one load.
    [[nodiscard]] bool hasLeftOut() const noexcept { return leftOut_.load(std::memory_order_relaxed) != 0; }
    /// Takes out what was left out of one kind in a second that is over; nothing when there is none.
    [[nodiscard]] std::optional<LeftOut> takeLeftOut(Time now) noexcept TAMBLO_EXCLUDES(mutex_);

private:
    struct Tally {
        LeftOut leftOut;
        pid_t process = 0;
        unsigned written = 0; ///< in this second
    };
    struct User {
        uid_t user;
        Time began;
        unsigned lines = 0, errors = 0; ///< written in this second
        bool isDue = false;             ///< of an earlier second, something is left to be told
        std::size_t tallied = 0;
        std::array<Tally, kTallies> tallies;
    };

    [[nodiscard]] User& userOf(uid_t user, Time now) noexcept TAMBLO_REQUIRES(mutex_);
    [[nodiscard]] static Tally& tallyOf(User& user, pid_t process, const LogKind& kind) noexcept;
    [[nodiscard]] static LeftOut takeAllLike(const LogKind& kind, User& user) noexcept;
    static void beginPeriod(User& user, Time now) noexcept;

    Mutex mutex_;
    std::vector<User> users_ TAMBLO_GUARDED_BY(mutex_);
    std::atomic<std::uint64_t> leftOut_{0}; ///< lines, of all
};

} // namespace tamblo
