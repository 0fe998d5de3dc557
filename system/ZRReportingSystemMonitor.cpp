#include "system/ZRReportingSystemMonitor.h"

#include "base/Mutex.h"
#include "base/WhileAlive.h"
#include "platform/PreferenceDomains.h"
#include "util/Log.h"
#include "util/MessageKeys.h"
#include "util/ReportingUtilities.h"

#include <cstdint>
#include <string>
#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view kReportingNotification = "com.vandra.tamblo.reporting";
constexpr std::string_view kSpatialAudioNotification =
    "com.vandra.dashlo.spatial-audio-accessory-feature.changed";
constexpr std::string_view kRingerNotification = "com.vandra.dashlo.ringerstate";

constexpr std::string_view kDeviceNameKey = "device_name";
constexpr std::string_view kDisableReportingKey = "disable_reporting";

} // namespace

struct ZRReportingSystemMonitor::Shared {
    [[nodiscard]] std::shared_ptr<ZRReportingSystemMonitor> current() {
        const MutexLock lock(mutex);
        return monitor;
    }

    Mutex mutex;
    std::shared_ptr<ZRReportingSystemMonitor> monitor TAMBLO_GUARDED_BY(mutex);
};

void ZRReportingSystemMonitor::initializeWithQueue(Context& context, SerialQueue& queue) {
    auto& shared = context.shared<Shared>();
    const MutexLock lock(shared.mutex);
    if (shared.monitor == nullptr) {
        shared.monitor = initWithQueue(context.platform(), queue);
    }
}

std::shared_ptr<SystemMonitorDictionary>
ZRReportingSystemMonitor::getSystemMonitorDictionary(Context& context) {
    const auto monitor = context.shared<Shared>().current();
    return monitor != nullptr ? monitor->systemMonitorDictionary_ : nullptr;
}

std::vector<std::string_view> ZRReportingSystemMonitor::getSystemMonitorKeys(Context& context) {
    std::vector<std::string_view> keys;
    if (const auto monitor = context.shared<Shared>().current()) {
        for (const auto& [featureName, feature] : monitor->features_) {
            keys.push_back(featureName);
        }
    }
    return keys;
}

void ZRReportingSystemMonitor::reset(Context& context) {
    auto& shared = context.shared<Shared>();
    std::shared_ptr<ZRReportingSystemMonitor> dropped;
    {
        const MutexLock lock(shared.mutex);
        dropped = std::move(shared.monitor);
    }
    if (dropped != nullptr) {
        dropped->clear();
    }
}

std::shared_ptr<ZRReportingSystemMonitor> ZRReportingSystemMonitor::initWithQueue(const Platform& platform,
                                                                                  SerialQueue& queue) {
    auto monitor = std::make_shared<ZRReportingSystemMonitor>(Created(), platform, queue);
    // In this order on purpose: a state word is read through a registration, so the ringer has no state until
    // its first notification.
    monitor->populateInitialValues();
    monitor->listenForFeatureStateChanges();
    return monitor;
}

ZRReportingSystemMonitor::ZRReportingSystemMonitor(Created, const Platform& platform, SerialQueue& queue)
    : platform_(platform),
      queue_(queue),
      defaults_(ZRReportingDefaults(platform)),
      features_{{ZRReportingMessageKeySpatialAudioAccessoryFeature,
                 {ZRReportingMessageKeySpatialAudioAccessoryFeatureDomain, kSpatialAudioNotification, {}}},
                {kDeviceNameKey, {kReportingDomain, kReportingNotification, {}}},
                {kRingerStateKey, {{}, kRingerNotification, {}}}},
      systemMonitorDictionary_(std::make_shared<SystemMonitorDictionary>()) {}

Dictionary ZRReportingSystemMonitor::ZRReportingDefaults(const Platform& platform) {
    const PreferencesSuite preferences(*platform.preferences, std::string(kReportingDomain));
    Dictionary defaults{{kDisableReportingKey, preferences.boolValue(kDisableReportingKey)}};
    if (preferences.hasValue(kDeviceNameKey)) {
        defaults.set(kDeviceNameKey, preferences.stringValue(kDeviceNameKey));
    }
    return defaults;
}

