#pragma once

#include "Floors.h"
#include "ResultRow.h"
#include "ServiceProcess.h"

#include <algorithm>
#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tamblo::bench {

/// Both ends on one processor, each on its own, or where the scheduler puts them.
enum class Placement { oneCore, twoCores, free };
[[nodiscard]] std::string_view describe(Placement placement) noexcept;

/// One run of the benchmark: what was asked for on the command line, and the floors, which are measured once
/// for each placement, when the first scenario asks for them.
class Bench {
public:
    Bench(std::string tamblod, bool quick, std::vector<std::string> parts)
        : tamblod_(std::move(tamblod)), quick_(quick), parts_(std::move(parts)) {}

    [[nodiscard]] bool quick() const noexcept { return quick_; }
    [[nodiscard]] std::size_t repetitions(std::size_t usual) const noexcept {
        return quick_ ? (usual + 2) / 3 : usual;
    }

    /// Whether this part of a scenario that has many was asked for, by name or with all the others.
    [[nodiscard]] bool isWanted(std::string_view part) const {
        return parts_.empty() || std::find(parts_.begin(), parts_.end(), part) != parts_.end();
    }

    /// Puts this thread where the placement has the client, and says how to start the service.
    [[nodiscard]] ServiceProcess::Settings place(Placement placement) const;

    [[nodiscard]] const SocketFloor& socketFloor(Placement placement);
    void print(const ResultRow& row);
    [[nodiscard]] bool allMet() const noexcept { return allMet_; }

private:
    std::string tamblod_;
    bool quick_;
    std::vector<std::string> parts_;
    bool allMet_ = true;
    std::optional<SocketFloor> socketFloors_[3];
};

// The scenarios. Each starts services of its own and prints its rows.
void floorSocket(Bench& bench);
void floorEcho(Bench& bench);
void floorPaced(Bench& bench);
void ingestPipelined(Bench& bench);
void ingestOneEvent(Bench& bench);
void ingestUnwanted(Bench& bench);
void ingestRepeated(Bench& bench);
void ingestAllSinks(Bench& bench);
void paced(Bench& bench);
void roundTrip(Bench& bench);
void retained(Bench& bench);
void manyClients(Bench& bench);
void manySessions(Bench& bench);
void stop100k(Bench& bench);
void stopMany(Bench& bench);
void summaryJson100k(Bench& bench);
void idle(Bench& bench);
void startUp(Bench& bench);
/// All attacks or those that were named, each against a service of its own.
void hostile(Bench& bench);
/// For the usage: one line for each.
void printAttacks();

} // namespace tamblo::bench
