#pragma once

#include "bridge/pipewire/graph/Objects.h"

#include <optional>

struct spa_pod;

namespace tamblo::pipewire {

/// Reads of parameters what the model has of them. They come from other processes by way of the server: what
/// does not have the shape that it should is nothing.
[[nodiscard]] std::optional<Format> formatOf(const spa_pod* parameter);
[[nodiscard]] std::optional<Volume> volumeOf(const spa_pod* parameter);
[[nodiscard]] std::optional<Route> routeOf(const spa_pod* parameter);

struct Profile {
    bool isOff = false;
    std::string name;
    std::string description;
};
[[nodiscard]] std::optional<Profile> profileOf(const spa_pod* parameter);

} // namespace tamblo::pipewire
