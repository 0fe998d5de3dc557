#pragma once

#include "bridge/common/Reporter.h"
#include "bridge/common/Time.h"
#include "bridge/pipewire/graph/Graph.h"
#include "bridge/pipewire/graph/Namespace.h"
#include "os/HeldFile.h"

#include <chrono>
#include <optional>
#include <string>

namespace tamblo::pipewire {

/// Tells the service which Bluetooth accessories are connected now, for as long as the sound server is there
/// and this program runs: in a file (`wire/ConnectedAccessories.h`), as it is nothing for a report. The
/// loop's thread.
class ConnectedAccessories final : public GraphObserver, public ReporterListener, public Timed {
public:
    static constexpr std::chrono::milliseconds kSettling{100};

    ConnectedAccessories(const Graph& graph, const Clock& clock, const std::string& directory);

    void graphChanged(const GraphEvent& event) override;
    void reporterCame() override;
    void reporterWent() override {}
    [[nodiscard]] std::optional<SteadyTime> due() const override { return due_; }
    void run() override;

private:
    void lookSoon();

    const Graph& graph_;
    const Clock& clock_;
    HeldFile file_;
    std::string written_; ///< empty: nothing is told
    std::optional<SteadyTime> due_;
};

} // namespace tamblo::pipewire
