#pragma once

#include "base/TextBuffer.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo::bench {

/// One line of the output: a JSON object of figures in the order in which they were set, the targets they are
/// held against, and whether all of those are met. A row without a target says neither.
class ResultRow {
public:
    explicit ResultRow(std::string_view name) { set("name", name); }

    void set(std::string_view key, double figure);
    void set(std::string_view key, std::uint64_t figure);
    void set(std::string_view key, std::string_view text);
    void set(std::string_view key, const char* text) { set(key, std::string_view(text)); }

    /// Of figures that have been set.
    void atMost(std::string_view key, double limit);
    void atLeast(std::string_view key, double limit);
    /// Of what two figures say together.
    void require(std::string_view statement, bool holds);

    [[nodiscard]] bool met() const noexcept { return met_; }
    /// The line, without its end.
    [[nodiscard]] std::string text() const;

private:
    void key(std::string_view key);
    [[nodiscard]] double figure(std::string_view key) const;
    void compare(std::string_view key, std::string_view relation, double limit, bool holds);

    TextBuffer fields_;
    std::vector<std::pair<std::string, double>> figures_;
    std::string targets_;
    bool met_ = true;
};

} // namespace tamblo::bench
