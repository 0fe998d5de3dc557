#pragma once

#include "base/Dictionary.h"

#include <set>
#include <string>
#include <string_view>

namespace tamblo::tools {

/// What of a record must not leave the device as it is: the values of some keys, wherever in the record they
/// stand.
class Redaction {
public:
    /// The key and its value are left out.
    void drop(std::string_view key) { dropped_.emplace(key); }
    /// In place of the value stands a hash of it, by which equal values are known: 16 hexadecimal digits. The
    /// secret keeps values from being found by trying.
    void hash(std::string_view key) { hashed_.emplace(key); }
    void setSecret(std::string secret) { secret_ = std::move(secret); }

    [[nodiscard]] bool isEmpty() const noexcept { return dropped_.empty() && hashed_.empty(); }
    [[nodiscard]] bool hashes() const noexcept { return !hashed_.empty(); }
    [[nodiscard]] Dictionary of(const Dictionary& record) const;

private:
    [[nodiscard]] Value of(const Value& value) const;

    std::set<std::string, std::less<>> dropped_;
    std::set<std::string, std::less<>> hashed_;
    std::string secret_;
};

} // namespace tamblo::tools
