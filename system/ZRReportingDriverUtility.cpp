#include "system/ZRReportingDriverUtility.h"

#include "base/Dictionary.h"
#include "platform/Counters.h"
#include "session/MessageIntake.h"
#include "session/ZRReportingSession.h"
#include "util/AudioEvents.h"
#include "util/Log.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <utility>
#include <variant>

namespace tamblo {

namespace {

struct DriverNames {
    const char* group;
    const char* subGroup;
};

/// In the order in which they are subscribed to; null stands for any.
constexpr DriverNames kDrivers[] = {{"VandraAE2MCA", nullptr},
                                    {"Speaker", nullptr},
                                    {nullptr, "MCA"},
                                    {"Haptics", "Stats"},
                                    {"StateTransitionTimes_ms", nullptr},
                                    {"Rx", nullptr},
                                    {"Tx", nullptr},
                                    {nullptr, "VXA2"},
                                    {"pdm", nullptr}};

/// Of a key, and of the text of a state or histogram with a few entries.
constexpr std::size_t kUsualLength = 120;

ZRReportingDriver driverOf(const DriverNames& names) {
    const auto name = [](const char* text) {
        return text != nullptr ? ZRReportingDriver::Name(text) : std::nullopt;
    };
    return ZRReportingDriver::driverWithGroupName(name(names.group), name(names.subGroup));
}

/// The channels, or null after a failure, which is logged where there is something to tell.
ChanlogChannels channelsOrNull(const std::variant<ChanlogChannels, int>& result) {
    if (const auto* channels = std::get_if<ChanlogChannels>(&result)) {
        return *channels;
    }
    if (const int error = std::get<int>(result); error != 0) {
        counters::add(counters::Counter::driverSamples);
        log::error(ZRReportingDriverUtilityCategory(), "ChanlogCreateSamples error {}", error);
    }
    return nullptr;
}

/// What is reported of all channels, by their kind.
struct Stats {
    ZRReportingDriverUtility::DriverStats simple;
    ZRReportingDriverUtility::DriverStats histogram;
    ZRReportingDriverUtility::DriverStats state;

