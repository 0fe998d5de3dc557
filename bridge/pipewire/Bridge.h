#pragma once

#include "bridge/common/Endpoint.h"
#include "bridge/common/ServiceReporter.h"
#include "bridge/common/ServiceTypePreferences.h"
#include "bridge/common/ServiceTypes.h"
#include "bridge/common/TextReporter.h"
#include "bridge/pipewire/graph/Graph.h"
#include "bridge/pipewire/graph/Namespace.h"
#include "bridge/pipewire/report/ConnectedAccessories.h"
#include "bridge/pipewire/report/CycleLengths.h"
#include "bridge/pipewire/report/DeviceSession.h"
#include "bridge/pipewire/report/Overloads.h"
#include "bridge/pipewire/report/StreamSessions.h"
#include "bridge/pipewire/report/Troubles.h"
#include "bridge/pipewire/server/Loop.h"
#include "bridge/pipewire/server/Profiler.h"
#include "bridge/pipewire/server/SoundServer.h"
#include "wire/Directories.h"

#include <memory>
#include <optional>
#include <string>

namespace tamblo::pipewire {

/// The program: owns the graph, the sound server's connection that fills it, those who report from it, and
/// the connection to the service; has each of the two connections tried when there is hope, in any order.
class Bridge {
public:
    struct Options {
        bool isDry = false; ///< writes down what would be reported
        bool once = false;  ///< reports what there is now, and ends
    };

    Bridge(const Options& options, const wire::Directories& directories);

    /// Until SIGTERM or SIGINT, which are to be blocked before the first thread is made. The exit status.
    [[nodiscard]] int run();

private:
    /// A place whose socket is waited for, and the loop's watch of it.
    struct Place {
        Endpoint endpoint;
        std::unique_ptr<Loop::Watch> watch{};

        [[nodiscard]] bool isDue(const Clock& clock) const {
            return endpoint.due() && *endpoint.due() <= clock.now().steady;
        }
    };

    /// Of a stream its own, of any other node the device's.
    [[nodiscard]] SessionID sessionOf(ObjectID node) const;
    void readPreferences();
    void watchPlace(Place& place);
    void tellOfSilence(const Place& place, const std::string& line) const;
    void reachService();
    void reachServer();
    void leaveServer();
    /// Everything that was reported leaves; when to be called again at the latest.
    [[nodiscard]] std::optional<SteadyTime> beforeSleep();
    void tellOfLimits();
    void takeSnapshot();
    void fail(const std::string& line);

    const Options options_;
    const std::string serverSocket_;
    SystemClock clock_;
    Loop loop_;
    Graph graph_;
    ServiceTypes serviceTypes_;
    TextReporter text_;
    ServiceReporter service_;
    Reporter& reporter_; ///< the one of the two that is used
    StreamSessions streams_;
    DeviceSession device_;
    ConnectedAccessories accessories_;
    Overloads overloads_;
    Troubles troubles_;
    CycleLengths cycleLengths_;
    Profiler profiler_;
    SoundServer server_;
    Place serverPlace_;
    Place servicePlace_;
    ServiceTypePreferences preferences_;
    std::unique_ptr<Loop::Watch> serviceWatch_;
    std::optional<SteadyTime> snapshotDue_; ///< when it is given up
    bool isBeyondLimits_ = false;
    int status_ = 0;
};

} // namespace tamblo::pipewire
