#pragma once

#include <span>

struct pw_context;
struct pw_loop;

namespace tamblo::pipewire {

/// PipeWire's library set up without a configuration file: those load modules that this program has no use
/// for, one of which asks for a real-time thread. Nor has it any use for the thread that moves sound. To be
/// destroyed before the loop; throws `std::runtime_error` when the library lacks a module.
[[nodiscard]] pw_context* makeContext(pw_loop* loop, std::span<const char* const> modules);

} // namespace tamblo::pipewire
