#pragma once

#include "Assault.h"

#include <chrono>
#include <span>
#include <string_view>

namespace tamblo::bench {

/// What the service has to do without.
enum class Shortage : unsigned char { none, descriptors, threads };

/// What one client, or some of one user, may try. An attack returns when its time is over; what it has opened
/// and made is still there then, and goes with its process.
struct Attack {
    std::string_view name;
    std::string_view what;
    void (*run)(const Assault& assault);
    Shortage shortage = Shortage::none;
    std::chrono::seconds quiet{5}; ///< for which the service is watched afterwards
};

[[nodiscard]] std::span<const Attack> attacksByMessage() noexcept;
[[nodiscard]] std::span<const Attack> attacksBySession() noexcept;
[[nodiscard]] std::span<const Attack> attacksByConnection() noexcept;

} // namespace tamblo::bench
