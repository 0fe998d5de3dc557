#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace tamblo {

/// A bug report that is prepared for the user, who may send it or not.
struct BugReportDraft {
    /// Where the bug tracker files it.
    struct Component {
        std::string name;
        std::string version;
        std::int64_t identifier = 0;
    };

    std::string title;
    std::string problemDescription;
    Component component;
    std::int32_t reproducibility = 0; ///< the tracker's number
    std::int32_t classification = 0;  ///< the tracker's number
    std::vector<std::string> diagnosticExtensions;
};

/// Offers prepared bug reports to the user. Any thread; does not wait for the user.
class BugReportDraftingService {
public:
    /// What went wrong, or nothing. Called once, on any thread, possibly before the request returns.
    using Completion = std::function<void(const std::optional<std::string>& error)>;

    virtual ~BugReportDraftingService() = default;
    /// Offers the draft on behalf of a process, by its name, and tells the user the reason.
    virtual void createDraft(const BugReportDraft& draft, const std::string& processName,
                             const std::string& displayReason, Completion completion) = 0;
};

} // namespace tamblo