Dictionary ZRReportingSystemMonitor::features() const {
    const auto held = systemMonitorDictionary_->lock();
    Dictionary table;
    for (const auto& [featureName, feature] : features_) {
        Dictionary descriptor{{"feature_domain", featureName}, {"notification", feature.notification}};
        if (!feature.defaultsDomain.empty()) {
            descriptor.set("defaults_domain", feature.defaultsDomain);
        }
        if (feature.notifyToken) {
            descriptor.set("notify_token", *feature.notifyToken);
        }
        table.set(featureName, std::move(descriptor));
    }
    return table;
}

std::optional<Dictionary> ZRReportingSystemMonitor::getFeatureState(std::string_view featureName) const {
    log::standard(ZRReportingServiceDelegateCategory(), "getting feature {}", featureName);
    const auto held = systemMonitorDictionary_->lock();
    const auto found = features_.find(featureName);
    if (found == features_.end()) {
        return std::nullopt;
    }
    std::optional<Value> value = valueOf(featureName, found->second);
    if (!value) {
        return std::nullopt;
    }
    return Dictionary{{featureName, *std::move(value)},
                      {ZRReportingInternalEventEpochTime, secondsSince1970(platform_.clock->now())},
                      {ZRReportingInternalEventSystemUptimeSec,
                       roundedTo32Bits(platform_.processInformation->systemUptime().count())}};
}

std::optional<Value> ZRReportingSystemMonitor::valueOf(std::string_view featureName,
                                                       const Feature& feature) const {
    if (!feature.defaultsDomain.empty()) {
        return platform_.preferences->copyPreferenceValue(featureName, feature.defaultsDomain);
    }
    if (!feature.notifyToken) {
        return std::nullopt;
    }
    constexpr std::uint64_t kOn = 1;
    const auto state = platform_.namedNotifications->GetNamedNotificationState(*feature.notifyToken);
    return state.status == 0 ? std::optional<Value>(state.word == kOn) : std::nullopt;
}

void ZRReportingSystemMonitor::populateInitialValues() {
    log::info(ZRReportingServiceDelegateCategory(), "populateInitialValues {}", features());
    const auto held = systemMonitorDictionary_->lock();
    for (const auto& [featureName, feature] : features_) {
        if (std::optional<Dictionary> state = getFeatureState(featureName)) {
            systemMonitorDictionary_->set(featureName, *std::move(state));
        }
    }
}

void ZRReportingSystemMonitor::listenForFeatureStateChanges() {
    log::info(ZRReportingServiceDelegateCategory(), "listening for features {}", features());
    const auto held = systemMonitorDictionary_->lock();
    for (auto& [name, feature] : features_) {
        const auto registration = platform_.namedNotifications->RegisterNamedNotification(
            feature.notification, queue_,
            whileAlive(weak_from_this(), [featureName = name](auto& monitor, int token) {
                monitor.featureChanged(featureName, token);
            }));
        feature.notifyToken = registration.token;
        log::standard(ZRReportingServiceDelegateCategory(), "notify setup result {} token {}",
                      registration.status, registration.token);
    }
}

void ZRReportingSystemMonitor::featureChanged(std::string_view featureName, int token) {
    log::info(ZRReportingServiceDelegateCategory(), "feature changes featureName={} token={}", featureName,
              token);
    const auto held = systemMonitorDictionary_->lock();
    std::optional<Dictionary> state = getFeatureState(featureName);
    if (state && *state != systemMonitorDictionary_->find(featureName)) {
        systemMonitorDictionary_->set(featureName, *std::move(state));
    }
}

void ZRReportingSystemMonitor::clear() {
    const auto held = systemMonitorDictionary_->lock();
    for (const auto& [featureName, feature] : features_) {
        platform_.namedNotifications->CancelNamedNotification(feature.notifyToken.value_or(0));
    }
}

} // namespace tamblo
