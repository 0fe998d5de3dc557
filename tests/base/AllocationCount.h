#pragma once

#include <cstddef>

namespace tamblo::test {

/// Blocks, and bytes, asked of `operator new`.
struct AllocationCount {
    std::size_t blocks = 0;
    std::size_t bytes = 0;
};
inline thread_local AllocationCount allocationCount;

template <typename Run> AllocationCount allocationsOf(const Run& run) {
    const AllocationCount before = allocationCount;
    run();
    return {allocationCount.blocks - before.blocks, allocationCount.bytes - before.bytes};
}

} // namespace tamblo::test
