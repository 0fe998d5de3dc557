#pragma once

#include "bridge/pipewire/graph/Objects.h"

#include <string_view>

namespace tamblo::pipewire {

/// The edge of the model: each takes one of an object's properties if it is on the list of those that may
/// enter, cut and cleaned, and ignores any other. Titles, file names, addresses, serial numbers, users and
/// hosts are on no list, so they can reach no report; the name of a node on USB, which has a serial number,
/// is reported only by `filterName`. Values may be of any length and any bytes; what makes no sense counts as
/// not said.
void takeProperty(Client& client, std::string_view key, std::string_view value);
void takeProperty(Device& device, std::string_view key, std::string_view value);
void takeProperty(Node& node, std::string_view key, std::string_view value);
void takeProperty(Link& link, std::string_view key, std::string_view value);
/// Of a route's own information.
void takeProperty(Route& route, std::string_view key, std::string_view value);

/// What a metadata object says of all (the subject 0): the default devices and the clock.
void takeMetadata(Server& server, std::string_view key, std::string_view value);

} // namespace tamblo::pipewire
