#include "platform/linux/sinks/LinuxCallQualityService.h"

#include "base/Format.h"
#include "platform/linux/loop/LinuxSerialQueue.h"
#include "platform/linux/sinks/SinkLine.h"

#include <algorithm>
#include <chrono>
#include <utility>

#include <sys/random.h>

namespace tamblo {

namespace {

constexpr std::string_view kDomain = "com.vandra.tamblo.callquality";
constexpr std::string_view kKey = "backends";
constexpr const char* kSpool = "spool";

/// Sixteen hexadecimal digits.
std::string makeProcessName(const Clock& clock) {
    // The time will do early in the device's start, when there is no randomness yet.
    auto bits = static_cast<std::uint64_t>(clock.now().time_since_epoch().count());
    std::uint64_t random = 0;
    if (::getrandom(&random, sizeof random, GRND_NONBLOCK) == sizeof random) {
        bits = random;
    }
    std::string name(16, '0');
    for (auto digit = name.rbegin(); digit != name.rend(); ++digit) {
        *digit = "0123456789abcdef"[bits % 16];
        bits /= 16;
    }
    return name;
}

} // namespace

class LinuxCallQualityService::SpoolSession final : public Session {
public:
    explicit SpoolSession(std::string name) : name_(std::move(name)) {}
    [[nodiscard]] std::string description() const override { return name_; }
    [[nodiscard]] const std::string& name() const noexcept { return name_; }
    [[nodiscard]] static const std::string& nameOf(const SessionRef& session) noexcept {
        return static_cast<const SpoolSession&>(*session).name();
    }

private:
    const std::string name_;
};

LinuxCallQualityService::LinuxCallQualityService(const std::string& logsDirectory, const Clock& clock,
                                                 const LinuxPreferences& preferences, WorkQueues& workQueues,
                                                 StructuredLog& log, FileOperations& operations)
    : processName_(makeProcessName(clock)),
      clock_(clock),
      preferences_(preferences),
      workQueues_(workQueues),
      log_(log),
      file_(logsDirectory + "/call-quality.jsonl", "zrri", log, operations) {}

std::optional<std::string> LinuxCallQualityService::NewHierarchyToken(std::string_view parent) {
    return formatted("{}{}{}.t{}", parent, parent.empty() ? "" : "/", processName_, ++lastToken_);
}

CallQualityService::SessionRef LinuxCallQualityService::CreateLinkmeterSession(const Dictionary& sessionInfo,
                                                                               const Dictionary& userInfo) {
    auto session = std::make_shared<SpoolSession>(formatted("{}.{}", processName_, ++lastSession_));
    file_.append([&](TextBuffer& line) {
        SinkLine(line, clock_.now())
            .text("op", "open")
            .text("session", session->name())
            .value("sessionInfo", sessionInfo)
            .value("userInfo", userInfo);
    });
    return session;
}

void LinuxCallQualityService::StartConfiguration(const SessionRef&, Completion completion) {
    std::call_once(isQueueMade_,
                   [this] { queue_ = workQueues_.makeSerialQueue("com.vandra.tamblo.linkmeter.backends"); });
    queue_->post([this, completion = std::move(completion)]() mutable { completion(findBackends()); },
                 Pace::mayBlock);
}

std::optional<std::vector<std::string>> LinuxCallQualityService::findBackends() {
    const std::optional<Value> value = preferences_.copyPreferenceValue(kKey, kDomain);
    std::vector<std::string> names;
    bool isMalformed = false;
    if (!value) {
        names.emplace_back(kSpool);
    } else {
        isMalformed = !value->isArray();
        for (const Value& element : value->arrayValue()) {
            if (element.stringValue().empty()) {
                isMalformed = true;
            } else {
                names.emplace_back(element.stringValue());
            }
        }
    }
    // Told once, however many sessions ask.
    if (!isMalformed) {
        reported_.reset();
    } else if (std::exchange(reported_, value) != value) {
        log_.report(LogLevel::error, "zrri",
                    formatted("{}: {} {}", preferences_.path(kDomain), kKey,
                              value->isArray() ? "holds what is no name; that is ignored"
                                               : "is no array; no back end is found"));
    }
    return names.empty() ? std::nullopt : std::optional(std::move(names));
}

std::optional<std::string> LinuxCallQualityService::SendLinkmeterMessage(const SessionRef& session,
                                                                         std::uint16_t category,
                                                                         std::uint16_t type,
                                                                         const Dictionary& payload) {
    // A file that cannot be written is told of by itself, once.
    if (session != nullptr) {
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

void LinuxCallQualityService::commit() {
    // What the event loop's thread has recorded for one session after the other is written once, by the loop.
    if (InlineDrain::current() == nullptr) {
        flush();
    }
}

} // namespace tamblo
