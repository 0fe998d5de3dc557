#include "tests/session/ScriptedWorkers.h"

#include "base/Format.h"

#include <algorithm>
#include <array>
#include <utility>

namespace tamblo {

namespace {

class ScriptedWorker final : public ZRReportingSessionWorkerConsumerProtocol {
public:
    ScriptedWorker(Context& context, const std::shared_ptr<ZRReportingSession>& session, std::string name)
        : ZRReportingSessionWorkerConsumerProtocol(context, session), name_(std::move(name)) {}

    std::optional<bool> start() override {
        if (name_ == "Only" || name_ == "Redundant") {
            return std::nullopt;
        }
        WorkerScript::current().saw("start " + name_);
        return !WorkerScript::current().notStarting.contains(name_);
    }
    void stop() override {
        WorkerScript& script = WorkerScript::current();
        script.saw("stop " + name_);
        if (const auto act = script.atStop.find(name_); act != script.atStop.end()) {
            act->second(*session());
        }
    }
    void handleMessage(const MessageRef& message) override {
        WorkerScript::current().saw(
            formatted("message {} {}/{}", name_, message->category(), message->type()));
    }
    [[nodiscard]] bool handleRedundantMessages() const override { return name_ == "Redundant"; }

private:
    const std::string name_;
};

constexpr std::array<std::string_view, 7> kNames{"Only",      "Producer", "Both", "Init",
                                                 "Redundant", "Absent",   "Late"};

template <std::size_t Row>
std::shared_ptr<ZRReportingSessionWorkerProtocol> make(Context& context,
                                                       const std::shared_ptr<ZRReportingSession>& session) {
    if (WorkerScript::current().refusing.contains(kNames[Row])) {
        return nullptr;
    }
    return std::make_shared<ScriptedWorker>(context, session, std::string(kNames[Row]));
}

constexpr std::array<WorkerClass, 7> kClasses{{
    {kNames[0], {false, false}, false, false, make<0>},
    {kNames[1], {true, false}, false, false, make<1>},
    {kNames[2], {true, true}, false, false, make<2>},
    {kNames[3], {false, true}, true, true, make<3>},
    {kNames[4], {false, true}, true, false, make<4>},
    {kNames[5], {false, true}, true, true, nullptr},
    {kNames[6], {false, true}, false, true, make<6>},
}};

} // namespace

std::span<const WorkerClass> workerClassList() {
    return kClasses;
}

WorkerScript& WorkerScript::current() {
    static WorkerScript script;
    return script;
}

void WorkerScript::reset() {
    refusing.clear();
    notStarting.clear();
    atStop.clear();
    (void)take();
}

void WorkerScript::saw(std::string event) {
    const std::lock_guard held(mutex_);
    events_.push_back(std::move(event));
}

std::vector<std::string> WorkerScript::take() {
    const std::lock_guard held(mutex_);
    return std::exchange(events_, {});
}

std::size_t WorkerScript::count(std::string_view event) const {
    const std::lock_guard held(mutex_);
    return static_cast<std::size_t>(std::count(events_.begin(), events_.end(), event));
}

} // namespace tamblo
