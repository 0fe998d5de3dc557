#pragma once

#include "platform/Preferences.h"
#include "platform/StructuredLog.h"

#include <sys/stat.h>

namespace tamblo {

/// Who may use the files and directories that the service makes below the logs directory: their owner alone,
/// unless the device's maker lets others in. Preferences of the domain `com.vandra.tamblo.sinks`, octal
/// texts: `file_mode` and `directory_mode`. What is already there keeps its mode.
struct FileModes {
    mode_t file = S_IRUSR | S_IWUSR;
    mode_t directory = S_IRWXU;

    /// A value that is no such text is one error line, and counts as absent; what the owner needs is added.
    [[nodiscard]] static FileModes read(const Preferences& preferences, StructuredLog& log);
};

} // namespace tamblo
