#pragma once

#include "tests/fakes/FakeClientConnection.h"

#include <memory>
#include <string>
#include <string_view>

namespace tamblo {

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
