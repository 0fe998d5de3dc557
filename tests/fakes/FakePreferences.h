#pragma once

#include "platform/Preferences.h"

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo {

/// The preferences that a test has set.
class FakePreferences final : public Preferences {
public:
    [[nodiscard]] std::optional<Value> copyPreferenceValue(std::string_view key,
                                                           std::string_view domain) const override {
        const auto found = values_.find({std::string(domain), std::string(key)});
        return found != values_.end() ? std::optional(found->second) : std::nullopt;
    }
    [[nodiscard]] std::optional<std::string> setPreferenceValue(std::string_view key, std::string_view domain,
                                                                const Value& value) override {
        set(std::string(key), std::string(domain), value);
        return writeFailure;
    }
    void set(const std::string& key, const std::string& domain, Value value) {
        values_[{domain, key}] = std::move(value);
    }
    void remove(const std::string& key, const std::string& domain) { values_.erase({domain, key}); }

    /// What storing answers; the value is there in either case.
    std::optional<std::string> writeFailure;

private:
    std::map<std::pair<std::string, std::string>, Value> values_;
};

} // namespace tamblo
