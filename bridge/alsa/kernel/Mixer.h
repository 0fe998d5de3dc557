#pragma once

#include <memory>
#include <optional>

namespace tamblo::alsa {

/// What a card's mixer makes of a signal.
struct MixerVolume {
    double linear = 1; ///< the factor by which it is multiplied, of the loudest channel
    bool isMuted = false;

    bool operator==(const MixerVolume&) const = default;
};

/// One card's mixer. The loop's thread; nothing waits.
class Mixer {
public:
    virtual ~Mixer() = default;
    /// Readable when a control has changed; -1 when that will not be told.
    [[nodiscard]] virtual int descriptor() const = 0;
    /// Takes in what has changed.
    virtual void read() = 0;
    /// As it is at this moment: that of a card without any volume leaves the signal as it is. Nothing when it
    /// cannot be told.
    [[nodiscard]] virtual std::optional<MixerVolume> volume(bool isInput) = 0;
};

class Mixers {
public:
    virtual ~Mixers() = default;
    /// Nothing when the card's mixer cannot be had.
    [[nodiscard]] virtual std::unique_ptr<Mixer> open(unsigned card) = 0;
};

} // namespace tamblo::alsa
