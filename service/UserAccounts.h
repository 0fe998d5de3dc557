#pragma once

#include "platform/Activity.h"

#include <cstddef>
#include <map>

#include <sys/types.h>

namespace tamblo {

/// What the clients of one user hold together, against the limits; each change of a client's sessions and
/// their configurations is entered here, and so is what the service has of all users (`Activity`). Members of
/// the service, one for each user whom it has met; on the reporting server queue.
class UserAccount {
public:
    /// `activity` outlives the account.
    explicit UserAccount(Activity& activity) noexcept : activity_(activity) {}

    void addSession(std::size_t bytesOfConfiguration) noexcept {
        ++sessions_;
        ++activity_.sessions;
        configurationBytes_ += bytesOfConfiguration;
    }
    void removeSession(std::size_t bytesOfConfiguration) noexcept {
        --sessions_;
        --activity_.sessions;
        configurationBytes_ -= bytesOfConfiguration;
    }
    /// Of a session that stays, or is replaced by another.
    void changeConfiguration(std::size_t bytesBefore, std::size_t bytesAfter) noexcept {
        configurationBytes_ += bytesAfter - bytesBefore;
    }

    [[nodiscard]] std::size_t sessions() const noexcept { return sessions_; }
    [[nodiscard]] std::size_t configurationBytes() const noexcept { return configurationBytes_; }

private:
    Activity& activity_;
    std::size_t sessions_ = 0;
    std::size_t configurationBytes_ = 0;
};
using UserAccounts = std::map<uid_t, UserAccount>;

} // namespace tamblo
