#include "Bench.h"

#include "Processes.h"

#include <cstdio>

namespace tamblo::bench {

std::string_view describe(Placement placement) noexcept {
    return placement == Placement::oneCore ? "one core" : "two cores";
}

ServiceProcess::Settings Bench::place(Placement placement) const {
    pinThisThread(clientProcessor());
    return {tamblod_, placement == Placement::oneCore ? clientProcessor() : serviceProcessor(), {}};
}

const SocketFloor& Bench::socketFloor(Placement placement) {
    std::optional<SocketFloor>& floor = socketFloors_[placement == Placement::oneCore ? 0 : 1];
    if (!floor) {
        floor = measureSocketFloor(clientProcessor(), place(placement).processor, quick_);
    }
    return *floor;
}

void Bench::print(const ResultRow& row) {
    allMet_ = allMet_ && row.met();
    std::puts(row.text().c_str());
    std::fflush(stdout);
}

} // namespace tamblo::bench
