#pragma once

#include "platform/StatusSource.h"

#include <string>
#include <vector>

namespace tamblo {

// The JSON documents of clients and sessions, a line each.

[[nodiscard]] std::string clientsDocument(const std::vector<ClientRow>& rows);
[[nodiscard]] std::string sessionsDocument(const std::vector<SessionRow>& rows);
[[nodiscard]] std::string sessionDocument(const std::vector<SessionDetail>& details);

} // namespace tamblo
