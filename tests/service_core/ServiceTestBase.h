#pragma once

#include "base/Json.h"
#include "service/ZRReportingClientServerInstance.h"
#include "service/ZRReportingService.h"
#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "tests/session/ScriptedWorkers.h"

#include <gmock/gmock.h>

#include <memory>
#include <string>
#include <type_traits>
#include <vector>

namespace tamblo {

/// A service on an in-memory device, with clients that are the test.
class ServiceTestBase : public testing::Test {
protected:
    using Connection = std::unique_ptr<FakeClientConnection>;
    static constexpr const char* kUptimeEvent = "com.vandra.tamblo.zrreportingclientuptime";

    explicit ServiceTestBase(bool isInternalBuild = false) : device(LogLevel::debug, isInternalBuild) {
        script.reset();
        exitStatus = 0;
        ConnectionListener& listener =
            device.connections.listenerForServiceName("com.vandra.tamblo.reporting");
        listener.setDelegate(*service);
        listener.resume();
    }
    ~ServiceTestBase() override {
        (void)run();
        script.reset();
    }

    std::size_t run() { return device.serverQueue().runAll(); }

    Connection connect(pid_t pid, uid_t user = 1000) {
        device.processInformation.names.emplace(pid, "app" + std::to_string(pid));
        Connection connection = device.connections.connect({user, pid}, turns);
        (void)run();
        return connection;
    }
    /// A started session of this ID.
    void open(const Connection& client, ReporterID reporterID) {
        client->object().createReportingSession(reporterID, {});
        client->object().startReportingSessionForID(reporterID, {});
        (void)run();
    }
    template <typename Result> static std::string textOf(const Result& result) {
        if constexpr (std::is_same_v<Result, Dictionary>) {
            return jsonText(result);
        } else {
            return testing::PrintToString(result);
        }
    }
    /// A reply that notes the name and what it is called with.
    template <typename... Result> auto note(std::string name) {
        return [this, name = std::move(name)](const ReplyError* error, const Result&... result) {
            std::string text = name;
            if (error != nullptr) {
                text += " " + error->domain + " " + std::to_string(error->code);
            }
            ((text += " " + textOf(result)), ...);
            replies.push_back(std::move(text));
        };
    }
    void send(const Connection& client, std::vector<ReporterID> reporterIDs,
              Dictionary payload = {{"a", 1}}) {
        client->object().sendMessage(std::move(payload), 14, 11, std::move(reporterIDs), note<>("send"));
        (void)run();
    }
    /// What was answered since the last call.
    std::vector<std::string> takeReplies() { return std::exchange(replies, {}); }
    /// The same, once all that is queued has run.
    std::vector<std::string> answers() {
        (void)run();
        return takeReplies();
    }

    SessionRef find(ReporterID reporterID) { return service->findReportingSessionForID(reporterID); }
    std::vector<ReporterID> found(const std::vector<ReporterID>& reporterIDs) {
        std::vector<SessionRef> sessions;
        service->findReportingSessionsForIDs(reporterIDs, sessions);
        std::vector<ReporterID> ids;
        for (const SessionRef& session : sessions) {
            ids.push_back(session->reporterID());
        }
        return ids;
    }
    static inline int exitStatus = 0;

    FakePlatform device;
    RequestTurns turns{device.serverQueue(), device.clock};
    WorkerScript& script = WorkerScript::current();
    std::vector<std::string> replies;
    std::unique_ptr<ZRReportingService> service =
        std::make_unique<ZRReportingService>(device.context(), [](int status) { exitStatus = status; });
};

} // namespace tamblo
