#include "platform/LogOrigin.h"

#include <utility>

namespace tamblo {

namespace {

/// A thread has one origin however deep in the layers it logs, and passing it to each call that might write a
/// line would show it to code that has no other use for it.
constinit thread_local const LogOrigin* innermost = nullptr;

} // namespace

LogOrigin::LogOrigin(std::optional<ClientIdentity> client) noexcept
    : client_(client), outer_(std::exchange(innermost, this)) {}

LogOrigin::~LogOrigin() {
    innermost = outer_;
}

std::optional<ClientIdentity> LogOrigin::client() noexcept {
    return innermost != nullptr ? innermost->client_ : std::nullopt;
}

} // namespace tamblo
