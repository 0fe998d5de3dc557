#pragma once

#include "platform/StructuredLog.h"
#include "platform/linux/settings/LinuxPreferences.h"

#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo {

/// A preference that is an array of names. What is wrong with it is told once for each value that it has,
/// however often it is read. Member of a service; used by one thread at a time.
class NamesPreference {
public:
    struct Setting {
        std::string_view domain;
        std::string_view key;
        std::string_view categoryCode;
        std::vector<std::string> whenAbsent;
        std::vector<std::string> whenNoArray;
        std::string_view noArrayMeans; ///< in the log: "no back end is found"
    };

    /// The setting's texts must be constants; preferences and log must outlive this object.
    NamesPreference(Setting setting, const LinuxPreferences& preferences, StructuredLog& log)
        : setting_(std::move(setting)), preferences_(preferences), log_(log) {}

    /// The names in their order; what is no text, or an empty one, is left out.
    [[nodiscard]] std::vector<std::string> read();

private:
    const Setting setting_;
    const LinuxPreferences& preferences_;
    StructuredLog& log_;
    std::optional<Value> reported_; ///< the malformed value that the log knows of
};

} // namespace tamblo
