#pragma once

#include "base/Dictionary.h"
#include "platform/BugCaptureService.h"
#include "platform/Clock.h"
#include "platform/linux/captures/CaptureFolders.h"
#include "platform/linux/device/ProcessFiles.h"
#include "platform/linux/sinks/AppendOnlyFile.h"

#include <chrono>
#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include <sys/types.h>

namespace tamblo {

/// One capture that was asked for.
struct CaptureRequest {
    std::string_view operation; ///< "snapshot" or "start"
    BugCaptureSignature signature;
    std::chrono::duration<double> duration{0};
    Dictionary payload;
    std::vector<pid_t> processes;
    std::string identifier = {};
    WallTime time = {}; ///< when it was asked for
};

/// Gathers what a capture's folder holds about the device, as the kernel's files show it:
///
/// - `capture.json`: the request;
/// - `process-PID.txt`: for each process, its status and memory, and its threads with their state, the kernel
///   function that each waits in and, where the service may see it, the calls that led there;
/// - `system.txt`: load, memory, pressure and temperatures.
///
/// A process that has ended is recorded as such. What cannot be read has the reason in its place. Any thread;
/// takes milliseconds for each large process.
class CaptureContent {
public:
    /// How many threads of a process are looked at: one with more has them in pools, each like the other.
    static constexpr std::size_t kMaximumThreads = 256;

    explicit CaptureContent(std::string processes = "/proc", std::string system = "/sys")
        : processRoot_(std::move(processes)), systemRoot_(std::move(system)), files_(processRoot_) {}

    [[nodiscard]] std::vector<CaptureFile> gather(const CaptureRequest& request, WallTime now) const;

private:
    [[nodiscard]] std::string processText(pid_t process) const;
    void appendThread(std::string& text, pid_t process, pid_t thread) const;
    [[nodiscard]] std::string systemText() const;
    void appendTemperatures(std::string& text) const;

    const std::string processRoot_;
    const std::string systemRoot_;
    const ProcessFiles files_;
};

/// Adds what was asked for.
void addRequest(JsonObject& line, const CaptureRequest& request);

} // namespace tamblo
