#include "platform/linux/LinuxBugCaptureService.h"

namespace tamblo {

class LinuxBugCaptureService::Reporter final : public GlarnReporter {
public:
    [[nodiscard]] bool snapshot(const BugCaptureSignature&, std::chrono::duration<double>, const Dictionary&,
                                Reply) override {
        return false;
    }
    [[nodiscard]] bool startSession(const BugCaptureSignature&, std::chrono::duration<double>,
                                    Reply) override {
        return false;
    }
    void cancelSession(std::string_view) override {}
};

std::unique_ptr<GlarnReporter> LinuxBugCaptureService::makeReporter(std::span<const pid_t>) {
    return std::make_unique<Reporter>();
}

} // namespace tamblo
