#pragma once

#include "base/Dictionary.h"
#include "bridge/common/Reporter.h"

#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace tamblo::bridge {

/// Which service type a stream is reported under: by what its application is given in the preferences, else
/// by its role, as the preferences or the table of `docs/pipewire.md` have it. Roles are compared without
/// regard to case; what is no role is generic.
class ServiceTypes {
public:
    /// The keys of a program's preferences: objects of service types' names by role, and by application.
    static constexpr std::string_view kByRole = "service_types";
    static constexpr std::string_view kByApplication = "service_types_of_applications";
    /// What the preferences call the role of a stream that says none.
    static constexpr std::string_view kNoRole = "none";

    [[nodiscard]] ServiceType of(std::string_view role, std::string_view application) const;
    /// Takes the preferences' word from now on; what is wrong with it, a line for each entry that is left
    /// out.
    [[nodiscard]] std::vector<std::string> setPreferences(const Dictionary& preferences);

private:
    using Types = std::unordered_map<std::string, ServiceType>;

    Types byRole_;
    Types byApplication_;
};

} // namespace tamblo::bridge
