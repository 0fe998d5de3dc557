#include "tests/base/AllocationCount.h"

#include <cstdlib>
#include <new>

static void* allocate(std::size_t size) noexcept {
    ++tamblo::test::allocationCount.blocks;
    tamblo::test::allocationCount.bytes += size;
    return std::malloc(size == 0 ? 1 : size);
}

// Weak, as the runtime of a sanitizer may bring its own; nothing is counted then.
[[gnu::weak]] void* operator new(std::size_t size) {
    if (void* const block = allocate(size)) {
        return block;
    }
    throw std::bad_alloc();
}
[[gnu::weak]] void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
    return allocate(size);
}
[[gnu::weak]] void operator delete(void* block) noexcept {
    std::free(block);
}
[[gnu::weak]] void operator delete(void* block, std::size_t) noexcept {
    std::free(block);
}
[[gnu::weak]] void operator delete(void* block, const std::nothrow_t&) noexcept {
    std::free(block);
}
