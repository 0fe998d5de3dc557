#pragma once

#include "platform/CallQualityService.h"
#include "platform/Clock.h"
#include "platform/Preferences.h"
#include "platform/StructuredLog.h"
#include "platform/WorkQueue.h"

#include <string>

namespace tamblo {

/// The call-quality service as a sink file.
class LinuxCallQualityService final : public CallQualityService {
public:
    LinuxCallQualityService(const std::string&, const Clock&, const Preferences&, WorkQueues&,
                            StructuredLog&) {}

    [[nodiscard]] std::optional<std::string> NewHierarchyToken(std::string_view) override {
        return std::nullopt;
    }
    [[nodiscard]] SessionRef CreateLinkmeterSession(const Dictionary&, const Dictionary&) override {
        return nullptr;
    }
    void StartConfiguration(const SessionRef&, Completion) override {}
    [[nodiscard]] std::optional<std::string> SendLinkmeterMessage(const SessionRef&, std::uint16_t,
                                                                  std::uint16_t, const Dictionary&) override {
        return "not there";
    }
    void FlushMessages(const SessionRef&) override {}
};

} // namespace tamblo
