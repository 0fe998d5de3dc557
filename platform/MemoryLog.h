#pragma once

#include "base/Dictionary.h"

#include <cstdint>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// Keeps what memory processes and the kernel held at some moments. Any thread; the figures are gathered
/// shortly after the call, elsewhere, and what cannot be recorded is the log's own to report.
class MemoryLog {
public:
    virtual ~MemoryLog() = default;
    /// One record of these processes and of the kernel, for a reporter's session.
    virtual void logMemory(std::int64_t reporterID, std::vector<pid_t> processes) = 0;
};

} // namespace tamblo
