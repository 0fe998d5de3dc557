#pragma once

#include "tools/report/Session.h"

#include <optional>
#include <string>
#include <string_view>

namespace tamblo::report {

/// Which sessions a report is of; as it is made, all.
struct SessionFilter {
    std::optional<double> since; ///< seconds since 1970: sessions that ended before are passed over
    std::string session;         ///< a call-quality session's name or a reporter's number; empty: all
    std::string application;     ///< exact, or with a trailing `*`; empty: all

    [[nodiscard]] bool wantsApplication(std::string_view name) const;
    /// Whether a session can still turn out to be wanted, whenever it ends and if only its application is not
    /// known yet.
    [[nodiscard]] bool mayWant(const Session& candidate) const;
    [[nodiscard]] bool wants(const Session& candidate) const;
};

} // namespace tamblo::report
