#pragma once

#include "platform/ConnectionService.h"

#include <memory>
#include <string>
#include <string_view>
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

/// A listener that tests connect to.
class FakeConnectionService final : public ConnectionService, private ConnectionListener {
public:
    [[nodiscard]] ConnectionListener& listenerForServiceName(std::string_view serviceName) override {
        serviceName_ = serviceName;
        return *this;
    }

    /// A new client, or null when it is turned away or nobody listens.
    [[nodiscard]] std::unique_ptr<FakeClientConnection> connect(pid_t pid) {
        auto connection = std::make_unique<FakeClientConnection>(pid);
        const bool isListening = delegate_ != nullptr && isResumed_;
        return isListening && delegate_->shouldAcceptNewConnection(*connection) ? std::move(connection)
                                                                                : nullptr;
    }
    [[nodiscard]] const std::string& serviceName() const noexcept { return serviceName_; }

private:
    void setDelegate(ListenerDelegate& delegate) override { delegate_ = &delegate; }
    void resume() override { isResumed_ = true; }

    std::string serviceName_;
    ListenerDelegate* delegate_ = nullptr;
    bool isResumed_ = false;
};

} // namespace tamblo
