#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <span>
#include <string_view>

namespace tamblo {

/// A growing run of bytes that writers format straight into: what is appended is not first zeroed or copied,
/// as a `std::string` would. Used for sink lines and for frames.
class TextBuffer {
public:
    TextBuffer() noexcept = default;
    TextBuffer(TextBuffer&& other) noexcept
        : bytes_(std::move(other.bytes_)), size_(other.size_), capacity_(other.capacity_) {
        other.size_ = other.capacity_ = 0;
    }
    TextBuffer& operator=(TextBuffer&& other) noexcept {
        bytes_ = std::move(other.bytes_);
        size_ = other.size_;
        capacity_ = other.capacity_;
        other.size_ = other.capacity_ = 0;
        return *this;
    }

    [[nodiscard]] std::size_t size() const noexcept { return size_; }
    [[nodiscard]] bool empty() const noexcept { return size_ == 0; }
    [[nodiscard]] std::size_t capacity() const noexcept { return capacity_; }
    [[nodiscard]] const char* data() const noexcept { return bytes_.get(); }
    [[nodiscard]] char* data() noexcept { return bytes_.get(); }
    [[nodiscard]] std::string_view view() const noexcept { return {bytes_.get(), size_}; }
    [[nodiscard]] std::span<const std::uint8_t> bytes() const noexcept {
        return {reinterpret_cast<const std::uint8_t*>(bytes_.get()), size_};
    }

    void clear() noexcept { size_ = 0; }
    /// Gives the memory back.
    void reset() noexcept {
        bytes_.reset();
        size_ = capacity_ = 0;
    }
    /// The same when there is more than that of it; else keeps it for what comes.
    void clearAndKeep(std::size_t capacity) noexcept {
        clear();
        if (capacity_ > capacity) {
            reset();
        }
    }
    /// Drops bytes from the end, or from the front.
    void truncate(std::size_t size) noexcept { size_ = size; }
    void dropFront(std::size_t count) noexcept {
        std::memmove(bytes_.get(), bytes_.get() + count, size_ - count);
        size_ -= count;
    }

    /// Room for `count` bytes at the end; what is written there counts once `commit` has named its length.
    [[nodiscard]] char* room(std::size_t count) {
        if (capacity_ - size_ < count) {
            grow(count);
        }
        return bytes_.get() + size_;
    }
    void commit(std::size_t count) noexcept { size_ += count; }

    void append(std::string_view text) {
        if (!text.empty()) {
            std::memcpy(room(text.size()), text.data(), text.size());
            size_ += text.size();
        }
    }
    /// Appends bytes that stand in it already.
    void appendAgain(std::size_t begin, std::size_t end) {
        char* const to = room(end - begin);
        std::memcpy(to, bytes_.get() + begin, end - begin);
        size_ += end - begin;
    }
    void append(char character) {
        *room(1) = character;
        ++size_;
    }

private:
    void grow(std::size_t count) {
        std::size_t capacity = capacity_ < 256 ? 256 : capacity_ * 2;
        while (capacity - size_ < count) {
            capacity *= 2;
        }
        std::unique_ptr<char[]> bytes(new char[capacity]);
        if (size_ != 0) {
            std::memcpy(bytes.get(), bytes_.get(), size_);
        }
        bytes_ = std::move(bytes);
        capacity_ = capacity;
    }

    std::unique_ptr<char[]> bytes_;
    std::size_t size_ = 0;
    std::size_t capacity_ = 0;
};

} // namespace tamblo
