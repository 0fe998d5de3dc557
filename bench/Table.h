#pragma once

#include "ResultRow.h"

#include <string>
#include <utility>
#include <vector>

namespace tamblo::bench {

/// What people read of the rows: a line for each figure that has a target or a floor, with both, the ratio to
/// the floor and whether the targets are met; of a row with neither, its first figures.
[[nodiscard]] std::string tableOf(const std::vector<ResultRow>& rows);

/// The rows of one measurement, round by round, and their medians.
struct Rounds {
    explicit Rounds(std::vector<ResultRow> rows) : each(std::move(rows)), median(ResultRow::medianOf(each)) {}

    std::vector<ResultRow> each;
    ResultRow median;
};

/// Two builds of the service: a line for each figure that both have. The ratio is the median of those of the
/// rounds, as what one build meets on the machine in a round is about what the other one meets.
[[nodiscard]] std::string comparisonOf(const std::vector<Rounds>& before, const std::vector<Rounds>& after);

/// Whether two rows are of the same: the scenario or attack, the placement and the storage.
[[nodiscard]] bool isSameMeasurement(const ResultRow& left, const ResultRow& right);

} // namespace tamblo::bench
