#include "bridge/pipewire/Bridge.h"

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <utility>

namespace tamblo::pipewire {

using std::chrono::milliseconds;

namespace {

constexpr std::string_view kPreferencesDomain = "com.vandra.tamblo.pipewire";
/// How long the program's end may take.
constexpr milliseconds kFarewell{1000};
/// How long `--once` waits for a server that is connected, and says nothing.
constexpr milliseconds kPatience{5000};

void log(const std::string& line) {
    std::fprintf(stderr, "tamblo-pipewire: %s\n", line.c_str());
}

} // namespace

Bridge::Bridge(const Options& options, const wire::Directories& directories)
    : options_(options),
      serverSocket_(SoundServer::findSocket()),
      loop_(clock_),
      text_(stdout),
      service_(directories.socketFile()),
      reporter_(options.isDry ? static_cast<Reporter&>(text_) : service_),
      streams_(graph_, reporter_, clock_, serviceTypes_),
      device_(graph_, reporter_, clock_),
      accessories_(graph_, clock_, directories.accessories()),
      overloads_(graph_, reporter_, clock_, [this](ObjectID node) { return sessionOf(node); }),
      troubles_(graph_, reporter_, clock_, [this](ObjectID node) { return sessionOf(node); }),
      cycleLengths_(graph_),
      profiler_(graph_, clock_, {&overloads_, &cycleLengths_}, serverSocket_),
      server_(loop_, graph_, serverSocket_),
      serverPlace_{Endpoint(serverSocket_, clock_)},
      servicePlace_{Endpoint(directories.socketFile(), clock_)},
      preferences_(directories.preferences(), kPreferencesDomain, serviceTypes_) {
    graph_.addObserver(streams_);
    graph_.addObserver(device_);
    service_.addListener(streams_);
    service_.addListener(device_);
    loop_.addTimed(streams_);
    loop_.addTimed(device_);
    if (!options.once) {
        graph_.addObserver(overloads_);
        graph_.addObserver(profiler_);
        graph_.addObserver(troubles_);
        if (!options.isDry) {
            graph_.addObserver(accessories_);
            service_.addListener(accessories_);
            loop_.addTimed(accessories_);
        }
        loop_.addTimed(profiler_);
        loop_.addTimed(overloads_);
        loop_.addTimed(troubles_);
    }
}

SessionID Bridge::sessionOf(ObjectID node) const {
    if (const SessionID session = streams_.sessionOf(node); session != kNoSession) {
        return session;
    }
    const Node* const known = graph_.node(node);
    const bool isOfDevice = known != nullptr && (!known->isStream() || !known->linkGroup.empty());
    return isOfDevice ? device_.id() : kNoSession;
}

int Bridge::run() {
    readPreferences();
    std::vector<std::unique_ptr<Loop::Watch>> watches;
    for (const int signal : {SIGTERM, SIGINT}) {
        watches.push_back(loop_.watchSignal(signal, [this] { loop_.stop(); }));
    }
    watches.push_back(loop_.watch(preferences_.descriptor(), [this] { readPreferences(); }));
    watchPlace(serverPlace_);
    if (!options_.isDry) {
        watchPlace(servicePlace_);
    }
    if (options_.once) {
        snapshotDue_ = clock_.now().steady + kPatience;
    }
    loop_.run([this] { return beforeSleep(); });
    // What the graph loses when the connection goes is no news.
    graph_.removeObservers();
    streams_.endAll();
    device_.end();
    service_.finish(kFarewell);
    return status_;
}

void Bridge::readPreferences() {
    for (const std::string& fault : preferences_.read()) {
        log(fault);
    }
}

void Bridge::watchPlace(Place& place) {
    place.watch = loop_.watch(place.endpoint.descriptor(), [&place] { place.endpoint.read(); });
}

/// When it is given up until the socket changes. With `once` that is the end, which is told then.
void Bridge::tellOfSilence(const Place& place, const std::string& line) const {
    if (!place.endpoint.due() && !options_.once) {
        log(line + " yet");
    }
}

void Bridge::reachService() {
    if (!service_.connect()) {
        servicePlace_.endpoint.failed();
        tellOfSilence(servicePlace_, "the service does not answer at " + service_.socketPath());
        return;
    }
    servicePlace_.watch.reset();
    servicePlace_.endpoint.connected();
    log("reports to " + service_.socketPath());
    // What the service says is taken in before the next sleep.
    serviceWatch_ = loop_.watch(service_.descriptor(), [] {});
}

void Bridge::reachServer() {
    if (!server_.connect()) {
        serverPlace_.endpoint.failed();
        tellOfSilence(serverPlace_, "no sound server answers at " + serverSocket_);
        return;
    }
    serverPlace_.watch.reset();
    serverPlace_.endpoint.connected();
    log("watches " + serverSocket_);
}

void Bridge::leaveServer() {
    log("the sound server has gone");
    server_.disconnect();
    serverPlace_.endpoint.lost();
    watchPlace(serverPlace_);
}

std::optional<SteadyTime> Bridge::beforeSleep() {
    if (server_.hasGone()) {
        leaveServer();
    }
    if (serverPlace_.isDue(clock_)) {
        reachServer();
    }
    if (!options_.isDry && servicePlace_.isDue(clock_)) {
        reachService();
    }
    if (options_.once) {
        takeSnapshot();
    }
    if (service_.isReachable() && !service_.pump()) {
        log("the service has gone");
        serviceWatch_.reset();
        servicePlace_.endpoint.lost();
        watchPlace(servicePlace_);
    }
    if (serviceWatch_) {
        serviceWatch_->watchWriting(service_.wantsWriting());
    }
    tellOfLimits();
    std::optional<SteadyTime> due = serverPlace_.endpoint.due();
    if (!options_.isDry) {
        bringForward(due, servicePlace_.endpoint.due());
    }
    bringForward(due, snapshotDue_);
    return due;
}

/// Once: who brings so much should not fill the log as well.
void Bridge::tellOfLimits() {
    const bool isBeyond = graph_.leftOut() != 0 || streams_.leftOut() != 0;
    if (isBeyond && !std::exchange(isBeyondLimits_, true)) {
        log("the sound server has more than is watched: some of it is not reported");
    }
}

/// Ends the program, when everything is known, or when it will not be.
void Bridge::takeSnapshot() {
    if (server_.isConnected() && server_.isComplete() && reporter_.isReachable()) {
        streams_.settle();
        device_.settle();
        loop_.stop();
    } else if (!server_.isConnected() && !serverPlace_.endpoint.due()) {
        fail("no sound server answers at " + serverSocket_);
    } else if (!reporter_.isReachable() && !servicePlace_.endpoint.due()) {
        fail("the service does not answer at " + service_.socketPath());
    } else if (snapshotDue_ && *snapshotDue_ <= clock_.now().steady) {
        fail("the sound server says nothing at " + serverSocket_);
    }
}

void Bridge::fail(const std::string& line) {
    log(line);
    status_ = EXIT_FAILURE;
    loop_.stop();
}

} // namespace tamblo::pipewire
