#pragma once

#include "bridge/common/ServiceTypes.h"
#include "os/DirectoryWatcher.h"
#include "os/PreferenceFile.h"

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::bridge {

/// The file in which a program's preferences say service types, and what comes of it when it changes.
///
/// The loop's thread.
class ServiceTypePreferences {
public:
    ServiceTypePreferences(const std::string& directory, std::string_view domain, ServiceTypes& types);

    /// Readable when there is something to take in.
    [[nodiscard]] int descriptor() const noexcept { return watcher_.fileDescriptor(); }
    /// Takes in what the file says, at the start and after each change; what is wrong with it, in lines.
    [[nodiscard]] std::vector<std::string> read();

private:
    const std::optional<PreferenceFile> file_;
    DirectoryWatcher watcher_;
    ServiceTypes& types_;
};

} // namespace tamblo::bridge