    void add(const ChanlogChannel& channel);
};

void Stats::add(const ChanlogChannel& channel) {
    const auto format = static_cast<std::uint8_t>(channel.format);
    switch (channel.format) {
    case ChanlogFormat::simple:
        return ZRReportingDriverUtility::processSimpleData(channel, simple);
    case ChanlogFormat::histogram:
        return ZRReportingDriverUtility::processHistogramData(channel, histogram);
    case ChanlogFormat::state:
        return ZRReportingDriverUtility::processStateData(channel, state);
    case ChanlogFormat::invalid:
    case ChanlogFormat::simpleArray:
        counters::add(counters::Counter::driverSamples);
        return log::info(ZRReportingDriverUtilityCategory(),
                         "Dropping sample of type : {} for group : {} subgroup : {}", format,
                         channel.groupName, channel.subGroupName);
    }
    counters::add(counters::Counter::driverSamples);
    log::info(ZRReportingDriverUtilityCategory(),
              "The ChanlogFormat {} is not supported group : {} subgroup : {}", format, channel.groupName,
              channel.subGroupName);
}

/// Whether the statistics have these keys.
bool haveKeys(const ZRReportingDriverUtility::DriverStats& stats, const KeySetRef& keys) {
    if (!keys || keys->size() != stats.size()) {
        return false;
    }
    std::size_t index = 0;
    for (const auto& [key, value] : stats) {
        if (!keys->is(index++, key)) {
            return false;
        }
    }
    return true;
}

/// Of mostly the same channels as the time before, whose key set is then this one's, too.
void send(ZRReportingSession& session, const ZRReportingDriverUtility::DriverStats& stats,
          AudioEventType type, KeySetRef& lastKeys) {
    if (stats.empty()) {
        return;
    }
    Dictionary payload;
    if (haveKeys(stats, lastKeys)) {
        Dictionary::Unfilled unfilled = Dictionary::fromKeySet(lastKeys, intake::kMostKeysAdded);
        std::transform(stats.begin(), stats.end(), unfilled.values.begin(),
                       [](const auto& entry) { return entry.second; });
        payload = std::move(unfilled.dictionary);
    } else {
        payload = Dictionary::fromMap(stats, intake::kMostKeysAdded);
        lastKeys = KeySetRef(&payload.keys());
    }
    session.sendMessage(
        std::make_shared<ZRReportingSessionMessage>(std::move(payload), AudioEventKindChanlog, type));
}

} // namespace

ZRReportingDriverUtility::ZRReportingDriverUtility(ChanlogFacility& facility) : facility_(facility) {
    const LogCategory& category = ZRReportingDriverUtilityCategory();
    log::standard(category, "creating chanlog driver utility");
    const std::unique_ptr<ChanlogSampling> moment = facility_.beginSampling();
    for (const DriverNames& names : kDrivers) {
        const ZRReportingDriver driver = driverOf(names);
        const ChanlogSelection selection{driver.groupName(), driver.subGroupName()};
        const auto found = moment->channelsOf(selection);
        if (const int* error = std::get_if<int>(&found)) {
            log::ownError(category, "error {} getting channels for driver {}", *error, driver);
            continue;
        }
        const auto& channels = std::get<ChanlogChannels>(found);
        if (channels->empty()) {
            log::info(category, "couldn't find any channels for driver group {}", driver);
            continue;
        }
        auto made = facility_.subscribe(selection, channels);
        if (const int* error = std::get_if<int>(&made)) {
            log::ownError(category, "error {} creating subscription for {}", *error, driver);
            continue;
        }
        ioChannelSubscriptions_.emplace_back(driver).setSubscription(
            std::move(std::get<std::unique_ptr<ChanlogSubscription>>(made)));
        log::standard(category, "subscribed to group group {}", driver);
    }
}

ZRReportingDriverUtility::DriverSnapShot ZRReportingDriverUtility::getSnapShot() const {
    DriverSnapShot snapShot;
    if (ioChannelSubscriptions_.empty()) {
        return snapShot;
    }
    const std::unique_ptr<ChanlogSampling> moment = facility_.beginSampling();
    for (const ZRReportingIOChannelSubscription& subscription : ioChannelSubscriptions_) {
        log::info(ZRReportingDriverUtilityCategory(), "sampling driver {}", subscription.driver());
        if (auto sample = channelsOrNull(moment->sample(subscription.subscription()))) {
            snapShot.emplace(subscription.driver().description(), std::move(sample));
        }
    }
    return snapShot;
}

void ZRReportingDriverUtility::sendDriverLogsForSession(const std::shared_ptr<ZRReportingSession>& session,
                                                        const DriverSnapShot* driverSnapShot) const {
    if (ioChannelSubscriptions_.empty()) {
        return;
    }
    const std::unique_ptr<ChanlogSampling> moment = facility_.beginSampling();
    Stats stats;
    for (const ZRReportingIOChannelSubscription& subscription : ioChannelSubscriptions_) {
        log::info(ZRReportingDriverUtilityCategory(), "getting latest samples");
        const auto result = moment->sample(subscription.subscription());
        log::info(ZRReportingDriverUtilityCategory(), "done getting latest samples");
        const ChanlogChannels latest = channelsOrNull(result);
        if (latest == nullptr || driverSnapShot == nullptr) {
            continue;
        }
        const auto found = driverSnapShot->find(subscription.driver().description());
        const ChanlogChannels earlier = found != driverSnapShot->end() ? found->second : nullptr;
        if (const ChanlogChannels gained = channelsOrNull(facility_.difference(earlier, latest))) {
            for (const ChanlogChannelRef& channel : *gained) {
                stats.add(*channel);
            }
        }
    }
    if (session != nullptr) {
        send(*session, stats.simple, AudioEventTypeSimple, lastKeys_[0]);
        send(*session, stats.histogram, AudioEventTypeHistogram, lastKeys_[1]);
        send(*session, stats.state, AudioEventTypeState, lastKeys_[2]);
    }
}

std::string ZRReportingDriverUtility::getDriverStatsKey(const ChanlogChannel& channel,
                                                        std::string_view type) {
    std::string key;
    key.reserve(kUsualLength);
    const auto add = [&key](std::string_view name) {
        const auto start = static_cast<std::ptrdiff_t>(key.size());
        key += name;
        key.erase(std::remove_if(key.begin() + start, key.end(),
                                 [](char character) { return character == '_' || character == ' '; }),
                  key.end());
    };
    const auto addPart = [&](const std::optional<std::string>& name, std::size_t end = std::string::npos) {
        if (name) {
            add(std::string_view(*name).substr(0, end));
            key += '_';
        }
    };
    addPart(channel.driverName, channel.driverName ? channel.driverName->find('<') : 0);
    addPart(channel.groupName);
    addPart(channel.subGroupName);
    key += type;
    key += '_';
    add(channel.channelName ? std::string_view(*channel.channelName) : std::string_view());
    return key;
}

void ZRReportingDriverUtility::processSimpleData(const ChanlogChannel& channel, DriverStats& driverStats) {
    if (channel.value >= 1) {
        driverStats.insert_or_assign(getDriverStatsKey(channel, "Simple"), Value(channel.value));
    }
}

void ZRReportingDriverUtility::processHistogramData(const ChanlogChannel& channel, DriverStats& driverStats) {
    std::int64_t lower = 0;
    std::int64_t upper = 0;
    std::string hits;
    for (const ChanlogBucket& bucket : channel.buckets) {
        if (bucket.boundsError != 0) {
            log::info(ZRReportingDriverUtilityCategory(), "Error in getting the bucket bounds : {}",
                      bucket.boundsError);
        }
        lower = std::min(lower, bucket.lower);
        upper = std::max(upper, bucket.upper);
        if (bucket.hits != 0) {
            appendFormatted(hits, "{}-{}:{};", bucket.lower, bucket.upper, bucket.hits);
        }
    }
    if (hits.empty()) {
        return;
    }
    hits.pop_back();
    std::string text;
    text.reserve(kUsualLength);
    appendFormatted(text, "count={},lower={},upper={},min={},max={},unit={}::{}", channel.buckets.size(),
                    lower, upper, channel.minimum, channel.maximum, channel.unitLabel, hits);
    driverStats.insert_or_assign(getDriverStatsKey(channel, "Histogram"), Value(text));
}

void ZRReportingDriverUtility::processStateData(const ChanlogChannel& channel, DriverStats& driverStats) {
    std::string text;
    text.reserve(kUsualLength);
    for (const ChanlogState& state : channel.states) {
        if (state.residency != 0) {
            appendFormatted(text, "name:{},transition:{},residency:{},duty_cycle:{};", state.name,
                            state.transitions, state.residency, state.dutyCycle);
        }
    }
    if (!text.empty()) {
        log::debug(ZRReportingDriverUtilityCategory(), "the current reported data is : {}", text);
        driverStats.insert_or_assign(getDriverStatsKey(channel, "State"), Value(text));
    }
}

} // namespace tamblo
