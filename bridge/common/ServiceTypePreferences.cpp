#include "bridge/common/ServiceTypePreferences.h"

#include <variant>

namespace tamblo::bridge {

ServiceTypePreferences::ServiceTypePreferences(const std::string& directory, std::string_view domain,
                                               ServiceTypes& types)
    : file_(PreferenceFile::of(directory, domain)), watcher_(directory), types_(types) {}

std::vector<std::string> ServiceTypePreferences::read() {
    watcher_.read([](auto) {});
    if (!file_) {
        return {};
    }
    const auto content = file_->read();
    if (const auto* const fault = std::get_if<std::string>(&content)) {
        return {*fault};
    }
    std::vector<std::string> faults = types_.setPreferences(std::get<Dictionary>(content));
    for (std::string& fault : faults) {
        fault.insert(0, file_->path() + ": ");
    }
    return faults;
}

} // namespace tamblo::bridge
