#pragma once

#include "base/Dictionary.h"

#include <array>
#include <cstdint>
#include <string>

namespace tamblo {

/// One request for a system-wide stack-sampling capture.
struct StackCaptureRequest {
    std::string requester;
    std::string captureType;
    std::string reason;
    Dictionary payload; ///< may name further processes, as an array of numbers under "processIDs"
    std::array<std::int32_t, 5> options{}; ///< the service's own, in its order
};

/// The diagnostic capture service. Any thread; the capture is made later, elsewhere, and a failure is the
/// service's own to report.
class DiagnosticCaptureService {
public:
    virtual ~DiagnosticCaptureService() = default;
    virtual void captureStacks(StackCaptureRequest request) = 0;
};

} // namespace tamblo
