#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>

namespace tamblo {

/// What one client has asked for so far, and what that has cost. Each number is written by one thread at a
/// time, and may be read by any.
class RequestTally {
public:
    using Time = std::chrono::steady_clock::time_point;

    // The connection's thread.
    void addReceived(std::uint64_t bytes) noexcept { add(bytes_, bytes); }
    void addRequest() noexcept { add(requests_, 1); }
    /// What is queued from now on, until the end, are requests that were read at this time.
    void beginArrival(Time time) noexcept { arrival_.store(stampOf(time), std::memory_order_relaxed); }
    void endArrival() noexcept { arrival_.store(0, std::memory_order_relaxed); }
    void addReadingTime(std::chrono::nanoseconds time) noexcept {
        add(readingNanoseconds_, static_cast<std::uint64_t>(time.count()));
    }
    // The server queue.
    void addTime(std::chrono::nanoseconds time) noexcept {
        add(nanoseconds_, static_cast<std::uint64_t>(time.count()));
    }
    void addMessage() noexcept { add(messages_, 1); }

    [[nodiscard]] std::uint64_t bytes() const noexcept { return bytes_.load(std::memory_order_relaxed); }
    [[nodiscard]] std::uint64_t requests() const noexcept {
        return requests_.load(std::memory_order_relaxed);
    }
    [[nodiscard]] std::uint64_t messages() const noexcept {
        return messages_.load(std::memory_order_relaxed);
    }
    /// Of the processor, on both.
    [[nodiscard]] std::chrono::nanoseconds time() const noexcept {
        return std::chrono::nanoseconds(nanoseconds_.load(std::memory_order_relaxed) +
                                        readingNanoseconds_.load(std::memory_order_relaxed));
    }

    /// A time in microseconds, of which so many bits are kept that the difference of two tells an hour; 0 is
    /// none.
    using Stamp = std::uint32_t;
    [[nodiscard]] static Stamp stampOf(Time time) noexcept {
        const auto since = std::chrono::duration_cast<std::chrono::microseconds>(time.time_since_epoch());
        return static_cast<Stamp>(since.count()) | 1U;
    }
    /// That of what is queued now.
    [[nodiscard]] Stamp arrival() const noexcept { return arrival_.load(std::memory_order_relaxed); }
    [[nodiscard]] static std::chrono::microseconds between(Stamp earlier, Stamp later) noexcept {
        // A time that was read earlier on another thread may be the later one.
        const auto difference = static_cast<std::int32_t>(later - earlier);
        return std::chrono::microseconds(difference < 0 ? 0 : difference);
    }

private:
    static void add(std::atomic<std::uint64_t>& number, std::uint64_t more) noexcept {
        number.store(number.load(std::memory_order_relaxed) + more, std::memory_order_relaxed);
    }

    std::atomic<std::uint64_t> bytes_{0};
    std::atomic<std::uint64_t> requests_{0};
    std::atomic<std::uint64_t> messages_{0};
    std::atomic<std::uint64_t> nanoseconds_{0};
    std::atomic<std::uint64_t> readingNanoseconds_{0};
    std::atomic<Stamp> arrival_{0};
};

} // namespace tamblo
