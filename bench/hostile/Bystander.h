#pragma once

#include "../ChildProcess.h"
#include "SharedMemory.h"

#include <array>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace tamblo::bench {

/// A client of another user, in a process of its own, that does what clients do: it has a started session and
/// sends it one message at a time, each some 2 ms after the last one was answered. It waits for an answer for
/// a bounded time, and gives up with the first that does not come.
class Bystander {
public:
    enum class Phase : std::uint8_t { before, during, after };

    static constexpr std::int64_t kReporterID = 4'711'000'001;
    /// By which its lines are found: an unsigned number that counts from 1.
    static constexpr std::string_view kKey = "bystander";
    static constexpr std::chrono::seconds kLongestWait{30};

    explicit Bystander(const std::string& socketPath);

    /// Sends, from now on until `rest`, what counts to this phase.
    void send(Phase phase);
    /// Sends no more; returns once what was under way is answered or given up.
    void rest();

    /// Of every message of the phase; one that was given up has the longest wait.
    [[nodiscard]] std::vector<double> milliseconds(Phase phase) const;
    /// How many messages were answered, which are those with the numbers up to it.
    [[nodiscard]] std::uint64_t answered() const noexcept { return state_->answered; }
    [[nodiscard]] bool hasGivenUp() const noexcept { return state_->hasGivenUp; }
    /// Whether its process has ended otherwise, such as for want of a connection.
    [[nodiscard]] bool isLost() const;

private:
    static constexpr std::size_t kMostSamples = 200'000;

    struct Sample {
        float milliseconds;
        Phase phase;
    };
    struct State {
        std::atomic<bool> sends;
        std::atomic<Phase> phase;
        std::atomic<bool> isResting;
        std::atomic<bool> hasGivenUp;
        std::atomic<std::uint64_t> answered;
        std::atomic<std::size_t> count;
        std::array<Sample, kMostSamples> samples;
    };

    static void run(const std::string& socketPath, State& state);

    SharedMemory<State> state_;
    ChildProcess process_;
};

} // namespace tamblo::bench
