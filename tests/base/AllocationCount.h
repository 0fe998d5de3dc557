#pragma once

#include <cstddef>

namespace tamblo::test {

/// How many blocks, and how many bytes, the calling thread has asked of `operator new` since it began.
struct AllocationCount {
    std::size_t blocks = 0;
    std::size_t bytes = 0;
};
[[nodiscard]] AllocationCount allocationCount() noexcept;

/// The allocations of the calling thread while `run` runs.
template <typename Run> AllocationCount allocationsOf(const Run& run) {
    const AllocationCount before = allocationCount();
    run();
    const AllocationCount after = allocationCount();
    return {after.blocks - before.blocks, after.bytes - before.bytes};
}

} // namespace tamblo::test
