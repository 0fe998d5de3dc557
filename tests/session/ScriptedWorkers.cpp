#include "tests/session/ScriptedWorkers.h"

#include "base/Format.h"

#include <array>
#include <utility>

namespace tamblo {

WorkerScript& WorkerScript::current() {
    static WorkerScript script;
    return script;
}

namespace {

WorkerScript& script = WorkerScript::current();

class ScriptedWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    ScriptedWorker(Context& context, const std::shared_ptr<ZRReportingSession>& session, std::string name)
        : ZRReportingSessionWorkerConsumerProtocol(context, session), name_(std::move(name)) {}

    std::optional<bool> start() override {
        if (name_ == "Only" || name_ == "Redundant") {
            return std::nullopt;
        }
        script.saw("start " + name_);
        return !script.notStarting.contains(name_);
    }
    bool stopSome() override {
        script.saw("stop " + name_);
        if (script.atStop.contains(name_)) {
            script.atStop[name_](*session());
        }
        return true;
    }
    void handleMessage(const MessageRef& message) override {
        script.saw(formatted("message {} {}/{}", name_, message->category(), message->type()));
    }
    [[nodiscard]] bool handleRedundantMessages() const override { return name_ == "Redundant"; }

private:
    const std::string name_;
};

template <std::size_t Row>
std::shared_ptr<ZRReportingSessionWorkerProtocol> make(Context& context,
                                                       const std::shared_ptr<ZRReportingSession>& session) {
    const std::string name(workerClassList()[Row].name);
    return script.refusing.contains(name) ? nullptr
                                          : std::make_shared<ScriptedWorker>(context, session, name);
}

constexpr std::array<WorkerClass, 7> kClasses{{
    {"Only", {false, false}, false, false, make<0>},
    {"Producer", {true, false}, false, false, make<1>},
    {"Both", {true, true}, false, false, make<2>},
    {"Init", {false, true}, true, true, make<3>},
    {"Redundant", {false, true}, true, false, make<4>},
    {"Absent", {false, true}, true, true, nullptr},
    {"Late", {false, true}, false, true, make<6>},
}};

} // namespace

std::span<const WorkerClass> workerClassList() {
    return kClasses;
}

} // namespace tamblo
