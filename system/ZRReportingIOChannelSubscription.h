#pragma once

#include "platform/ChanlogFacility.h"
#include "system/ZRReportingDriver.h"

#include <memory>
#include <utility>

namespace tamblo {

/// The subscription to one driver's channels. Owned by the driver utility, for the life of the process.
class ZRReportingIOChannelSubscription {
public:
    explicit ZRReportingIOChannelSubscription(ZRReportingDriver driver) : driver_(std::move(driver)) {}

    void setSubscription(std::unique_ptr<ChanlogSubscription> subscription) noexcept {
        subscription_ = std::move(subscription);
    }

    [[nodiscard]] const ZRReportingDriver& driver() const noexcept { return driver_; }
    /// Both only once a subscription was set.
    [[nodiscard]] ChanlogSubscription& subscription() const noexcept { return *subscription_; }
    [[nodiscard]] const ChanlogChannels& subscribedChannels() const {
        return subscription_->subscribedChannels();
    }

private:
    ZRReportingDriver driver_;
    std::unique_ptr<ChanlogSubscription> subscription_;
};

} // namespace tamblo
