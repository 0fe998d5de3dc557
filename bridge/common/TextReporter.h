#pragma once

#include "bridge/common/Reporter.h"

#include <cstdio>

namespace tamblo::bridge {

/// Writes down what would be reported, a line for each step, for people.
class TextReporter final : public Reporter {
public:
    explicit TextReporter(std::FILE* out) : out_(out) {}

    [[nodiscard]] bool isReachable() const override { return true; }
    [[nodiscard]] SessionID begin(ServiceType serviceType, const std::string& application) override;
    void send(SessionID session, EventCategory category, EventType type, Dictionary payload,
              WallTime at) override;
    void end(SessionID session) override;

private:
    void write(const std::string& line);

    std::FILE* out_;
    SessionID last_ = kNoSession;
};

} // namespace tamblo::bridge
