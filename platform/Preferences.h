#pragma once

#include "base/Json.h"
#include "base/Value.h"

#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo {

/// The preferences store: values by domain and key. Any thread; may read a file.
class Preferences {
public:
    virtual ~Preferences() = default;
    /// The value that is stored now, or nothing.
    [[nodiscard]] virtual std::optional<Value> copyPreferenceValue(std::string_view key,
                                                                   std::string_view domain) const = 0;
    /// Sets a value beside the others of the domain and waits until it is stored, for other processes and for
    /// those to come. What cannot be stored is told in the log; this process reads it all the same.
    virtual void setPreferenceValue(std::string_view key, std::string_view domain, const Value& value) = 0;
};

/// The values of one domain, read as what the caller takes them for. Every call asks the store.
class PreferencesSuite {
public:
    /// The store must outlive the suite.
    PreferencesSuite(Preferences& store, std::string domain) : store_(store), domain_(std::move(domain)) {}

    /// The value as it is, or nothing.
    [[nodiscard]] std::optional<Value> value(std::string_view key) const {
        return store_.copyPreferenceValue(key, domain_);
    }
    [[nodiscard]] bool hasValue(std::string_view key) const {
        return store_.copyPreferenceValue(key, domain_).has_value();
    }
    /// A text as it stands and a number as a text; empty for anything else, and without a value.
    [[nodiscard]] std::string stringValue(std::string_view key) const {
        const std::optional<Value> value = store_.copyPreferenceValue(key, domain_);
        if (!value || value->isString()) {
            return value ? std::string(value->stringValue()) : std::string();
        }
        return value->isNumber() ? jsonText(*value) : std::string();
    }
    /// False without a value.
    [[nodiscard]] bool boolValue(std::string_view key) const {
        const std::optional<Value> value = store_.copyPreferenceValue(key, domain_);
        return value && value->boolValue();
    }
    void setValue(std::string_view key, const Value& value) {
        store_.setPreferenceValue(key, domain_, value);
    }

private:
    Preferences& store_;
    const std::string domain_;
};

} // namespace tamblo
