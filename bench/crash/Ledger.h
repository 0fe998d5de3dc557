#pragma once

#include "SinkReader.h"

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>

namespace tamblo::bench {

inline constexpr std::size_t kClients = 8;

/// What each client has asked to be recorded, what of it was answered, and what of it was found in the sinks.
/// A record is known by its client and its number; a client numbers its records upwards, through all ends of
/// the service, and sends none twice. Clients note what they send and are answered, each of its own; the
/// driver notes what it finds, and judges, while no client is at work.
class Ledger {
public:
    /// By one client; more is not sent.
    static constexpr std::size_t kMostRecords = 8'000'000;

    /// A record's part: every fourth one makes a power event, too, under the same number.
    [[nodiscard]] static constexpr bool makesPowerEvent(std::uint64_t number) noexcept {
        return number % 4 == 0;
    }

    Ledger();

    void sent(std::size_t client, std::uint64_t number) noexcept;
    /// One that was under way while its sink had no room may be lost.
    void answered(std::size_t client, std::uint64_t number, bool mayBeLost) noexcept;
    [[nodiscard]] std::uint64_t lastSent(std::size_t client) const noexcept { return lastSent_[client]; }

    /// Notes one line of a sink, in the order in which they stand there.
    void found(Sink sink, const SinkRecord& record);

    struct Verdict {
        std::uint64_t records = 0;  ///< that were found
        std::uint64_t answered = 0; ///< that had to be
        std::uint64_t missing = 0;  ///< of those
        std::uint64_t excused = 0;  ///< answered and lost, while there was no room
        std::uint64_t strange = 0;  ///< twice, not in their order, or of what nobody sent
    };
    /// Of all that was sent since the last verdict, counted up from the first one on.
    const Verdict& judge();

private:
    static constexpr std::uint8_t kSent = 1, kAnswered = 2, kMayBeLost = 4, kFoundEvent = 8, kFoundPower = 16;

    [[nodiscard]] std::atomic<std::uint8_t>& stateOf(std::size_t client, std::uint64_t number) noexcept {
        return states_[client * kMostRecords + number];
    }

    std::unique_ptr<std::atomic<std::uint8_t>[]> states_;
    std::array<std::atomic<std::uint64_t>, kClients> lastSent_{};
    std::array<std::uint64_t, kClients> lastJudged_{};
    std::array<std::array<std::uint64_t, kClients>, 2> lastFound_{}; ///< by sink
    Verdict verdict_;
};

} // namespace tamblo::bench
