#pragma once

#include "base/Hash.h"
#include "tools/report/Session.h"

#include <algorithm>
#include <cstdint>
#include <iterator>
#include <map>
#include <string>
#include <unordered_map>
#include <vector>

namespace tamblo::report {

/// When the sessions ran that have a name, by application.
class NamedSessions {
public:
    explicit NamedSessions(const std::map<std::uint64_t, Session>& sessions) {
        for (const auto& [serial, session] : sessions) {
            if (!session.name.stringValue().empty()) {
                runs_[std::string(session.application.stringValue())].push_back(
                    {session.began, session.ended});
            }
        }
        for (auto& [application, runs] : runs_) {
            std::ranges::sort(runs, {}, &Run::began);
            double latest = 0; // no time of a line is less
            for (Run& run : runs) {
                latest = std::max(latest, run.latestEnd);
                run.latestEnd = latest;
            }
        }
    }
    /// Whether one of the application ran at any moment of these.
    [[nodiscard]] bool ranOf(const Value& application, double from, double to) const {
        const auto runs = runs_.find(application.stringValue());
        if (runs == runs_.end()) {
            return false;
        }
        const auto later = std::ranges::upper_bound(runs->second, to, {}, &Run::began);
        return later != runs->second.begin() && std::prev(later)->latestEnd >= from;
    }

private:
    struct Run {
        double began = 0;
        double latestEnd = 0; ///< of this one and those that began before
    };
    std::unordered_map<std::string, std::vector<Run>, SeededTextHash, std::equal_to<>> runs_;
};

} // namespace tamblo::report
