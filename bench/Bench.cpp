#include "Bench.h"

#include "Processes.h"

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
            .processor = placement == Placement::twoCores ? serviceProcessor() : clientProcessorOf(placement),
            .directory = storage_.directory};
}

ResultRow Bench::row(std::string_view name, Placement placement) const {
    ResultRow row(name);
    row.set("placement", describe(placement));
    row.set("storage", describe(storage_.storage));
    return row;
}

const SocketFloor& Bench::socketFloor(Placement placement) {
    if (const auto known = socketFloors_.find(placement); known != socketFloors_.end()) {
        return known->second;
    }
    return socketFloors_[placement] =
               measureSocketFloor(clientProcessorOf(placement), place(placement).processor, quick_);
}

std::unique_ptr<BareJob> Bench::bareJob(Placement placement) const {
    return std::make_unique<BareJob>(clientProcessorOf(placement), place(placement).processor,
                                     storage_.directory);
}

} // namespace tamblo::bench
