#pragma once

#include <sys/types.h>

namespace tamblo::bench {

/// The users of a machine that a benchmark run by root acts as, so that the service sees different ones.
inline constexpr uid_t kServiceUser = 2;
inline constexpr uid_t kAttackingUser = 1;
inline constexpr uid_t kOtherUser = 65534;

[[nodiscard]] bool mayChangeUser() noexcept;
/// In a child process, for good, where that may be done; else it stays who it is. The child still ends with
/// its parent.
void becomeUser(uid_t user) noexcept;

} // namespace tamblo::bench
