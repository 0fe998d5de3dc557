#pragma once

#include "bridge/alsa/kernel/ControlDevices.h"
#include "bridge/alsa/kernel/SoundFiles.h"
#include "bridge/alsa/report/PcmSessions.h"
#include "bridge/common/Endpoint.h"
#include "bridge/common/ServiceReporter.h"
#include "bridge/common/ServiceTypePreferences.h"
#include "bridge/common/ServiceTypes.h"
#include "bridge/common/TextReporter.h"
#include "os/DirectoryWatcher.h"
#include "os/FileDescriptor.h"
#include "wire/Directories.h"

#include <optional>
#include <string>

namespace tamblo::alsa {

/// The program: one thread, which waits for the devices' directory, for mixers, for the service, and for the
/// times at which to look; and does nothing else.
class Bridge {
public:
    struct Options {
        bool isDry = false; ///< writes down what would be reported
        bool once = false;  ///< reports what there is now, and ends
        std::string processes = "/proc";
        std::string devices = "/dev/snd";
    };

    Bridge(const Options& options, const wire::Directories& directories);

    /// Until SIGTERM or SIGINT, which are to be blocked. The exit status.
    [[nodiscard]] int run();

private:
    void readPreferences();
    void readDevices();
    void reachService();
    /// Everything that was reported leaves.
    void pump();
    void takeSnapshot();
    void waitForSomething();
    [[nodiscard]] std::optional<bridge::SteadyTime> due() const;

    const Options options_;
    bridge::SystemClock clock_;
    const SoundFiles files_;
    ControlDevices mixers_;
    bridge::ServiceTypes serviceTypes_;
    bridge::TextReporter text_;
    bridge::ServiceReporter service_;
    bridge::Reporter& reporter_; ///< the one of the two that is used
    PcmSessions sessions_;
    bridge::Endpoint servicePlace_;
    bridge::ServiceTypePreferences preferences_;
    DirectoryWatcher devices_;
    bridge::SteadyTime devicesReadAt_{};
    std::optional<bridge::SteadyTime> devicesDue_; ///< when what was opened and closed is to be read
    FileDescriptor signals_;
    std::optional<int> status_; ///< when the program is to end
};

} // namespace tamblo::alsa
