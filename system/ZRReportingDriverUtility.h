#pragma once

#include "base/KeySet.h"
#include "base/Value.h"
#include "platform/ChanlogFacility.h"

#include <array>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

class ZRReportingSession;

/// Names the channels of an audio driver: their group, their subgroup or both. Immutable, so any thread.
class ZRReportingDriver {
public:
    using Name = std::optional<std::string>;

    [[nodiscard]] static ZRReportingDriver driverWithGroupName(Name groupName, Name subGroupName) {
        return {std::move(groupName), std::move(subGroupName)};
    }

    [[nodiscard]] const Name& groupName() const noexcept { return groupName_; }
    [[nodiscard]] const Name& subGroupName() const noexcept { return subGroupName_; }
    /// "group-subgroup", with "(null)" for a name that is missing. The driver's key in a snapshot.
    [[nodiscard]] std::string description() const {
        return groupName_.value_or("(null)") + "-" + subGroupName_.value_or("(null)");
    }

private:
    ZRReportingDriver(Name groupName, Name subGroupName)
        : groupName_(std::move(groupName)), subGroupName_(std::move(subGroupName)) {}

    Name groupName_;
    Name subGroupName_;
};

inline void appendText(std::string& out, const ZRReportingDriver& driver) {
    out += driver.description();
}

/// The subscription to one driver's channels. Owned by the driver utility, as long as that lives.
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

/// Samples the statistics channels of a fixed set of audio drivers, and turns what a session's time has added
/// to them into messages of that session.
///
/// One for the context, made with the first start of a session. It then subscribes to the drivers' channels,
/// once: a driver without channels at that moment is not asked again. Used on the reporting server queue,
/// where a pass over the channels may read files; without any subscription it reads nothing.
///
/// What fails is logged as an error and costs its driver alone. Subscriptions are logged at the default level
/// and drivers without channels, of which an ordinary device has many, as information.
class ZRReportingDriverUtility {
public:
    /// A sample of each driver's channels, by the driver's description.
    using DriverSnapShot = std::map<std::string, ChanlogChannels, std::less<>>;
    /// What is reported of channels of one kind, by the statistics key. A key that comes twice has the value
    /// that came last.
    using DriverStats = std::map<std::string, Value, std::less<>>;

    explicit ZRReportingDriverUtility(ChanlogFacility& facility);
    ZRReportingDriverUtility(const ZRReportingDriverUtility&) = delete;
    ZRReportingDriverUtility& operator=(const ZRReportingDriverUtility&) = delete;

    /// One for each driver that had channels.
    [[nodiscard]] const std::vector<ZRReportingIOChannelSubscription>&
    ioChannelSubscriptions() const noexcept {
        return ioChannelSubscriptions_;
    }

    [[nodiscard]] DriverSnapShot getSnapShot() const;
    /// Samples once more and sends up to three messages: of simple values, of histograms and of states that
    /// have gained something since the snapshot. Without a snapshot there is nothing to compare with, and
    /// nothing to send.
    void sendDriverLogsForSession(const std::shared_ptr<ZRReportingSession>& session,
                                  const DriverSnapShot* driverSnapShot) const;

    /// What a channel is called in messages: driver, group, subgroup, type and channel name, with "_" between
    /// them and no "_" or space in them. What stands in "<>" behind a driver's name tells instances apart and
    /// is left out.
    [[nodiscard]] static std::string getDriverStatsKey(const ChanlogChannel& channel, std::string_view type);

    /// Each adds an entry for a channel of its kind that has gained something. A simple value below 1 is no
    /// gain: that is meant, as differences of levels and of counters that were set back are below 1.
    static void processSimpleData(const ChanlogChannel& channel, DriverStats& driverStats);
    static void processHistogramData(const ChanlogChannel& channel, DriverStats& driverStats);
    static void processStateData(const ChanlogChannel& channel, DriverStats& driverStats);

private:
    ChanlogFacility& facility_;
    std::vector<ZRReportingIOChannelSubscription> ioChannelSubscriptions_;
    /// Of the messages that were sent last, of each kind.
    mutable std::array<KeySetRef, 3> lastKeys_;
};

} // namespace tamblo
