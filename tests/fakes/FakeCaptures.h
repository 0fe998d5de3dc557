#pragma once

#include "platform/DiagnosticCaptureService.h"
#include "platform/MemoryLog.h"

#include <cstdint>
#include <utility>
#include <vector>

namespace tamblo {

/// Keeps the requests.
class FakeDiagnosticCaptureService final : public DiagnosticCaptureService {
public:
    void captureStacks(StackCaptureRequest request) override { requests.push_back(std::move(request)); }

    std::vector<StackCaptureRequest> requests;
};

/// Keeps the requests.
class FakeMemoryLog final : public MemoryLog {
public:
    struct Request {
        std::int64_t reporterID;
        std::vector<pid_t> processes;
    };
    void logMemory(std::int64_t reporterID, std::vector<pid_t> processes) override {
        requests.push_back({reporterID, std::move(processes)});
    }

    std::vector<Request> requests;
};

} // namespace tamblo
