#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::tools {

/// Rows of text below a row of names, each column as wide as its widest cell. What clients have chosen cannot
/// make a line of its own or reach the terminal: control characters are written as escapes.
class Table {
public:
    enum class Align : std::uint8_t { left, right };
    struct Column {
        std::string_view name;
        Align align = Align::left;
        std::size_t most = 40; ///< characters of a cell
    };

    explicit Table(std::vector<Column> columns) : columns_(std::move(columns)) {}

    /// A cell for each column.
    void add(std::vector<std::string> cells);
    [[nodiscard]] bool empty() const noexcept { return rows_.empty(); }
    /// Lines, the names first, cut at so many characters; 0 cuts none.
    [[nodiscard]] std::vector<std::string> lines(std::size_t width = 0) const;

private:
    const std::vector<Column> columns_;
    std::vector<std::vector<std::string>> rows_;
};

/// The text without control characters, cut to so many characters.
[[nodiscard]] std::string harmless(std::string_view text, std::size_t most);
/// "512 B", "1.2 MiB".
[[nodiscard]] std::string bytesText(double bytes);
/// "12 s", "3 min 5 s", "2 h 10 min", "4 d 3 h"; with a minus below zero, as a clock may have been set back.
[[nodiscard]] std::string durationText(double seconds);

} // namespace tamblo::tools
