#include "tools/report/SessionFilter.h"

#include "base/Format.h"
#include "base/NamePattern.h"

#include <algorithm>

namespace tamblo::report {

bool SessionFilter::wantsApplication(std::string_view name) const {
    return application.empty() || matchesPattern(name, application);
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
