#pragma once

#include "base/Format.h"
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
        std::vector<std::string> whenAbsent; ///< also in place of a value of another kind
        std::string_view absentMeans;        ///< in the log: "all analytics events are in use"
    };

    /// The setting's texts must be constants; preferences and log must outlive this object.
    NamesPreference(Setting setting, const LinuxPreferences& preferences, StructuredLog& log)
        : setting_(std::move(setting)), preferences_(preferences), log_(log) {}

    /// The names in their order; what is no text, or an empty one, is left out.
    [[nodiscard]] std::vector<std::string> read() {
        std::optional<Value> value = preferences_.copyPreferenceValue(setting_.key, setting_.domain);
        if (!value) {
            reported_.reset();
            return setting_.whenAbsent;
        }
        std::vector<std::string> names = value->isArray() ? std::vector<std::string>() : setting_.whenAbsent;
        bool isMalformed = !value->isArray();
        for (const Value& element : value->arrayValue()) {
            if (element.stringValue().empty()) {
                isMalformed = true;
            } else {
                names.emplace_back(element.stringValue());
            }
        }
        if (isMalformed && reported_ != value) {
            log_.report(LogLevel::error, setting_.categoryCode,
                        formatted("{}: {} {}", preferences_.path(setting_.domain), setting_.key,
                                  value->isArray() ? "holds what is no name; that is ignored"
                                                   : formatted("is no array; {}", setting_.absentMeans)));
        }
        reported_ = isMalformed ? std::move(value) : std::nullopt;
        return names;
    }

private:
    const Setting setting_;
    const LinuxPreferences& preferences_;
    StructuredLog& log_;
    std::optional<Value> reported_; ///< the malformed value that the log knows of
};

} // namespace tamblo
