#include "bridge/alsa/Bridge.h"

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <limits>
#include <set>
#include <string_view>
#include <vector>

#include <poll.h>
#include <sys/signalfd.h>
#include <unistd.h>

namespace tamblo::alsa {

using std::chrono::milliseconds;

namespace {

constexpr std::string_view kPreferencesDomain = "com.vandra.tamblo.alsa";
/// Between two readings of what was opened and closed, however often that happens.
constexpr milliseconds kRest{20};
/// How long the program's end may take.
constexpr milliseconds kFarewell{1000};

void log(const std::string& line) {
    std::fprintf(stderr, "tamblo-alsa: %s\n", line.c_str());
}

int endingSignals() {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    return ::signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK);
}

} // namespace

Bridge::Bridge(const Options& options, const wire::Directories& directories)
    : options_(options),
      files_(options.processes),
      mixers_(options.devices),
      text_(stdout),
      service_(directories.socketFile()),
      reporter_(options.isDry ? static_cast<bridge::Reporter&>(text_) : service_),
      sessions_(files_, mixers_, reporter_, clock_, serviceTypes_),
      servicePlace_(directories.socketFile(), clock_),
      preferences_(directories.preferences(), kPreferencesDomain, serviceTypes_),
      devices_(options.devices, DirectoryWatcher::Watch::use),
      signals_(endingSignals()) {
    service_.addListener(sessions_);
}

int Bridge::run() {
    readPreferences();
    if (const std::string fault = devices_.fault(); !fault.empty()) {
        log(fault);
    }
    if (!options_.once && !files_.isThere()) {
        log("there is no sound yet: " + options_.processes + "/asound is missing");
    }
    // The devices are watched already: what is opened from now on is told.
    sessions_.nodeTouched(std::nullopt);
    while (!status_) {
        if (devicesDue_ && *devicesDue_ <= clock_.now().steady) {
            readDevices();
        }
        if (const auto due = sessions_.due(); due && *due <= clock_.now().steady) {
            sessions_.run();
        }
        if (!options_.isDry && servicePlace_.due() && *servicePlace_.due() <= clock_.now().steady) {
            reachService();
        }
        if (options_.once) {
            takeSnapshot();
        }
        pump();
        if (!status_) {
            waitForSomething();
        }
    }
    sessions_.endAll();
    service_.finish(kFarewell);
    return *status_;
}

void Bridge::readPreferences() {
    for (const std::string& fault : preferences_.read()) {
        log(fault);
    }
}

void Bridge::reachService() {
    if (!service_.connect()) {
        servicePlace_.failed();
        return;
    }
    servicePlace_.connected();
    log("reports to " + service_.socketPath());
}

/// A device that was opened and closed many times is looked at once.
void Bridge::readDevices() {
    std::set<std::string, std::less<>> touched;
    bool mayBeAny = false;
    devices_.read([&](std::optional<std::string_view> node) {
        mayBeAny = mayBeAny || !node;
        touched.emplace(node.value_or(""));
    });
    if (mayBeAny) {
        sessions_.nodeTouched(std::nullopt);
    } else {
        std::ranges::for_each(touched, [this](const std::string& node) { sessions_.nodeTouched(node); });
    }
    devicesReadAt_ = clock_.now().steady;
    devicesDue_.reset();
}

void Bridge::pump() {
    if (service_.isReachable() && !service_.pump()) {
        log("the service has gone");
        servicePlace_.lost();
    }
}

/// Ends the program, when everything is said, or when it will not be.
void Bridge::takeSnapshot() {
    if (!files_.isThere()) {
        log("there is no sound: " + options_.processes + "/asound is missing");
        status_ = EXIT_FAILURE;
    } else if (reporter_.isReachable()) {
        status_ = EXIT_SUCCESS;
    } else if (!servicePlace_.due()) {
        log("the service does not answer at " + service_.socketPath());
        status_ = EXIT_FAILURE;
    }
}

std::optional<bridge::SteadyTime> Bridge::due() const {
    std::optional<bridge::SteadyTime> due = sessions_.due();
    bridge::bringForward(due, devicesDue_);
    if (!options_.isDry) {
        bridge::bringForward(due, servicePlace_.due());
    }
    return due;
}

void Bridge::waitForSomething() {
    enum Place : std::size_t { signals, devices, preferences, service, mixers };
    const auto reading = [](int descriptor) {
        return pollfd{.fd = descriptor, .events = POLLIN, .revents = 0};
    };
    std::vector<pollfd> places(mixers);
    places[signals] = reading(signals_.get());
    places[devices] = reading(devicesDue_ ? -1 : devices_.fileDescriptor());
    places[preferences] = reading(preferences_.descriptor());
    places[service] = reading(service_.isReachable() ? service_.descriptor()
                              : options_.isDry       ? -1
                                                     : servicePlace_.descriptor());
    if (service_.wantsWriting()) {
        places[service].events |= POLLOUT;
    }
    std::vector<int> descriptors;
    sessions_.addDescriptors(descriptors);
    std::ranges::transform(descriptors, std::back_inserter(places), reading);

    int timeout = -1;
    if (const auto wake = due()) {
        const auto left = std::chrono::ceil<milliseconds>(*wake - clock_.now().steady).count();
        timeout = static_cast<int>(std::clamp<std::int64_t>(left, 0, std::numeric_limits<int>::max()));
    }
    if (::poll(places.data(), places.size(), timeout) <= 0) {
        return;
    }
    if (places[signals].revents != 0) {
        status_ = EXIT_SUCCESS;
    }
    if (places[devices].revents != 0) {
        devicesDue_ = std::max(clock_.now().steady, devicesReadAt_ + kRest);
    }
    if (places[preferences].revents != 0) {
        readPreferences();
    }
    // What the service says when it is reached, is taken in before the next wait.
    if (places[service].revents != 0 && !service_.isReachable()) {
        servicePlace_.read();
    }
    if (std::any_of(places.begin() + mixers, places.end(),
                    [](const pollfd& place) { return place.revents != 0; })) {
        sessions_.readMixers();
    }
}

} // namespace tamblo::alsa
