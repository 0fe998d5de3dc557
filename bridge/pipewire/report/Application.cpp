#include "bridge/pipewire/report/Application.h"

namespace tamblo::pipewire {

std::string applicationOf(const Node& stream, const Client* client) {
    const ApplicationNames none;
    const ApplicationNames& own = stream.application;
    const ApplicationNames& clients = client == nullptr ? none : client->application;
    for (const std::string* const name : {&clients.portal, &own.identifier, &clients.identifier, &own.binary,
                                          &clients.binary, &own.name, &clients.name}) {
        if (!name->empty()) {
            return *name;
        }
    }
    return "Unknown";
}

} // namespace tamblo::pipewire
