#include "platform/linux/sinks/LinuxCallQualityService.h"

#include "base/Format.h"
#include "os/RandomNumber.h"
#include "platform/linux/sinks/PayloadSize.h"

#include <utility>

namespace tamblo {

class LinuxCallQualityService::SpoolSession final : public Session {
public:
    explicit SpoolSession(std::string text) : name(std::move(text)) {}
    [[nodiscard]] std::string description() const override { return name; }
    [[nodiscard]] static const std::string& nameOf(const SessionRef& session) noexcept {
        return static_cast<const SpoolSession&>(*session).name;
    }

    const std::string name;
};

LinuxCallQualityService::LinuxCallQualityService(SinkFiles& sinks, const Clock& clock,
                                                 const LinuxPreferences& preferences, WorkQueues& workQueues,
                                                 StructuredLog& log)
    : processName_(formatted("{}", hexadecimal(randomNumber(), 16))),
      clock_(clock),
      workQueues_(workQueues),
      file_(sinks, "call-quality.jsonl", "zrri", AppendOnlyFile::Flushed::byOwner),
      backends_({.domain = "com.vandra.tamblo.callquality",
                 .key = "backends",
                 .categoryCode = "zrri",
                 .whenAbsent = {"spool"},
                 .absentMeans = "\"spool\" is the only back end"},
                preferences, log) {
    // Before there may be no descriptor for it; what the queue is answered later is what was read last.
    (void)backends_.read();
}

std::optional<std::string> LinuxCallQualityService::NewHierarchyToken(std::string_view parent) {
    return formatted("{}{}{}.t{}", parent, parent.empty() ? "" : "/", processName_, ++lastToken_);
}

CallQualityService::SessionRef LinuxCallQualityService::CreateLinkmeterSession(const Dictionary& sessionInfo,
                                                                               const Dictionary& userInfo) {
    auto session = std::make_shared<SpoolSession>(formatted("{}.{}", processName_, ++lastSession_));
    file_.append([&](TextBuffer& line) {
        SinkLine(line, clock_.now())
            .text("op", "open")
            .text("session", session->name)
            .value("sessionInfo", sessionInfo)
            .value("userInfo", userInfo);
    });
    return session;
}

void LinuxCallQualityService::StartConfiguration(const SessionRef&, Completion completion) {
    const MutexLock lock(mutex_);
    if (queue_ == nullptr) {
        queue_ = workQueues_.makeSerialQueue("com.vandra.tamblo.linkmeter.backends");
    }
    queue_->post(
        [this, completion = std::move(completion)]() mutable {
            std::vector<std::string> names = backends_.read();
            completion(names.empty() ? std::nullopt : std::optional(std::move(names)));
        },
        Pace::mayBlock);
}

std::optional<std::string> LinuxCallQualityService::SendLinkmeterMessage(const SessionRef& session,
                                                                         std::uint16_t category,
                                                                         std::uint16_t type,
                                                                         const Dictionary& payload) {
    // A file that cannot be written is told of by itself, once. The message at a session's end has the keys
    // of all others, and much of their values: one that is too long is not made into a text first, which
    // would take as much memory again.
    if (session != nullptr && payloadSize(payload) > file_.longestLine()) {
        file_.loseTooLong();
    } else if (session != nullptr) {
        file_.append([&](TextBuffer& line) {
            SinkLine(line, clock_.now())
                .text("op", "message")
                .text("session", SpoolSession::nameOf(session))
                .number("category", category)
                .number("type", type)
                .value("payload", payload);
        });
    }
    return std::nullopt;
}

void LinuxCallQualityService::FlushMessages(const SessionRef& session) {
    file_.append([&](TextBuffer& line) {
        SinkLine(line, clock_.now()).text("op", "flush").text("session", SpoolSession::nameOf(session));
    });
}

} // namespace tamblo
