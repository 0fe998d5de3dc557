#pragma once

#include "bridge/alsa/kernel/Mixer.h"
#include "bridge/alsa/kernel/SoundFiles.h"
#include "bridge/alsa/report/Xruns.h"
#include "bridge/common/ServiceTypes.h"
#include "bridge/common/SessionPool.h"
#include "bridge/common/Settings.h"

#include <chrono>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::alsa {

/// Which sessions there are: one for each process and direction that has PCMs open. What they say is had by
/// looking: at a device when it was opened or closed, a moment later, as many sounds are short, and then at
/// all that are open, once a second while one of them runs. That a PCM began or ended to run before it was
/// looked at, the kernel tells, and so it is reported.
///
/// The loop's thread.
class PcmSessions final : public bridge::ReporterListener, public bridge::Timed {
public:
    /// From an opening or a close to the second look.
    static constexpr std::chrono::milliseconds kSecondLook{100};
    static constexpr std::chrono::seconds kInterval{1};
    /// Between looks while nothing has run for some time.
    static constexpr std::chrono::seconds kLongInterval{5};
    static constexpr std::chrono::seconds kSomeTime{10};
    /// From a change of a mixer to the look at it: a slider that is drawn changes all the time.
    static constexpr std::chrono::milliseconds kSettling{60};
    /// Open PCMs; those beyond are not reported.
    static constexpr std::size_t kMostOpen = 1024;

    PcmSessions(const SoundFiles& files, Mixers& mixers, bridge::Reporter& reporter,
                const bridge::Clock& clock, const bridge::ServiceTypes& types);

    /// A device's node in the devices' directory was opened or closed, has come or gone; or, without a name,
    /// any may have been.
    void nodeTouched(std::optional<std::string_view> node);
    /// Descriptors to wait for; each of them is followed by `readMixers` when it is ready.
    void addDescriptors(std::vector<int>& descriptors) const;
    void readMixers();

    void reporterCame() override;
    void reporterWent() override;
    [[nodiscard]] std::optional<bridge::SteadyTime> due() const override;
    void run() override;
    /// This program goes.
    void endAll();

    [[nodiscard]] std::size_t openNumber() const noexcept { return open_.size(); }

private:
    using Key = bridge::SessionPool::Key;

    struct OpenPcm {
        Owner owner;
        std::string device;
        PcmStatus status; ///< as of the last look
        std::optional<PcmFormat> format;
        bridge::Moment lookedAt;
        bridge::Moment changedAt; ///< when its state was last another one
    };

    void lookAgain();
    void look(const PcmName& name, bool isTouched);
    void opened(const PcmName& name, const PcmStatus& status, const bridge::Moment& now);
    void changed(const PcmName& name, OpenPcm& pcm, const PcmStatus& status, const bridge::Moment& now);
    void closed(const PcmName& name, const bridge::Moment& now);
    void vanished(const PcmName& name, const bridge::Moment& now);
    [[nodiscard]] bridge::Moment lastTrigger(const OpenPcm& pcm, const PcmStatus& status,
                                             const bridge::Moment& now) const;
    void countXruns(const PcmName& name, const OpenPcm& pcm, const PcmStatus& status, double secondsLost);

    void update(Key session, const bridge::Moment& at);
    [[nodiscard]] bridge::StreamSettings settingsOf(Key session);
    [[nodiscard]] Mixer* mixerOf(unsigned card);

    const SoundFiles& files_;
    Mixers& mixers_;
    bridge::Reporter& reporter_;
    const bridge::Clock& clock_;
    const bridge::ServiceTypes& types_;
    bridge::SessionPool pool_;
    Xruns xruns_;
    std::map<PcmName, OpenPcm> open_;
    std::map<unsigned, std::unique_ptr<Mixer>> cards_; ///< those with an open PCM; nothing for no mixer
    std::optional<bridge::SteadyTime> nextLook_;
    std::optional<bridge::SteadyTime> mixersSettle_;
    std::int64_t issues_ = 0;
};

} // namespace tamblo::alsa
