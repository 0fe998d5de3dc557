#include "bridge/common/ServiceTypes.h"

#include "base/Format.h"

#include <algorithm>
#include <array>
#include <utility>

namespace tamblo::bridge {

namespace {

/// The roles of the sound server, and those of its predecessor that its clients still send.
constexpr std::array<std::pair<std::string_view, ServiceType>, 20> kRoles{{
    {"communication", ServiceType::telephony},
    {"phone", ServiceType::telephony},
    {"music", ServiceType::longFormAudio},
    {"movie", ServiceType::longFormAudio},
    {"video", ServiceType::longFormAudio},
    {"multimedia", ServiceType::longFormAudio},
    {"notification", ServiceType::systemSounds},
    {"event", ServiceType::systemSounds},
    {"alarm", ServiceType::alarms},
    {"game", ServiceType::nonLongFormAudio},
    {"animation", ServiceType::nonLongFormAudio},
    {"accessibility", ServiceType::nonLongFormAudio},
    {"a11y", ServiceType::nonLongFormAudio},
    {"production", ServiceType::nonLongFormAudio},
    {"dsp", ServiceType::nonLongFormAudio},
    {"screen", ServiceType::nonLongFormAudio},
    {"camera", ServiceType::nonLongFormAudio},
    {"navigation", ServiceType::nonLongFormAudio},
    {"assistant", ServiceType::nonLongFormAudio},
    {"test", ServiceType::nonLongFormAudio},
}};

std::string lowerCase(std::string_view text) {
    std::string lower(text);
    std::transform(lower.begin(), lower.end(), lower.begin(), [](char byte) {
        return byte >= 'A' && byte <= 'Z' ? static_cast<char>(byte - 'A' + 'a') : byte;
    });
    return lower;
}

} // namespace

ServiceType ServiceTypes::of(std::string_view role, std::string_view application) const {
    if (const auto given = byApplication_.find(std::string(application)); given != byApplication_.end()) {
        return given->second;
    }
    const std::string name = lowerCase(role.empty() ? kNoRole : role);
    if (const auto given = byRole_.find(name); given != byRole_.end()) {
        return given->second;
    }
    const auto known =
        std::find_if(kRoles.begin(), kRoles.end(), [&name](const auto& row) { return row.first == name; });
    return known == kRoles.end() ? ServiceType::generic : known->second;
}

std::vector<std::string> ServiceTypes::setPreferences(const Dictionary& preferences) {
    std::vector<std::string> faults;
    const auto read = [&](std::string_view key, bool isRole) {
        Types types;
        const Value* const table = preferences.find(key);
        if (table != nullptr && !table->isDictionary()) {
            faults.push_back(formatted("{}: not an object", key));
            return types;
        }
        const Dictionary none;
        const Dictionary& entries = table == nullptr ? none : table->dictionaryValue();
        for (std::size_t i = 0; i < entries.size(); ++i) {
            const std::string_view name = entries.keyAt(i);
            if (const auto type = client::parseServiceType(entries.valueAt(i).stringValue())) {
                types.emplace(isRole ? lowerCase(name) : std::string(name), *type);
            } else {
                faults.push_back(formatted("{}: {}: not the name of a service type", key, name));
            }
        }
        return types;
    };
    byRole_ = read(kByRole, true);
    byApplication_ = read(kByApplication, false);
    return faults;
}

} // namespace tamblo::bridge
