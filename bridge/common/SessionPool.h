#pragma once

#include "bridge/common/StreamSession.h"
#include "bridge/common/Time.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <list>
#include <optional>
#include <unordered_map>

namespace tamblo::bridge {

/// The sessions that there are: one for each stream that lives, by its key, and those whose stream has ended.
/// These wait a grace time for another stream of the same application, direction and service type, and go on
/// with that.
///
/// The loop's thread.
class SessionPool final : public Timed {
public:
    using Key = std::uint64_t;

    static constexpr std::chrono::seconds kGrace{4};
    /// Sessions at a time; a stream beyond that is not reported, unless it changes when others have ended.
    static constexpr std::size_t kMostSessions = 2048;

    SessionPool(Reporter& reporter, const Clock& clock) : reporter_(reporter), clock_(clock) {}

    [[nodiscard]] const std::unordered_map<Key, StreamSession>& live() const noexcept { return live_; }
    [[nodiscard]] bool contains(Key stream) const { return live_.contains(stream); }
    /// The live stream's; nothing for another one.
    [[nodiscard]] StreamSession* find(Key stream);
    /// The same for a stream that may be new: then one that waits, or another; nothing when there are too
    /// many.
    [[nodiscard]] StreamSession* sessionFor(Key stream, const StreamKind& kind);
    /// The stream has gone.
    void leave(Key stream, const Moment& at);

    /// The end of grace times.
    [[nodiscard]] std::optional<SteadyTime> due() const override;
    void run() override;

    /// The sessions have gone with the service; those that live are to be begun anew.
    void forget();
    void endAll();

    /// A stream's session, to report of it what goes wrong, or has gone wrong just before its end;
    /// `kNoSession` while there is none.
    [[nodiscard]] SessionID idOf(Key stream) const noexcept;
    [[nodiscard]] std::size_t count() const noexcept { return live_.size() + waiting_.size(); }
    /// How often a stream was not reported, as there were too many.
    [[nodiscard]] std::uint64_t leftOut() const noexcept { return leftOut_; }

private:
    /// A session between two streams.
    struct Waiting {
        StreamSession session;
        Key stream; ///< the one that has ended
        SteadyTime until;
    };

    Reporter& reporter_;
    const Clock& clock_;
    std::unordered_map<Key, StreamSession> live_;
    std::list<Waiting> waiting_; ///< the one that waits longest comes first
    std::uint64_t leftOut_ = 0;
};

} // namespace tamblo::bridge
