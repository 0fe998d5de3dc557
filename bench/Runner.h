#pragma once

#include "Bench.h"
#include "Options.h"
#include "ResultRow.h"
#include "Storage.h"
#include "Table.h"

#include <cstddef>
#include <fstream>
#include <string>
#include <vector>

namespace tamblo::bench {

/// Runs the scenarios that were asked for and tells of their rows: each as a line of JSON once it is known,
/// all of them as a table in the end.
///
/// Two builds of the service run by turns, the one that begins changing from round to round, so that what
/// else the machine does falls on both alike; then, and wherever there are several rounds, a row has their
/// medians.
class Runner {
public:
    explicit Runner(const Options& options);

    void run();
    /// Whether no scenario failed.
    [[nodiscard]] bool allRan() const noexcept { return allRan_; }

private:
    /// A build of the service and what came of it.
    struct Build {
        std::string program;
        std::string name; ///< in its rows, beside those of another one
        std::vector<Rounds> rounds;
    };

    [[nodiscard]] std::vector<StoragePlace> placesOf(const Scenario& scenario) const;
    void run(const Scenario& scenario);
    void runOnce(const Scenario& scenario, Bench& bench);
    void runRounds(const Scenario& scenario, const StoragePlace& place, bool isFirstPlace);
    void tell(const ResultRow& row);

    const Options& options_;
    std::vector<Build> builds_;
    Bench bench_;                 ///< of the one build, when each scenario runs once
    std::vector<ResultRow> rows_; ///< all that was told of
    std::ofstream json_;
    bool allRan_ = true;
};

} // namespace tamblo::bench
