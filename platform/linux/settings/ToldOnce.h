#pragma once

#include "os/FileState.h"

#include <string>
#include <string_view>

namespace tamblo {

/// What the log knows of one thing's fault, so that each fault is told once for as long as it lasts.
class ToldOnce {
public:
    /// Whether the fault has to be told now: it was not the last one, or it is that of another state. An
    /// empty fault is none.
    [[nodiscard]] bool isNews(std::string_view fault, const FileState& state = {}) {
        if (fault == fault_ && state == state_) {
            return false;
        }
        fault_ = fault;
        state_ = state;
        return !fault.empty();
    }

private:
    std::string fault_;
    FileState state_;
};

} // namespace tamblo
