#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace tamblo::bench {

/// One line of the output: a JSON object of figures in the order in which they were set, the targets they are
/// held against, and whether all of those are met. A row without a target says neither.
class ResultRow {
public:
    struct Field {
        std::string name;
        std::variant<double, std::uint64_t, std::string> content;

        [[nodiscard]] std::optional<double> figure() const noexcept;
    };
    /// A limit for a figure of the row, or what several figures say together.
    struct Target {
        std::string figure;    ///< empty for a statement
        std::string statement; ///< empty for a limit
        double limit = 0;
        bool isLeast = false;
        bool holds = false;

        /// "<= 2.5", or the statement.
        [[nodiscard]] std::string text() const;
    };
    /// A figure, what it is held against, and how many times that it is; all three are figures of the row.
    struct Floor {
        std::string figure;
        std::string floor;
        std::string ratio;
    };

    explicit ResultRow(std::string_view name) { set("name", name); }

    void set(std::string_view key, double figure);
    void set(std::string_view key, std::uint64_t figure);
    void set(std::string_view key, std::string_view text);
    void set(std::string_view key, const char* text) { set(key, std::string_view(text)); }

    /// Sets the ratio of two figures, each of which has been set or is 0.
    void holdAgainst(std::string_view figure, std::string_view floor, std::string_view ratio);

    /// Has the table show a figure that is held against nothing.
    void show(std::string_view key) { shown_.emplace_back(key); }
    /// Of figures that have been set.
    void atMost(std::string_view key, double limit);
    void atLeast(std::string_view key, double limit);
    /// Of what two figures say together.
    void require(std::string_view statement, bool holds);

    [[nodiscard]] bool met() const noexcept;
    [[nodiscard]] const std::vector<Field>& fields() const noexcept { return fields_; }
    [[nodiscard]] const std::vector<Target>& targets() const noexcept { return targets_; }
    [[nodiscard]] const std::vector<Floor>& floors() const noexcept { return floors_; }
    [[nodiscard]] const std::vector<std::string>& shown() const noexcept { return shown_; }
    [[nodiscard]] std::optional<double> figure(std::string_view key) const noexcept;
    /// Empty where the row has none of this name.
    [[nodiscard]] std::string_view textOf(std::string_view key) const noexcept;
    /// The line, without its end.
    [[nodiscard]] std::string text() const;

    /// The row of several runs of the same: of each figure that all of them have the median, held against the
    /// targets anew; a statement holds if it does in each.
    [[nodiscard]] static ResultRow medianOf(const std::vector<ResultRow>& runs);

private:
    void compare(std::string_view key, bool isLeast, double limit);
    void judge();

    std::vector<Field> fields_;
    std::vector<Target> targets_;
    std::vector<Floor> floors_;
    std::vector<std::string> shown_;
};

/// A figure as people read it: four digits, no fraction where it is whole.
[[nodiscard]] std::string figureText(double figure);

} // namespace tamblo::bench
