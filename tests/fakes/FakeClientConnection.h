#pragma once

#include "platform/ConnectionService.h"

#include <memory>
#include <string>
#include <utility>

namespace tamblo {

/// One connection whose client is the test: calls the exported object, breaks off, ends.
class FakeClientConnection final : public ClientConnection {
public:
    explicit FakeClientConnection(pid_t pid) : pid_(pid) {}

    [[nodiscard]] pid_t peerProcessIdentifier() const noexcept override { return pid_; }
    void setExportedObject(std::shared_ptr<ZRReportingServiceProtocol> object) override {
        object_ = std::move(object);
    }
    void setInterruptionHandler(UniqueFunction<void()> handler) override {
        interruption_ = std::move(handler);
    }
    void setInvalidationHandler(UniqueFunction<void()> handler) override {
        invalidation_ = std::move(handler);
    }
    void resume() override {}
    [[nodiscard]] std::string description() const override { return "connection of " + std::to_string(pid_); }

    [[nodiscard]] ZRReportingServiceProtocol& object() const noexcept { return *object_; }
    void interrupt() { interruption_(); }
    /// Ends the connection for good; it lets go of the exported object afterwards.
    void invalidate() {
        invalidation_();
        object_.reset();
    }
    void dropObject() { object_.reset(); }

private:
    const pid_t pid_;
    std::shared_ptr<ZRReportingServiceProtocol> object_;
    UniqueFunction<void()> interruption_;
    UniqueFunction<void()> invalidation_;
};

} // namespace tamblo
