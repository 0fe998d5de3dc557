#pragma once

#include "tests/fakes/FakePlatform.h"
#include "tests/fakes/Messages.h"
#include "util/Log.h"

#include <gmock/gmock.h>

#include <chrono>
#include <cmath>
#include <functional>
#include <map>
#include <memory>
#include <sstream>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <sys/types.h>

namespace tamblo {

using namespace std::chrono_literals;
using testing::ElementsAre, testing::IsEmpty, testing::SizeIs;

/// "10 out volume=0.5": a timestamp after the start, "-" for none, then keys, some by short names, each with
/// its value in JSON, or a word; without one it is true.
inline Dictionary payloadOf(const std::string& text, double start = 0) {
    static const std::map<std::string, std::string, std::less<>> longNames{
        {"out", "session_output_running"},
        {"in", "session_input_running"},
        {"group", "kaleen_session"},
        {"length", "session_duration"},
        {"volume", "QVSessionVolume"},
        {"devices", "active_devices"},
        {"format", "session_selected_format"},
        {"formatID", "mFormatID"},
        {"channels", "mChannelsPerFrame"},
        {"ringer", "ringerstate"},
        {"spatial", "spatializationEnabled"},
        {"feature", "spatial-audio-accessory-feature"},
        {"vocoder", "vp_config_primary_vocoder"},
        {"rate", "vp_config_primary_vocoderFs"}};
    const auto valueOf = [](const std::string& word) {
        const auto read = readJson(word);
        const Value* value = std::get_if<Value>(&read);
        return word == "nan" ? Value(NAN) : value != nullptr ? *value : Value(word);
    };
    Dictionary payload;
    std::istringstream words(text);
    std::string word;
    words >> word;
    if (const Value time = valueOf(word); word != "-") {
        payload.set("zrreporting_timestamp", time.isNumber() ? Value(start + time.doubleValue()) : time);
    }
    while (words >> word) {
        const std::size_t end = word.find('=');
        const std::string name = word.substr(0, end);
        payload.set(lookUp(longNames, name).value_or(name),
                    end == std::string::npos ? Value(true) : valueOf(word.substr(end + 1)));
    }
    return payload;
}

/// Several of them, with semicolons between. Their categories are their numbers, from 1.
inline std::vector<MessageRef> messagesOf(const std::string& texts, double start = 0,
                                          AudioEventType type = AudioEventTypeGeneric) {
    std::vector<MessageRef> messages;
    std::istringstream payloads(texts);
    for (std::string text; std::getline(payloads, text, ';');) {
        messages.push_back(
            messageOf(payloadOf(text, start), static_cast<AudioEventCategory>(messages.size() + 1), type));
    }
    return messages;
}

inline constexpr pid_t kClient = 77;
inline constexpr pid_t kOtherClient = 78;
inline constexpr WallTime kStart{1'772'366'400s}; ///< of the fake clock: 2026-03-01, 12:00

/// A row of a table: what is played, as a text, and what comes of it.
struct Played {
    const char* what;
    const char* script;
    const char* expected;
};

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
