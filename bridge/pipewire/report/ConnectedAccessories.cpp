#include "bridge/pipewire/report/ConnectedAccessories.h"

#include "wire/ConnectedAccessories.h"

#include <algorithm>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo::pipewire {

namespace {

/// "bluetooth:054c" and "0x0d58" are "bluetooth:054c:0d58".
std::string modelOf(const Device& device) {
    std::string_view product = device.product;
    product.remove_prefix(product.starts_with("0x") ? 2 : 0);
    return device.vendor.empty() || product.empty() ? std::string()
                                                    : device.vendor + ":" + std::string(product);
}

std::string connectedIn(const Graph& graph) {
    std::vector<wire::ConnectedAccessory> accessories;
    for (const auto& [id, device] : graph.devices()) {
        if (!device.identifier.empty() && accessories.size() < wire::kMostConnectedAccessories) {
            accessories.push_back({device.identifier, modelOf(device), device.formFactor});
        }
    }
    std::sort(accessories.begin(), accessories.end(),
              [](const auto& a, const auto& b) { return a.identifier < b.identifier; });
    return wire::connectedAccessoriesText(accessories);
}

} // namespace

ConnectedAccessories::ConnectedAccessories(const Graph& graph, const Clock& clock,
                                           const std::string& directory)
    : graph_(graph), clock_(clock), file_(directory + "/" + std::string(wire::kConnectedAccessoriesFile)) {}

void ConnectedAccessories::graphChanged(const GraphEvent& event) {
    if (event.kind == GraphEvent::Kind::device || event.kind == GraphEvent::Kind::server) {
        lookSoon();
    }
}

/// The service makes the directory, and may have made it anew.
void ConnectedAccessories::reporterCame() {
    written_.clear();
    lookSoon();
}

void ConnectedAccessories::lookSoon() {
    if (!due_) {
        due_ = clock_.now().steady + kSettling;
    }
}

void ConnectedAccessories::run() {
    due_.reset();
    const bool isKnown = !graph_.server().version.empty();
    std::string now = isKnown ? connectedIn(graph_) : std::string();
    if (now == written_) {
        return;
    }
    if (now.empty()) {
        file_.remove();
        written_.clear();
    } else {
        // One that cannot be written is tried again when something changes: the service goes by the records.
        written_ = file_.write(now) == 0 ? std::move(now) : std::string();
    }
}

} // namespace tamblo::pipewire
