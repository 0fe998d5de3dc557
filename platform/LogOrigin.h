#pragma once

#include "platform/ClientIdentity.h"

#include <optional>

namespace tamblo {

/// The client on whose behalf the calling thread works, while one of these is in scope: set where a client's
/// bytes are taken in and where its work is carried out, asked by the log, which limits what a client may
/// have written. An inner one stands in for the outer one until it goes; one without a client says that the
/// work is the service's own. Work that is posted to a queue, and a delayed call, keep that of their poster.
/// Not for keeping: it goes on the thread, and in the scope, that it was made in.
class LogOrigin {
public:
    explicit LogOrigin(std::optional<ClientIdentity> client) noexcept;
    ~LogOrigin();
    LogOrigin(const LogOrigin&) = delete;
    LogOrigin& operator=(const LogOrigin&) = delete;

    /// That of the calling thread, for work that is handed to another one.
    [[nodiscard]] static std::optional<ClientIdentity> client() noexcept;

private:
    const std::optional<ClientIdentity> client_;
    const LogOrigin* const outer_;
};

} // namespace tamblo
