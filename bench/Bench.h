#pragma once

#include "Floors.h"
#include "ResultRow.h"
#include "ServiceProcess.h"
#include "Storage.h"

#include <algorithm>
#include <cstddef>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo::bench {

/// Both ends on one processor, each on its own, or where the scheduler puts them.
enum class Placement { oneCore, twoCores, free };
[[nodiscard]] std::string_view describe(Placement placement) noexcept;

/// The runs of scenarios with one build of the service: what was asked for on the command line, on what
/// storage the service is at the moment, and the floor of the socket, which is measured once for each
/// placement, when the first scenario asks for it.
class Bench {
public:
    using TakeRow = std::function<void(const ResultRow& row)>;

    Bench(std::string tamblod, bool quick, std::vector<std::string> parts, TakeRow takeRow)
        : tamblod_(std::move(tamblod)),
          quick_(quick),
          parts_(std::move(parts)),
          takeRow_(std::move(takeRow)) {}

    [[nodiscard]] bool quick() const noexcept { return quick_; }
    [[nodiscard]] std::size_t repetitions(std::size_t usual) const noexcept {
        return quick_ ? (usual + 2) / 3 : usual;
    }

    /// Whether this part of a scenario that has many was asked for, by name or with all the others.
    [[nodiscard]] bool isWanted(std::string_view part) const {
        return parts_.empty() || std::find(parts_.begin(), parts_.end(), part) != parts_.end();
    }

    /// From now on the services' directories are made there; the storage is the first of those that the
    /// scenario runs on, or a further one.
    void useStorage(StoragePlace place, bool isFirst) {
        storage_ = std::move(place);
        isOnFirstStorage_ = isFirst;
    }
    [[nodiscard]] Storage storage() const noexcept { return storage_.storage; }
    [[nodiscard]] bool isOnFirstStorage() const noexcept { return isOnFirstStorage_; }

    /// Puts this thread where the placement has the client, and says how to start the service.
    [[nodiscard]] ServiceProcess::Settings place(Placement placement) const;
    /// A row that says where its figures were measured.
    [[nodiscard]] ResultRow row(std::string_view name, Placement placement) const;

    [[nodiscard]] const SocketFloor& socketFloor(Placement placement);
    [[nodiscard]] std::unique_ptr<BareJob> bareJob(Placement placement) const;
    void print(const ResultRow& row) const { takeRow_(row); }

private:
    std::string tamblod_;
    bool quick_;
    std::vector<std::string> parts_;
    TakeRow takeRow_;
    StoragePlace storage_;
    bool isOnFirstStorage_ = true;
    std::map<Placement, SocketFloor> socketFloors_;
};

// The scenarios. Each starts services of its own and prints its rows.
void floorSocket(Bench& bench);
void floorEcho(Bench& bench);
void floorPaced(Bench& bench);
void floorJob(Bench& bench);
void ingestPipelined(Bench& bench);
void ingestOneEvent(Bench& bench);
void ingestUnwanted(Bench& bench);
void ingestRepeated(Bench& bench);
void ingestAllSinks(Bench& bench);
void paced(Bench& bench);
void roundTrip(Bench& bench);
void broadcast(Bench& bench);
void retained(Bench& bench);
void manyClients(Bench& bench);
void manySessions(Bench& bench);
void stop100k(Bench& bench);
void stopStretches(Bench& bench);
void stopDrivers(Bench& bench);
void stopMany(Bench& bench);
void summaryJson100k(Bench& bench);
void idle(Bench& bench);
void startUp(Bench& bench);
/// All attacks or those that were named, each against a service of its own.
void hostile(Bench& bench);
/// For the usage: one line for each.
void printAttacks();

} // namespace tamblo::bench
