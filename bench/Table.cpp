#include "Table.h"

#include "Statistics.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <initializer_list>
#include <string_view>

namespace tamblo::bench {

namespace {

/// Of a row that has neither targets nor floors.
constexpr std::size_t kMostFiguresWithoutTarget = 3;

/// Lines of cells; the first cells of a line, which say what was measured, are left out where they are those
/// of the line above.
class Cells {
public:
    using Line = std::vector<std::string>;
    static constexpr std::size_t kNameColumns = 3;

    /// A letter for each column: 'l' or 'r', the side that its cells are moved to.
    Cells(Line head, std::string_view sides) : sides_(sides), lines_{std::move(head)} {}

    void add(const ResultRow& row, std::initializer_list<std::string> others) {
        const std::string_view attack = row.textOf("attack");
        Line line{std::string(row.textOf("name")) + (attack.empty() ? "" : ":") + std::string(attack),
                  std::string(row.textOf("placement")), std::string(row.textOf("storage"))};
        line.insert(line.end(), others);
        lines_.push_back(std::move(line));
    }

    [[nodiscard]] std::string text() const {
        std::vector<std::size_t> widths(lines_.front().size());
        for (const Line& line : lines_) {
            // The last cell of a line may be as long as it likes.
            for (std::size_t i = 0; i + 1 < line.size(); ++i) {
                widths[i] = std::max(widths[i], line[i].size());
            }
        }
        std::string text;
        for (std::size_t number = 0; number < lines_.size(); ++number) {
            const Line& line = lines_[number];
            const bool isOfLineAbove = number > 0 && std::equal(line.begin(), line.begin() + kNameColumns,
                                                                lines_[number - 1].begin());
            const std::size_t begin = text.size();
            for (std::size_t i = 0; i < line.size(); ++i) {
                const std::string& cell = i < kNameColumns && isOfLineAbove ? kNothing : line[i];
                const std::string pad(widths[i] - std::min(widths[i], cell.size()), ' ');
                text += (i == 0 ? "" : "  ") + (sides_[i] == 'r' ? pad + cell : cell + pad);
            }
            text.resize(std::max(begin, text.find_last_not_of(' ') + 1));
            text += '\n';
        }
        return text;
    }

private:
    static inline const std::string kNothing;

    std::string_view sides_;
    std::vector<Line> lines_;
};

/// What is asked of a figure, and whether it is so; both empty where nothing is.
struct Verdict {
    std::string target;
    std::string word;

