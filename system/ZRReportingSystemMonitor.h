#pragma once

#include "base/Dictionary.h"
#include "platform/WorkQueue.h"
#include "system/SystemMonitorDictionary.h"
#include "util/Context.h"

#include <map>
#include <memory>
#include <optional>
#include <string_view>
#include <vector>

namespace tamblo {

/// Watches a few features of the device (the spatial-audio accessory feature, the reporting device's name,
/// the ringer) and keeps the latest state of each in a snapshot that sessions observe.
///
/// One for the context, made by the service at start-up. A feature's value is a preference, or the state word
/// of a named notification; either way a notification tells of its changes, on the queue, where the feature
/// is read anew and stored. The descriptors' tokens are guarded by the snapshot's lock.
class ZRReportingSystemMonitor : public std::enable_shared_from_this<ZRReportingSystemMonitor> {
    struct Created {
        explicit Created() = default;
    };

public:
    /// Makes the context's monitor, unless there is one. Any thread.
    static void initializeWithQueue(Context& context, SerialQueue& queue);
    /// The context's snapshot itself; null without a monitor. Any thread.
    [[nodiscard]] static std::shared_ptr<SystemMonitorDictionary>
    getSystemMonitorDictionary(Context& context);
    /// The features' names, whether or not they have values; none without a monitor. The texts live as long
    /// as the process. Any thread.
    [[nodiscard]] static std::vector<std::string_view> getSystemMonitorKeys(Context& context);
    /// Drops the context's monitor; its snapshot changes no more. On the monitor's queue, or when that is at
    /// rest. The next `initializeWithQueue` makes another.
    static void reset(Context& context);

    /// A monitor whose snapshot is filled, and which listens. The queue must outlive its registrations.
    [[nodiscard]] static std::shared_ptr<ZRReportingSystemMonitor> initWithQueue(const Platform& platform,
                                                                                 SerialQueue& queue);
    ZRReportingSystemMonitor(Created, const Platform& platform, SerialQueue& queue);
    ~ZRReportingSystemMonitor() { clear(); }
    ZRReportingSystemMonitor(const ZRReportingSystemMonitor&) = delete;
    ZRReportingSystemMonitor& operator=(const ZRReportingSystemMonitor&) = delete;

    /// The preferences that say how to report, as they are now: "disable_reporting", which turns nothing off,
    /// and "device_name" where there is one.
    [[nodiscard]] static Dictionary ZRReportingDefaults(const Platform& platform);
    /// The same as they were when the monitor was made.
    [[nodiscard]] const Dictionary& getDefaults() const noexcept { return defaults_; }
    /// The feature table as it is logged: a dictionary for each feature's name.
    [[nodiscard]] Dictionary features() const;
    [[nodiscard]] const std::shared_ptr<SystemMonitorDictionary>& systemMonitorDictionary() const noexcept {
        return systemMonitorDictionary_;
    }

    /// Reads a feature: its value under the feature's name, the time of the reading and the system's uptime.
    /// Nothing for an unknown feature, and for one that has no value now. May read a file.
    [[nodiscard]] std::optional<Dictionary> getFeatureState(std::string_view featureName) const;
    void populateInitialValues();
    void listenForFeatureStateChanges();
    /// Ends the registrations, as letting go of the monitor does; where `reset` may be called.
    void clear();

private:
    struct Shared;
    struct Feature {
        std::string_view defaultsDomain; ///< empty when the value is the notification's state word
        std::string_view notification;
        std::optional<int> notifyToken; ///< once registered, or refused
    };

    [[nodiscard]] std::optional<Value> valueOf(std::string_view featureName, const Feature& feature) const;
    void featureChanged(std::string_view featureName, int token);

    const Platform& platform_;
    SerialQueue& queue_;
    const Dictionary defaults_;
    std::map<std::string_view, Feature> features_;
    const std::shared_ptr<SystemMonitorDictionary> systemMonitorDictionary_;
};

} // namespace tamblo
