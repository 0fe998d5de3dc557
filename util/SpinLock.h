#pragma once

#include <atomic>
#include <thread>

namespace tamblo {

/// A lock of one byte, for objects of which there are a million and that two threads hardly ever want at
/// once. Held for the length of an assignment.
class SpinLock {
public:
    void lock() noexcept {
        while (taken_.exchange(true, std::memory_order_acquire)) {
            std::this_thread::yield();
        }
    }
    void unlock() noexcept { taken_.store(false, std::memory_order_release); }

private:
    std::atomic<bool> taken_{false};
};

} // namespace tamblo