    void add(const ResultRow::Target& asked, std::string_view prefix = {}) {
        target += (target.empty() ? "" : ", ") + std::string(prefix) + asked.text();
        word = asked.holds && word != "missed" ? "met" : "missed";
    }
};

Verdict verdictOn(const ResultRow& row, std::string_view figure, const ResultRow::Floor* floor = nullptr) {
    Verdict verdict;
    for (const ResultRow::Target& target : row.targets()) {
        if (target.figure == figure) {
            verdict.add(target);
        } else if (floor != nullptr && target.figure == floor->ratio) {
            verdict.add(target, "ratio ");
        }
    }
    return verdict;
}

const ResultRow::Floor* floorOf(const ResultRow& row, std::string_view figure) {
    const auto& floors = row.floors();
    const auto found = std::find_if(floors.begin(), floors.end(),
                                    [&](const ResultRow::Floor& floor) { return floor.figure == figure; });
    return found == floors.end() ? nullptr : &*found;
}

/// Shown beside the figure that it is the floor or the ratio of.
bool isPartOfFloor(const ResultRow& row, std::string_view figure) {
    return std::any_of(row.floors().begin(), row.floors().end(), [&](const ResultRow::Floor& floor) {
        return floor.floor == figure || floor.ratio == figure;
    });
}

std::vector<std::string_view> keyFiguresOf(const ResultRow& row) {
    const auto& shown = row.shown();
    const bool isHeldAgainstNothing = row.targets().empty() && row.floors().empty() && shown.empty();
    std::vector<std::string_view> figures;
    for (const ResultRow::Field& field : row.fields()) {
        if (!field.figure()) {
            continue;
        }
        const bool isAsked = !verdictOn(row, field.name).word.empty() || floorOf(row, field.name) != nullptr;
        const bool isShown = std::find(shown.begin(), shown.end(), field.name) != shown.end();
        const bool isKey = isHeldAgainstNothing ? figures.size() < kMostFiguresWithoutTarget
                                                : isShown || (isAsked && !isPartOfFloor(row, field.name));
        if (isKey) {
            figures.push_back(field.name);
        }
    }
    return figures;
}

/// Empty where there is none, as of what was 0 before.
std::string ratioOf(std::string_view figure, const Rounds& before, const Rounds& after) {
    std::vector<double> ratios;
    for (std::size_t i = 0; i < std::min(before.each.size(), after.each.size()); ++i) {
        const double then = before.each[i].figure(figure).value_or(0);
        if (then != 0) {
            ratios.push_back(after.each[i].figure(figure).value_or(0) / then);
        }
    }
    return ratios.empty() ? "" : figureText(median(ratios));
}

void addTexts(Cells& cells, const ResultRow& row) {
    for (const std::string_view reason : {"error", "not_run"}) {
        if (const std::string_view text = row.textOf(reason); !text.empty()) {
            cells.add(row, {std::string(reason) + ": " + std::string(text)});
        }
    }
    for (const ResultRow::Target& target : row.targets()) {
        if (target.figure.empty()) {
            cells.add(row, {target.statement, "", "", "", "", target.holds ? "met" : "missed"});
        }
    }
}

} // namespace

bool isSameMeasurement(const ResultRow& left, const ResultRow& right) {
    constexpr std::array<std::string_view, 4> kNames{"name", "attack", "placement", "storage"};
    return std::all_of(kNames.begin(), kNames.end(),
                       [&](std::string_view name) { return left.textOf(name) == right.textOf(name); });
}

std::string tableOf(const std::vector<ResultRow>& rows) {
    Cells cells({"scenario", "placement", "storage", "figure", "value", "target", "floor", "ratio", ""},
                "llllrlrrl");
    for (const ResultRow& row : rows) {
        for (const std::string_view figure : keyFiguresOf(row)) {
            const ResultRow::Floor* floor = floorOf(row, figure);
            const Verdict verdict = verdictOn(row, figure, floor);
            const auto textOf = [&](std::string_view key) { return figureText(row.figure(key).value_or(0)); };
            cells.add(row, {std::string(figure), textOf(figure), verdict.target,
                            floor != nullptr ? textOf(floor->floor) : "",
                            floor != nullptr ? textOf(floor->ratio) : "", verdict.word});
        }
        addTexts(cells, row);
    }
    return cells.text();
}

std::string comparisonOf(const std::vector<Rounds>& before, const std::vector<Rounds>& after) {
    Cells cells({"scenario", "placement", "storage", "figure", "before", "after", "ratio", "target", ""},
                "llllrrrll");
    for (const Rounds& rounds : after) {
        const ResultRow& row = rounds.median;
        const auto other = std::find_if(before.begin(), before.end(), [&](const Rounds& candidate) {
            return isSameMeasurement(candidate.median, row);
        });
        for (const ResultRow::Field& field : row.fields()) {
            const auto then = other == before.end() ? std::nullopt : other->median.figure(field.name);
            if (then && field.figure()) {
                const Verdict verdict = verdictOn(row, field.name);
                cells.add(row, {field.name, figureText(*then), figureText(*field.figure()),
                                ratioOf(field.name, *other, rounds), verdict.target, verdict.word});
            }
        }
        addTexts(cells, row);
    }
    for (const Rounds& rounds : before) {
        if (const std::string_view error = rounds.median.textOf("error"); !error.empty()) {
            cells.add(rounds.median, {"error before: " + std::string(error)});
        }
    }
    return cells.text();
}

} // namespace tamblo::bench
