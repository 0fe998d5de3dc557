#include "platform/linux/sinks/LinuxCallQualityService.h"

#include "base/Format.h"
#include "os/RandomNumber.h"
#include "platform/PreferenceDomains.h"
#include "platform/linux/sinks/PayloadSize.h"

#include <cstddef>
#include <utility>

namespace tamblo {

namespace {

constexpr std::chrono::milliseconds kLongestHeldBack{250};
constexpr std::size_t kMostHeldBack = 64U << 10U;
/// With so many keys at most, a message's line is not too long: its values are bounded.
constexpr std::size_t kKeysOfOrdinaryMessage = 1024;

} // namespace

class LinuxCallQualityService::SpoolSession final : public Session {
public:
    SpoolSession(std::string text, bool batches) : name(std::move(text)), isBatched(batches) {}
    [[nodiscard]] std::string description() const override { return name; }
    [[nodiscard]] static const SpoolSession& of(const SessionRef& session) noexcept {
        return static_cast<const SpoolSession&>(*session);
    }

    const std::string name;
    const bool isBatched;
};

LinuxCallQualityService::LinuxCallQualityService(SinkFiles& sinks, const Clock& clock,
                                                 const LinuxPreferences& preferences, WorkQueues& workQueues,
                                                 StructuredLog& log)
    : processName_(formatted("{}", hexadecimal(randomNumber(), 16))),
      clock_(clock),
      workQueues_(workQueues),
      texts_(sinks.payloadTexts()),
      file_(sinks, "call-quality.jsonl", "zrri", AppendOnlyFile::Flushed::byOwner,
            {.waiting = kMostHeldBack}),
      backends_({.domain = kCallQualityDomain,
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
    const Value* const batches = sessionInfo.find(linkmeter::BatchEvent);
    auto session = std::make_shared<SpoolSession>(formatted("{}.{}", processName_, ++lastSession_),
                                                  batches != nullptr && batches->boolValue());
    file_.append([&](TextBuffer& line) {
        SinkLine(line, clock_.now())
            .text("op", "open")
            .text("session", session->name)
            .value("sessionInfo", sessionInfo)
            .value("userInfo", userInfo);
    });
    isDue_ = true;
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
                                                                         const Dictionary& payload,
                                                                         std::string_view leftOut) {
    if (session == nullptr) {
        return std::nullopt;
    }
    // A file that cannot be written is told of by itself, once. The message at a session's end has the keys
    // of all others: one that is too long is not made into a text first, which would take as much memory
    // again.
    if (payload.size() > kKeysOfOrdinaryMessage && payloadSize(payload) > file_.longestLine()) {
        file_.loseTooLong();
        return std::nullopt;
    }
    file_.append([&](TextBuffer& lines) { appendMessage(lines, session, category, type, payload, leftOut); });
    if (!SpoolSession::of(session).isBatched) {
        isDue_ = true;
    }
    return std::nullopt;
}

bool LinuxCallQualityService::trySendLinkmeterMessage(const SessionRef& session, std::uint16_t category,
                                                      std::uint16_t type, const Dictionary& payload,
                                                      std::string_view leftOut) {
    const std::optional<std::size_t> waiting = file_.tryAppend(
        [&](TextBuffer& lines) { appendMessage(lines, session, category, type, payload, leftOut); });
    if (waiting && (*waiting >= kMostHeldBack || !SpoolSession::of(session).isBatched)) {
        isDue_ = true;
    }
    return waiting.has_value();
}

void LinuxCallQualityService::appendMessage(TextBuffer& lines, const SessionRef& session,
                                            std::uint16_t category, std::uint16_t type,
                                            const Dictionary& payload, std::string_view leftOut) {
    texts_.appendLine(lines, clock_, payload, leftOut, [&](TextBuffer& line) {
        line.append(",\"op\":\"message\",\"session\":\"");
        line.append(SpoolSession::of(session).name);
        line.append("\",\"category\":");
        appendJson(line, Value(category));
        line.append(",\"type\":");
        appendJson(line, Value(type));
    });
}

void LinuxCallQualityService::FlushMessages(const SessionRef& session) {
    file_.append([&](TextBuffer& line) {
        SinkLine(line, clock_.now()).text("op", "flush").text("session", SpoolSession::of(session).name);
    });
    isDue_ = true;
}

std::optional<std::chrono::milliseconds> LinuxCallQualityService::endRun() {
    if (isDue_.exchange(false)) {
        file_.flush();
        texts_.endBatch();
    } else if (file_.isWaiting() && !isTimed_.exchange(true)) {
        return kLongestHeldBack;
    }
    return std::nullopt;
}

void LinuxCallQualityService::writeHeldBack() {
    // Behind what whoever found it set has appended.
    (void)isTimed_.exchange(false);
    file_.flush();
}

} // namespace tamblo
