#include "Bystander.h"

#include "../FrameChannel.h"
#include "../Processes.h"
#include "Assault.h"
#include "Users.h"

#include <stdexcept>
#include <thread>

namespace tamblo::bench {

namespace {

using Clock = std::chrono::steady_clock;

constexpr std::chrono::milliseconds kPause{2};

double millisecondsSince(Clock::time_point begin) {
    return std::chrono::duration<double, std::milli>(Clock::now() - begin).count();
}

} // namespace

Bystander::Bystander(const std::string& socketPath)
    : process_(kAnyProcessor, [socketPath, this] {
          becomeUser(kOtherUser);
          run(socketPath, *state_);
      }) {
    while (!state_->isResting) {
        if (isLost()) {
            throw std::runtime_error("the other user's client is not served; can its user reach " +
                                     socketPath + "? (TMPDIR says where it is made)");
        }
        std::this_thread::sleep_for(kPause);
    }
}

void Bystander::run(const std::string& socketPath, State& state) {
    FrameChannel channel(socketPath);
    channel.limitWaits(kLongestWait);
    channel.beginSession(kReporterID);
    channel.finish();
    state.isResting = true;
    wire::Request request = messageFor(kReporterID, {});
    for (std::uint64_t number = 1; state.count < kMostSamples;) {
        if (!state.sends) {
            state.isResting = true;
            std::this_thread::sleep_for(kPause);
            continue;
        }
        state.isResting = false;
        request.dictionary = Dictionary{{kKey, number}};
        const Phase phase = state.phase;
        const Clock::time_point begin = Clock::now();
        bool isAnswered = true;
        try {
            (void)channel.call(request);
        } catch (const std::exception&) {
            isAnswered = false;
        }
        const double waited = isAnswered ? millisecondsSince(begin)
                                         : std::chrono::duration<double, std::milli>(kLongestWait).count();
        state.samples[state.count] = {static_cast<float>(waited), phase};
        ++state.count;
        if (!isAnswered) {
            break;
        }
        state.answered = number++;
        std::this_thread::sleep_for(kPause);
    }
    state.hasGivenUp = true;
    state.isResting = true;
}

void Bystander::send(Phase phase) {
    state_->phase = phase;
    state_->isResting = state_->hasGivenUp.load();
    state_->sends = true;
}

void Bystander::rest() {
    state_->sends = false;
    const auto end = Clock::now() + kLongestWait + std::chrono::seconds(1);
    while (!state_->isResting && Clock::now() < end) {
        std::this_thread::sleep_for(kPause);
    }
}

bool Bystander::isLost() const {
    return !state_->hasGivenUp && process_.hasEnded();
}

std::vector<double> Bystander::milliseconds(Phase phase) const {
    std::vector<double> found;
    for (std::size_t i = 0; i < state_->count; ++i) {
        if (state_->samples[i].phase == phase) {
            found.push_back(static_cast<double>(state_->samples[i].milliseconds));
        }
    }
    return found;
}

} // namespace tamblo::bench
