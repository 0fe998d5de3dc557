#pragma once

#include "platform/ChanlogFacility.h"

#include <memory>
#include <utility>
#include <variant>
#include <vector>

namespace tamblo {

/// Without any channel.
class FakeChanlogFacility final : public ChanlogFacility {
public:
    [[nodiscard]] std::variant<ChanlogChannels, int> channelsOf(const ChanlogSelection&) override {
        return std::make_shared<const std::vector<ChanlogChannel>>();
    }
    [[nodiscard]] std::variant<std::unique_ptr<ChanlogSubscription>, int>
    subscribe(const ChanlogSelection&, const ChanlogChannels&) override {
        return 1;
    }
    [[nodiscard]] std::unique_ptr<ChanlogSampling> beginSampling() override {
        return std::make_unique<Sampling>();
    }
    [[nodiscard]] std::variant<ChanlogChannels, int> difference(const ChanlogChannels&,
                                                                const ChanlogChannels&) override {
        return 1;
    }

private:
    struct Sampling final : ChanlogSampling {
        [[nodiscard]] std::variant<ChanlogChannels, int> sample(const ChanlogSubscription&) override {
            return 1;
        }
    };
};

} // namespace tamblo
