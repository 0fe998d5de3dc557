#pragma once

#include "base/Dictionary.h"

#include <cstdint>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::tools {

/// Which records of a sink are wanted: of one of the events named, with all of the keys, of a time, and of a
/// reporter.
class RecordFilter {
public:
    /// Event names are exact or end with `*`.
    void wantEvent(std::string_view pattern) { events_.emplace_back(pattern); }
    /// `KEY`, or `KEY=VALUE` with the value as in a typed payload. Keys are those of the payload, or of the
    /// record.
    void wantKey(std::string_view text);
    /// Only what names the reporter: a record, or the one that opened the session that a record is of.
    void wantReporter(std::int64_t reporter) { reporter_ = reporter; }
    /// Only what is of that time, or later, and not of the other or later; seconds since 1970.
    void wantSince(double time) { since_ = time; }
    void wantUntil(double time) { until_ = time; }

    [[nodiscard]] bool isEmpty() const noexcept;
    [[nodiscard]] bool wantsReporter() const noexcept { return reporter_.has_value(); }
    [[nodiscard]] bool accepts(const Dictionary& record) const;
    /// Remembers the session that a record opens, if it is the wanted reporter's: `accepts` knows its records
    /// by that.
    void noteSession(const Dictionary& record);

private:
    struct Key {
        std::string name;
        std::optional<std::string> value;
    };

    [[nodiscard]] bool isOfTime(const Dictionary& record) const;
    [[nodiscard]] bool isOfReporter(const Dictionary& record) const;

    std::vector<std::string> events_;
    std::vector<Key> keys_;
    std::optional<std::int64_t> reporter_;
    std::optional<double> since_;
    std::optional<double> until_;
    std::set<std::string, std::less<>> sessions_; ///< the reporter's
};

} // namespace tamblo::tools
