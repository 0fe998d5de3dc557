#pragma once

#include "FleetModel.h"
#include "ServiceOnDisk.h"

#include <memory>
#include <string>

namespace tamblo::bench::fleet {

/// Plays what happens on a device to its service, day after day.
class Player {
public:
    Player(const Device& device, const Faults& faults, ServiceOnDisk& service, Random& random)
        : device_(device), faults_(faults), service_(service), random_(random) {}

    /// The day that begins at that midnight (UTC), whose number counts from the fleet's first.
    void playDay(int day, WallTime midnight);

private:
    class Session;

    void play(const Use& use, WallTime midnight, int day);
    /// What happens while a use's sound runs.
    void playSound(Session& session, const Use& use, WallTime start, int day);
    void showAccessory(int day);
    [[nodiscard]] Dictionary settingsOf(const Use& use);

    const Device& device_;
    const Faults& faults_;
    ServiceOnDisk& service_;
    Random& random_;
    pid_t lastProcess_ = 1000;
    int lastIssue_ = 0;
};

} // namespace tamblo::bench::fleet
