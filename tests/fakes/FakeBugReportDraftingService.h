#pragma once

#include "platform/BugReportDraftingService.h"

#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace tamblo {

/// Keeps the drafts; a test calls their completions.
class FakeBugReportDraftingService final : public BugReportDraftingService {
public:
    struct Request {
        BugReportDraft draft;
        std::string processName;
        std::string displayReason;
        Completion completion;
    };
    void createDraft(const BugReportDraft& draft, const std::string& processName,
                     const std::string& displayReason, Completion completion) override {
        requests.push_back({draft, processName, displayReason, std::move(completion)});
    }

    std::vector<Request> requests;
};

} // namespace tamblo
