#include "bridge/pipewire/server/Context.h"

#include <stdexcept>
#include <string>

#include <pipewire/impl.h>
#include <pipewire/pipewire.h>

namespace tamblo::pipewire {

pw_context* makeContext(pw_loop* loop, std::span<const char* const> modules) {
    pw_context* const context = pw_context_new(
        loop, pw_properties_new(PW_KEY_CONFIG_NAME, "null", PW_KEY_APP_NAME, "tamblo-pipewire", nullptr), 0);
    if (context == nullptr) {
        throw std::runtime_error("PipeWire's library cannot be set up");
    }
    if (pw_data_loop* const dataLoop = pw_context_get_data_loop(context)) {
        pw_data_loop_stop(dataLoop);
    }
    for (const char* const module : modules) {
        if (pw_context_load_module(context, module, nullptr, nullptr) == nullptr) {
            pw_context_destroy(context);
            throw std::runtime_error(std::string("PipeWire's library lacks ") + module);
        }
    }
    return context;
}

} // namespace tamblo::pipewire
