#include "tools/report/SessionFilter.h"

#include "base/Format.h"

#include <algorithm>

namespace tamblo::report {

bool SessionFilter::wantsApplication(std::string_view name) const {
    const std::string_view pattern = application;
    return pattern.ends_with('*') ? name.starts_with(pattern.substr(0, pattern.size() - 1))
                                  : pattern.empty() || name == pattern;
}

bool SessionFilter::mayWant(const Session& candidate) const {
    const std::string_view name = candidate.application.stringValue();
    const bool isSession = session.empty() || candidate.name.stringValue() == session ||
                           (candidate.reporter && formatted("{}", *candidate.reporter) == session);
    return isSession && (name.empty() || wantsApplication(name));
}

bool SessionFilter::wants(const Session& candidate) const {
    return mayWant(candidate) && wantsApplication(candidate.application.stringValue()) &&
           (!since || std::max(candidate.began, candidate.ended) >= *since);
}

} // namespace tamblo::report
