#pragma once

#include "platform/ChanlogFacility.h"

#include <memory>
#include <string>
#include <utility>
#include <variant>
#include <vector>

namespace tamblo {

/// Channels and failures as a test sets them. What has been gained between two samples is what the later one
/// says: the figures of a channel are those of a difference.
class FakeChanlogFacility final : public ChanlogFacility {
public:
    /// What there is from now on.
    std::vector<ChanlogChannel> channels;
    /// Error codes in place of an answer; none when empty. 0 is a failure without a code.
    std::optional<int> channelsError;
    std::optional<int> subscribeError;
    std::optional<int> sampleError;
    /// The selections asked for with `channelsOf`, "GROUP-SUBGROUP ", then `s` for each sample, `d` for each
    /// difference; a sampling begins with `|`.
    std::string calls;

    [[nodiscard]] std::unique_ptr<ChanlogSampling> beginSampling() override {
        calls += '|';
        return std::make_unique<Sampling>(*this);
    }
    [[nodiscard]] std::variant<std::unique_ptr<ChanlogSubscription>, int>
    subscribe(const ChanlogSelection& selection, const ChanlogChannels& subscribed) override {
        if (subscribeError) {
            return *subscribeError;
        }
        return std::make_unique<Subscription>(selection, subscribed);
    }
    [[nodiscard]] std::variant<ChanlogChannels, int> difference(const ChanlogChannels& earlier,
                                                                const ChanlogChannels& later) override {
        calls += 'd';
        constexpr int kNoEarlierSample = 2;
        if (earlier == nullptr) {
            return kNoEarlierSample;
        }
        return later;
    }

private:
    struct Subscription final : ChanlogSubscription {
        Subscription(ChanlogSelection chosen, ChanlogChannels found)
            : selection(std::move(chosen)), subscribed(std::move(found)) {}
        [[nodiscard]] const ChanlogChannels& subscribedChannels() const override { return subscribed; }

        ChanlogSelection selection;
        ChanlogChannels subscribed;
    };

    struct Sampling final : ChanlogSampling {
        explicit Sampling(FakeChanlogFacility& owner) : facility(owner) {}
        [[nodiscard]] std::variant<ChanlogChannels, int>
        channelsOf(const ChanlogSelection& selection) override {
            facility.calls +=
                selection.groupName.value_or("") + "-" + selection.subGroupName.value_or("") + " ";
            if (facility.channelsError) {
                return *facility.channelsError;
            }
            return facility.select(selection);
        }
        [[nodiscard]] std::variant<ChanlogChannels, int> sample(ChanlogSubscription& subscription) override {
            facility.calls += 's';
            if (facility.sampleError) {
                return *facility.sampleError;
            }
            return facility.select(static_cast<Subscription&>(subscription).selection);
        }

        FakeChanlogFacility& facility;
    };

    [[nodiscard]] ChanlogChannels select(const ChanlogSelection& selection) const {
        auto selected = std::make_shared<std::vector<ChanlogChannelRef>>();
        for (const ChanlogChannel& channel : channels) {
            if ((!selection.groupName || channel.groupName == selection.groupName) &&
                (!selection.subGroupName || channel.subGroupName == selection.subGroupName)) {
                selected->push_back(std::make_shared<const ChanlogChannel>(channel));
            }
        }
        return selected;
    }
};

} // namespace tamblo
