#include "tests/base/AllocationCount.h"

#include <cstdlib>
#include <new>

// The other forms of these end here, too. Weak, as the runtime of a sanitizer may bring its own; nothing is
// counted then.
[[gnu::weak]] void* operator new(std::size_t size) {
    ++tamblo::test::allocationCount.blocks;
    tamblo::test::allocationCount.bytes += size;
    if (void* const block = std::malloc(size == 0 ? 1 : size)) {
        return block;
    }
    throw std::bad_alloc();
}
[[gnu::weak]] void operator delete(void* block) noexcept {
    std::free(block);
}
[[gnu::weak]] void operator delete(void* block, std::size_t) noexcept {
    std::free(block);
}
