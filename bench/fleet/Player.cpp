#include "Player.h"

#include "wire/Vocabulary.h"

#include <algorithm>
#include <chrono>
#include <string_view>
#include <utility>
#include <vector>

namespace tamblo::bench::fleet {

namespace {

using wire::EventKind;
using wire::EventType;
using wire::Subsystem;

constexpr AudioServiceType kAudioDeviceUsage = 9;

constexpr std::uint32_t category(EventKind kind, Subsystem subsystem = Subsystem::none) {
    return static_cast<std::uint32_t>(subsystem) | static_cast<std::uint32_t>(kind);
}

WallTime after(WallTime time, double seconds) {
    return time +
           std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::duration<double>(seconds));
}

} // namespace

/// A client's one session, from its connection to its end.
class Player::Session {
public:
    Session(ServiceOnDisk& service, pid_t pid, std::string_view application, AudioServiceType type)
        : service_(service),
          reporter_(pid),
          connection_(service.connect(pid, std::string(application.substr(application.rfind('.') + 1)))) {
        ZRReportingServiceProtocol& requests = connection_->object();
        requests.createReportingSession(reporter_, {});
        requests.setServiceType(type, reporter_, {});
        requests.setConfiguration({{"HostApplicationDisplayID", application}}, reporter_, {});
        requests.startReportingSessionForID(reporter_, {});
        service_.run();
    }
    ~Session() {
        connection_->object().stopReportingSessionForID(reporter_, {});
        connection_->object().destroyReportingSession(reporter_, {});
        service_.run();
        connection_->invalidate();
        service_.run();
    }
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    void send(std::uint32_t messageCategory, EventType type, Dictionary payload) {
        // As clients do, lest a message pass for a repetition of the one before.
        payload.set("message_number", ++messages_);
        sendAgain(messageCategory, type, std::move(payload));
    }
    void sendAgain(std::uint32_t messageCategory, EventType type, Dictionary payload) {
        connection_->object().sendMessage(std::move(payload), messageCategory,
                                          static_cast<std::uint16_t>(type), {reporter_}, {});
        service_.run();
    }

private:
    ServiceOnDisk& service_;
    const ReporterID reporter_;
    std::unique_ptr<FakeClientConnection> connection_;
    int messages_ = 0;
};

void Player::playDay(int day, WallTime midnight) {
    constexpr double kFirst = 60;
    constexpr double kLast = 86'400 - 60;
    if (device_.silentFrom && day >= *device_.silentFrom) {
        return;
    }
    service_.turnTo(after(midnight, kFirst));
    showAccessory(day);
    Session own(service_, ++lastProcess_, "com.example.audio", kAudioDeviceUsage);
    const Release& release = device_.releaseOn(day);
    own.send(category(EventKind::generic, Subsystem::hal), EventType::start,
             {{"device_kind", device_.kind->name},
              {"software_release", release.name},
              {"audio_driver", device_.kind->driver},
              {"audio_driver_version", release.driverVersion}});
    for (const Use& use : usesOf(device_, day, faults_, random_)) {
        play(use, midnight, day);
    }
    service_.turnTo(after(midnight, kLast));
}

void Player::showAccessory(int day) {
    auto& earbuds = service_.device().accessories.earbuds;
    earbuds.clear();
    if (device_.hasAccessoryOn(day)) {
        earbuds.push_back(
            {"earbuds of " + device_.name, std::string(kAccessoryModels[device_.accessory->model])});
    }
}

Dictionary Player::settingsOf(const Use& use) {
    const bool isCall = use.application->isCall;
    return {{"QVSessionVolume", use.volume},
            {"session_selected_format", isCall ? "LPCM 24000 Hz mono" : "LPCM 48000 Hz stereo"},
            {"mFormatID", "lpcm"},
            {"mChannelsPerFrame", isCall ? 1 : 2},
            {"active_devices", routes()[use.route].name},
            {"spatializationEnabled", false},
            {"io_buffer_size", isCall ? 480 : 1024},
            {"kaleen_session", use.isGroup ? 1 : 0},
            {"vp_config_operation_mode", isCall ? "telephony" : "none"},
            {"vp_config_input_port", isCall ? "Microphone" : "none"}};
}

void Player::play(const Use& use, WallTime midnight, int day) {
    constexpr double kToSound = 0.2;
    const WallTime start = after(midnight, use.start);
    const bool isCall = use.application->isCall;
    service_.turnTo(start);
    service_.device().deviceConditions.thermal = use.isHot ? 2 : 0;
    Session session(service_, ++lastProcess_, use.application->name, use.application->service);
    const std::uint32_t playback =
        category(isCall ? EventKind::playbackAndRecord : EventKind::playback, Subsystem::session);
    Dictionary settings = settingsOf(use);
    settings.set("session_output_running", true);
    settings.set("session_input_running", isCall);
    service_.turnTo(after(start, kToSound));
    session.send(playback, EventType::start, settings);
    playSound(session, use, after(start, kToSound), day);
    service_.turnTo(after(start, kToSound + use.seconds));
    session.send(
        playback, EventType::stop,
        {{"session_output_running", false}, {"session_input_running", false}, {"kaleen_session", 0}});
    session.send(category(EventKind::generic, Subsystem::session), EventType::stop,
                 {{"session_duration", use.seconds}});
}

void Player::playSound(Session& session, const Use& use, WallTime start, int day) {
    constexpr double kVolumesOfHour = 1.5;
    const double hours = use.seconds / 3600;
    const std::string_view application = use.application->name;
    std::vector<std::pair<double, bool>> events; // when, and whether it is an overload
    const int overloads = random_.count(use.overloadsOfHour * hours);
    const int volumes = random_.count(kVolumesOfHour * hours);
    for (int i = 0; i != overloads + volumes; ++i) {
        events.emplace_back(random_.between(0.5, use.seconds), i < overloads);
    }
    std::ranges::sort(events);
    for (int i = 0; i != use.repetitions; ++i) {
        session.sendAgain(category(EventKind::playback), EventType::generic, {{"state", "listening"}});
    }
    for (const auto& [when, isOverload] : events) {
        service_.turnTo(after(start, when));
        if (isOverload) {
            session.send(category(EventKind::io), EventType::issueDetector,
                         {{"issue_type", "overload"},
                          {"node", device_.kind->driver},
                          {"rtaid_client", application},
                          {"any_channel_silence_seconds", 0.1},
                          {"overload_number", 1},
                          {"issue_number", ++lastIssue_}});
        } else {
            session.send(category(EventKind::volume), EventType::generic,
                         {{"QVSessionVolume", drawVolume(device_, use.route, day, faults_, random_)}});
        }
    }
    if (use.hapticsSeconds > 0) {
        session.send(category(EventKind::playback), EventType::joulery,
                     {{"EngineOnTime", use.hapticsSeconds}, {"ApplicationName", application}});
    }
}

} // namespace tamblo::bench::fleet
