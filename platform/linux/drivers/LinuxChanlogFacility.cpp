#include "platform/linux/drivers/LinuxChanlogFacility.h"

#include "base/Format.h"
#include "platform/Counters.h"

#include <algorithm>
#include <cerrno>
#include <functional>
#include <iterator>
#include <string_view>
#include <unordered_set>
#include <utility>
#include <vector>

namespace tamblo {

namespace {

bool fits(const ChanlogChannel& channel, const ChanlogSelection& selection) noexcept {
    return (!selection.groupName || channel.groupName == selection.groupName) &&
           (!selection.subGroupName || channel.subGroupName == selection.subGroupName);
}

ChanlogChannels select(const ChanlogChannels& all, const ChanlogSelection& selection) {
    auto selected = std::make_shared<std::vector<ChanlogChannelRef>>();
    std::copy_if(all->begin(), all->end(), std::back_inserter(*selected),
                 [&selection](const ChanlogChannelRef& channel) { return fits(*channel, selection); });
    return selected;
}

bool areSame(const ChanlogChannelRef& left, const ChanlogChannelRef& right) noexcept {
    return left == right || (left->channelName == right->channelName && left->format == right->format &&
                             left->subGroupName == right->subGroupName &&
                             left->groupName == right->groupName && left->driverName == right->driverName);
}

struct SameChannel {
    bool operator()(const ChanlogChannelRef& left, const ChanlogChannelRef& right) const noexcept {
        return areSame(left, right);
    }
    std::size_t operator()(const ChanlogChannelRef& channel) const noexcept {
        const std::hash<std::string_view> hash;
        std::size_t sum = static_cast<std::size_t>(channel->format);
        for (const auto* name :
             {&channel->driverName, &channel->groupName, &channel->subGroupName, &channel->channelName}) {
            constexpr std::size_t kSpread = 31;
            sum = sum * kSpread + (*name ? hash(**name) : 0);
        }
        return sum;
    }
};

class Subscription final : public ChanlogSubscription {
public:
    Subscription(ChanlogSelection selection, ChanlogChannels channels)
        : selection_(std::move(selection)), subscribed_(std::move(channels)) {}

    [[nodiscard]] const ChanlogChannels& subscribedChannels() const override { return subscribed_; }

    ChanlogChannels sampleOf(const ChanlogChannels& all) {
        if (all != readFrom_) {
            sample_ = select(all, selection_);
            readFrom_ = all;
        }
        return sample_;
    }

private:
    const ChanlogSelection selection_;
    const ChanlogChannels subscribed_;
    ChanlogChannels readFrom_; ///< which the sample was taken from
    ChanlogChannels sample_;
};

class Sampling final : public ChanlogSampling {
public:
    explicit Sampling(LinuxChanlogFacility& facility) : facility_(facility) {}

    [[nodiscard]] std::variant<ChanlogChannels, int> channelsOf(const ChanlogSelection& selection) override {
        return select(all(), selection);
    }
    [[nodiscard]] std::variant<ChanlogChannels, int> sample(ChanlogSubscription& subscription) override {
        return static_cast<Subscription&>(subscription).sampleOf(all());
    }

private:
    const ChanlogChannels& all() {
        if (all_ == nullptr) {
            all_ = facility_.readAll();
        }
        return all_;
    }

    LinuxChanlogFacility& facility_;
    ChanlogChannels all_;
};

} // namespace

LinuxChanlogFacility::LinuxChanlogFacility(std::string channelDirectory, StructuredLog& log,
                                           std::string soundDirectory)
    : log_(log), files_(std::move(channelDirectory)), streams_(std::move(soundDirectory)), difference_(log) {}

std::unique_ptr<ChanlogSampling> LinuxChanlogFacility::beginSampling() {
    return std::make_unique<Sampling>(*this);
}

std::variant<std::unique_ptr<ChanlogSubscription>, int>
LinuxChanlogFacility::subscribe(const ChanlogSelection& selection, const ChanlogChannels& channels) {
    return std::make_unique<Subscription>(selection, channels);
}

std::variant<ChanlogChannels, int> LinuxChanlogFacility::difference(const ChanlogChannels& earlier,
                                                                    const ChanlogChannels& later) {
    if (earlier == nullptr || later == nullptr) {
        return ENOENT;
    }
    const MutexLock held(mutex_);
    return difference_.between(earlier, later);
}

ChanlogChannels LinuxChanlogFacility::readAll() {
    const MutexLock held(mutex_);
    const bool filesChanged = files_.read(log_);
    const bool streamsChanged = streams_.read(log_);
    if (all_ == nullptr || filesChanged || streamsChanged) {
        all_ = gather();
    }
    return all_;
}

ChanlogChannels LinuxChanlogFacility::gather() {
    std::vector<ChanlogChannelRef> found;
    files_.appendTo(found);
    streams_.appendTo(found);
    // As a rule only figures have changed, and what was found good of the channels before holds of these.
    if (all_ != nullptr && std::equal(found.begin(), found.end(), all_->begin(), all_->end(), areSame)) {
        isOverLimit_ = false;
        return std::make_shared<const std::vector<ChanlogChannelRef>>(std::move(found));
    }
    auto channels = std::make_shared<std::vector<ChanlogChannelRef>>();
    channels->reserve(std::min(found.size(), kMaximumChannels));
    std::unordered_set<ChanlogChannelRef, SameChannel, SameChannel> known(found.size());
    for (const ChanlogChannelRef& channel : found) {
        if (known.insert(channel).second && channels->size() < kMaximumChannels) {
            channels->push_back(channel);
        }
    }
    const bool isOver = known.size() > kMaximumChannels;
    if (isOver) {
        counters::add(counters::Counter::driverChannels, known.size() - kMaximumChannels);
    }
    if (isOver && !isOverLimit_) {
        log_.report(LogLevel::error, "zrrd",
                    formatted("{} driver statistics channels; those beyond {} are left out", known.size(),
                              kMaximumChannels));
    }
    isOverLimit_ = isOver;
    return channels;
}

} // namespace tamblo
