#include "Bench.h"

#include "Processes.h"

#include <cstdio>

namespace tamblo::bench {

namespace {

int clientProcessorOf(Placement placement) {
    return placement == Placement::free ? kAnyProcessor : clientProcessor();
}

} // namespace

std::string_view describe(Placement placement) noexcept {
    switch (placement) {
    case Placement::oneCore:
        return "one core";
    case Placement::twoCores:
        return "two cores";
    case Placement::free:
        break;
    }
    return "free";
}

ServiceProcess::Settings Bench::place(Placement placement) const {
    pinThisThread(clientProcessorOf(placement));
    return {.program = tamblod_,
            .processor =
                placement == Placement::twoCores ? serviceProcessor() : clientProcessorOf(placement)};
}

const SocketFloor& Bench::socketFloor(Placement placement) {
    std::optional<SocketFloor>& floor = socketFloors_[static_cast<std::size_t>(placement)];
    if (!floor) {
        floor = measureSocketFloor(clientProcessorOf(placement), place(placement).processor, quick_);
    }
    return *floor;
}

void Bench::print(const ResultRow& row) {
    allMet_ = allMet_ && row.met();
    std::puts(row.text().c_str());
    std::fflush(stdout);
}

} // namespace tamblo::bench
