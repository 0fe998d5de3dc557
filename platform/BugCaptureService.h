#pragma once

#include "base/Dictionary.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <string_view>

#include <sys/types.h>

namespace tamblo {

/// What a capture is filed under.
struct BugCaptureSignature {
    std::string domain;
    std::string type;
    std::string subType;
    std::string subTypeContext;
    std::string detectedProcess;
};

/// The keys of a reply to a request for a capture; the service's own.
namespace glarn {
inline constexpr std::string_view kReplySuccess = "success";      ///< boolean
inline constexpr std::string_view kReplySessionID = "session_id"; ///< string, after a success
inline constexpr std::string_view kReplyReason = "reason";        ///< a `GlarnError`, after a failure
/// In a snapshot's payload: parameters for those who collect diagnostics, by collector.
inline constexpr std::string_view kDiagnosticExtensionParameters = "diagnostic_extension_parameters";
/// The collector of the power log's lines about some processes only.
inline constexpr std::string_view kPowerLogFilterProcess = "com.vandra.powerlog.systemlog.filterprocess";
} // namespace glarn

/// Why there is no capture.
enum GlarnError : std::int32_t {
    kGlarnErrorNone = 0,
    kGlarnErrorServiceNotReady = 1,
    kGlarnErrorNotSupported = 2,
    kGlarnErrorServiceUnavailable = 3,
    kGlarnErrorServiceInterrupted = 4,
    kGlarnErrorInvalidParameters = 5,
    kGlarnErrorDailyLimitExceeded = 6,
    kGlarnErrorRandomizedSuppression = 7,
    kGlarnErrorSessionNotFound = 8,
    kGlarnErrorRequestThrottled = 9,
};

/// Asks for captures on behalf of some processes. Any thread; nothing here waits for a capture, which goes on
/// without the reporter.
class GlarnReporter {
public:
    /// Called once for each request that was accepted: on any thread, possibly before the request returns.
    using Reply = std::function<void(const Dictionary&)>;

    virtual ~GlarnReporter() = default;
    /// Asks for a capture of what the device is doing: now, or, with a duration, when that is over. Whether
    /// the parameters were accepted.
    [[nodiscard]] virtual bool snapshot(const BugCaptureSignature& signature,
                                        std::chrono::duration<double> duration, const Dictionary& payload,
                                        Reply reply) = 0;
    /// Opens a capture session that ends, and is then kept, when its duration is over. Whether the parameters
    /// were accepted.
    [[nodiscard]] virtual bool startSession(const BugCaptureSignature& signature,
                                            std::chrono::duration<double> duration, Reply reply) = 0;
    /// Ends a capture session that is not to be kept. One that has ended, or never was, is left alone.
    virtual void cancelSession(std::string_view sessionIdentifier) = 0;
};

/// The automatic bug-capture service.
class BugCaptureService {
public:
    virtual ~BugCaptureService() = default;
    /// A reporter for captures that are about these processes. Any thread.
    [[nodiscard]] virtual std::unique_ptr<GlarnReporter> makeReporter(std::span<const pid_t> processes) = 0;
};

} // namespace tamblo
