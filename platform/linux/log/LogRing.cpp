#include "platform/linux/log/LogRing.h"

#include <algorithm>
#include <cstring>
#include <new>
#include <utility>

namespace tamblo {

void LogRing::add(std::string_view line) noexcept {
    const std::lock_guard lock(mutex_);
    if (!line.ends_with('\n') || line.size() > kMaximumBytes || !makeRoom(line.size())) {
        return;
    }
    const std::size_t end = (first_ + size_) % capacity_;
    const std::size_t upToEdge = std::min(line.size(), capacity_ - end);
    std::memcpy(bytes_.get() + end, line.data(), upToEdge);
    std::memcpy(bytes_.get(), line.data() + upToEdge, line.size() - upToEdge);
    size_ += line.size();
    ++lines_;
}

std::string LogRing::text() const {
    const std::lock_guard lock(mutex_);
    std::string lines(size_, '\0');
    copyTo(lines.data());
    return lines;
}

bool LogRing::makeRoom(std::size_t length) noexcept {
    while (lines_ == kMaximumLines || size_ + length > kMaximumBytes) {
        dropOldest();
    }
    if (size_ + length <= capacity_ || grow(length)) {
        return true;
    }
    // Without memory to grow, the latest lines are worth more than the oldest.
    while (lines_ != 0 && size_ + length > capacity_) {
        dropOldest();
    }
    return size_ + length <= capacity_;
}

bool LogRing::grow(std::size_t length) noexcept {
    constexpr std::size_t kFirstCapacity = 4096;
    std::size_t capacity = std::max(capacity_, kFirstCapacity);
    while (capacity < size_ + length) {
        capacity *= 2;
    }
    capacity = std::min(capacity, kMaximumBytes);
    std::unique_ptr<char[]> bytes(new (std::nothrow) char[capacity]);
    if (bytes == nullptr) {
        return false;
    }
    copyTo(bytes.get());
    bytes_ = std::move(bytes);
    capacity_ = capacity;
    first_ = 0;
    return true;
}

void LogRing::dropOldest() noexcept {
    const std::size_t upToEdge = std::min(size_, capacity_ - first_);
    const char* const oldest = bytes_.get() + first_;
    const void* end = std::memchr(oldest, '\n', upToEdge);
    std::size_t length = 0;
    if (end != nullptr) {
        length = static_cast<std::size_t>(static_cast<const char*>(end) - oldest) + 1;
    } else {
        end = std::memchr(bytes_.get(), '\n', size_ - upToEdge);
        length = upToEdge + static_cast<std::size_t>(static_cast<const char*>(end) - bytes_.get()) + 1;
    }
    first_ = (first_ + length) % capacity_;
    size_ -= length;
    --lines_;
}

void LogRing::copyTo(char* out) const noexcept {
    const std::size_t upToEdge = std::min(size_, capacity_ - first_);
    if (upToEdge != 0) {
        std::memcpy(out, bytes_.get() + first_, upToEdge);
        std::memcpy(out + upToEdge, bytes_.get(), size_ - upToEdge);
    }
}

} // namespace tamblo
