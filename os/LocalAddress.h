#pragma once

#include <cstddef>
#include <cstring>
#include <optional>
#include <string_view>

#include <sys/socket.h>
#include <sys/un.h>

namespace tamblo {

/// The address of a local socket, a file or, when it begins with a NUL byte, a name of the abstract
/// namespace.
class LocalAddress {
public:
    /// Nothing for a path that is empty or longer than the system allows.
    [[nodiscard]] static std::optional<LocalAddress> of(std::string_view path) noexcept {
        LocalAddress address;
        if (path.empty() || path.size() >= sizeof address.address_.sun_path) {
            return std::nullopt;
        }
        address.address_.sun_family = AF_UNIX;
        std::memcpy(address.address_.sun_path, path.data(), path.size());
        address.size_ = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size());
        return address;
    }

    [[nodiscard]] const sockaddr* get() const noexcept {
        return reinterpret_cast<const sockaddr*>(&address_);
    }
    [[nodiscard]] socklen_t size() const noexcept { return size_; }

private:
    sockaddr_un address_{};
    socklen_t size_ = 0;
};

} // namespace tamblo
