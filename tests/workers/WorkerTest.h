#pragma once

#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "util/Log.h"
#include "util/LogCategories.h"

#include <gmock/gmock.h>

#include <functional>
#include <map>
#include <memory>
#include <sstream>
#include <string>
#include <string_view>
#include <utility>

#include <sys/types.h>

namespace tamblo {

inline constexpr pid_t kClient = 77;
inline constexpr pid_t kOtherClient = 78;

/// A device in memory and a session of two client processes on it. The one way for tests of workers to make
/// sessions and workers.
class WorkerTest : public testing::Test {
protected:
    explicit WorkerTest(LogLevel threshold = LogLevel::debug, bool isInternalBuild = false)
        : device(threshold, isInternalBuild), session(makeSession()) {}

    std::shared_ptr<ZRReportingSession> makeSession(AudioServiceType type = AudioServiceTypeUnknown,
                                                    const Dictionary& configuration = {},
                                                    ReporterID reporterID = 5) {
        auto made = device.makeSession(reporterID, {kClient, kOtherClient});
        made->setServiceType(type);
        made->setClientProcessName("caller");
        made->updateConfigurationWithContentsOfConfiguration(configuration);
        return made;
    }
    /// A worker of the session that the session itself does not have.
    template <typename Worker> std::shared_ptr<Worker> make() {
        return std::make_shared<Worker>(device.context(), session);
    }
    /// The same from the class's factory, null when it refuses.
    template <typename Worker> std::shared_ptr<Worker> tryToMake() {
        return std::static_pointer_cast<Worker>(Worker::initWithSession(device.context(), session));
    }
    MessageRef send(Dictionary payload, AudioEventCategory category = AudioEventKindPlayback,
                    AudioEventType type = AudioEventTypeGeneric) {
        MessageRef message = messageOf(std::move(payload), category, type);
        session->sendMessage(message);
        return message;
    }

    /// Restarts the process on another build, with a new session.
    void setInternalBuild(bool isInternal) {
        session.reset();
        device.setInternalBuild(isInternal);
        session = makeSession();
    }
    /// The first letters of the levels of the category's lines above debug since the last call.
    std::string loggedLevels(const LogCategory& category) {
        std::string levels;
        for (const FakeLog::Line& line : device.log.lines()) {
            if (line.category == category.code() && line.level != LogLevel::debug) {
                levels += "disef"[static_cast<std::size_t>(line.level)];
            }
        }
        device.log.clear();
        return levels;
    }

    using Acts = std::map<std::string, std::function<void()>, std::less<>>;
    /// Does what the words say: those that are no act go to the other one.
    static void playWords(const std::string& script, const Acts& acts,
                          const std::function<void(const std::string&)>& other) {
        std::istringstream words(script);
        for (std::string word; words >> word;) {
            const auto act = acts.find(word);
            act != acts.end() ? act->second() : other(word);
        }
    }

    FakePlatform device;
    std::shared_ptr<ZRReportingSession> session;
};

} // namespace tamblo
