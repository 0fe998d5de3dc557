#pragma once

#include <cerrno>
#include <new>
#include <system_error>
#include <type_traits>

#include <sys/mman.h>

namespace tamblo::bench {

/// One object in memory that forks of this process share with it. All zero at first.
template <typename Content> class SharedMemory {
public:
    static_assert(std::is_trivially_destructible_v<Content>);

    SharedMemory() {
        void* const memory =
            ::mmap(nullptr, sizeof(Content), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
        if (memory == MAP_FAILED) {
            throw std::system_error(errno, std::generic_category(), "mmap");
        }
        content_ = new (memory) Content();
    }
    ~SharedMemory() { ::munmap(content_, sizeof(Content)); }
    SharedMemory(const SharedMemory&) = delete;
    SharedMemory& operator=(const SharedMemory&) = delete;

    [[nodiscard]] Content& operator*() const noexcept { return *content_; }
    [[nodiscard]] Content* operator->() const noexcept { return content_; }

private:
    Content* content_;
};

} // namespace tamblo::bench
