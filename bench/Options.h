#pragma once

#include "Scenarios.h"
#include "Storage.h"

#include <cstddef>
#include <string>
#include <vector>

namespace tamblo::bench {

/// The command line.
struct Options {
    std::string tamblod = TAMBLOD_PATH;
    std::string against;  ///< another build of the service; empty: none
    std::string jsonFile; ///< where the rows are kept besides; empty: nowhere
    bool quick = false;
    std::size_t rounds = 0; ///< 0: as many as usual
    std::vector<Storage> storages{Storage::tmpfs, Storage::disk};
    std::vector<const Scenario*> scenarios;
    std::vector<std::string> attacks;

    /// False for a wrong command line.
    [[nodiscard]] bool parse(int count, char** arguments);

private:
    [[nodiscard]] bool takeValue(std::string_view option, const char* value);
    [[nodiscard]] bool takeScenario(std::string_view argument);
};

/// To standard error.
void printUsage();

} // namespace tamblo::bench
