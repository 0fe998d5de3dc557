#pragma once

#include "base/Dictionary.h"
#include "base/Mutex.h"
#include "platform/BugCaptureService.h"
#include "platform/Clock.h"

#include <chrono>
#include <cstdint>
#include <limits>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo {

/// What the bug-capture worker counts for one detector, and the thresholds at which the detector fires.
///
/// A detector's own, or shared by the detectors of a class in all sessions, for the life of the context.
/// Used on the thread that does the sessions' work, but for the identifier of the capture session: the
/// capture service answers on any thread.
class WorkerInstanceState {
public:
    /// Whether a detector that has seen an interesting message now is to fire.
    [[nodiscard]] bool isDue(WallTime now) const noexcept {
        const bool isLongEnough = interestThresholdCount != 0 ||
                                  now - interestFirstSeen.value_or(now) > interestThresholdDurationSeconds;
        return interestedCount >= interestThresholdCount && isLongEnough &&
               (firedCount == 0 || !oncePerSession);
    }
    /// Begins to count anew. What was fired stays.
    void resetInterest() noexcept {
        lastMessage.reset();
        interestFirstSeen.reset();
        interestedCount = 0;
    }

    // Any thread.
    [[nodiscard]] std::optional<std::string> currentZephSessionIdentifier() const {
        const MutexLock lock(mutex_);
        return currentZephSessionIdentifier_;
    }
    void setCurrentZephSessionIdentifier(std::string identifier) {
        const MutexLock lock(mutex_);
        currentZephSessionIdentifier_ = std::move(identifier);
    }

    /// At most once in the life of the state.
    bool oncePerSession = false;
    std::uint64_t interestThresholdCount = std::numeric_limits<std::uint64_t>::max();
    /// To be exceeded; only without a threshold of the count.
    std::chrono::duration<double> interestThresholdDurationSeconds{std::numeric_limits<double>::max()};

    // Since the last firing.
    std::uint64_t interestedCount = 0;
    std::optional<WallTime> interestFirstSeen;
    std::optional<Dictionary> lastMessage;

    std::uint64_t firedCount = 0;
    std::unique_ptr<GlarnReporter> symptomReporter; ///< of the latest firing

private:
    mutable Mutex mutex_;
    std::optional<std::string> currentZephSessionIdentifier_ TAMBLO_GUARDED_BY(mutex_);
};

/// The states that the detectors of a class share, in all sessions. On the thread that does their work.
class SharedWorkerInstanceStates {
public:
    /// The first detector of the class has it made.
    [[nodiscard]] const std::shared_ptr<WorkerInstanceState>&
    of(std::string_view detectorClassName, std::shared_ptr<WorkerInstanceState> (*makeState)()) {
        std::shared_ptr<WorkerInstanceState>& state = byClassName_[detectorClassName];
        if (state == nullptr) {
            state = makeState();
        }
        return state;
    }

private:
    std::map<std::string_view, std::shared_ptr<WorkerInstanceState>> byClassName_;
};

} // namespace tamblo
