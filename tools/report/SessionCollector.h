#pragma once

#include "base/JsonReader.h"
#include "tools/report/Session.h"
#include "tools/report/SessionFilter.h"
#include "tools/report/Texts.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <unordered_map>

namespace tamblo::report {

/// What was left out of what was read, beyond the lines.
struct LeftOut {
    std::uint64_t sessions = 0; ///< the oldest, beyond the memory that a report may take
    std::uint64_t facts = 0;    ///< of single sessions, beyond what one may have
    std::uint64_t summaries = 0;
    double until = 0; ///< when the last of the sessions that were left out ended
};

/// Puts sessions together from the lines of the call-quality file, which name them, and then from analytics
/// events, which do not: an event belongs to the session whose call-quality line carries the same time, or,
/// while that session was being set up, comes somewhat later. What belongs to none, because the call-quality
/// file has been rotated further or is not written, is put together by application and service type, from one
/// stop to the next.
///
/// Keeps the newest of the sessions that are wanted, as many as fit into the given bytes. Of others it only
/// knows that they run, so that they take the place of none.
class SessionCollector {
public:
    static constexpr std::size_t kMostFacts = 5000;
    static constexpr std::size_t kMostSummaries = 1000;

    SessionCollector(SessionFilter wanted, std::size_t mostBytes)
        : wanted_(std::move(wanted)), mostBytes_(mostBytes) {}

    // First the lines of the call-quality file, then those of events, whether each is one that is understood.
    [[nodiscard]] bool takeCallQuality(const JsonItem& line);
    void finishCallQuality();
    /// The service type is empty where no event names it.
    [[nodiscard]] bool takeEvent(const JsonItem& line, std::string_view service);
    /// When all is read: drops what is not wanted, and what was put together of events of sessions that are
    /// known and go on.
    void finish();

    /// The oldest first.
    [[nodiscard]] const std::map<std::uint64_t, Session>& sessions() const noexcept { return sessions_; }
    [[nodiscard]] const KeyNames& keys() const noexcept { return keys_; }
    [[nodiscard]] const LeftOut& leftOut() const noexcept { return leftOut_; }

private:
    /// A message of a line, with what every use of it looks for.
    struct Message {
        double time = 0;
        double at = 0;
        std::string_view application;
        std::string_view tag;
        std::optional<SummaryKind> summary;
        const JsonItem* payload = nullptr;
    };
    /// Where the facts of a call-quality line are.
    struct Place {
        double time = 0;
        std::uint64_t session = 0;
        std::uint32_t fact = 0;
        std::uint32_t tag = kFound; ///< a hash of it, until its event has been found
    };
    static constexpr std::uint32_t kFound = 0;

    [[nodiscard]] static std::optional<Message> messageOf(const JsonItem& line, std::string_view event);
    void open(const JsonItem& line, double time, std::string_view name);
    void add(Session& session, const Message& message);
    void addFacts(Session& session, const Message& message);
    void addFact(Session& session, const Message& message, FactKind kind, Value value = {});
    void addSummary(Session& session, const Message& message);
    void follow(Session& session, double time);
    Session& make(double time);
    Session& namedSession(std::string_view name, double time);
    Session& eventsSession(const Message& message, std::string_view service);
    void count(Session& session, std::size_t bytes);
    void evict();
    /// Whether the event is of a running session whose call-quality line has not been written yet.
    [[nodiscard]] bool isStillToCome(const Message& message);
    void takeUnnamed(const Message& message, std::string_view service);
    /// Where the call-quality line of an event is; null when there is none.
    [[nodiscard]] Place* placeOf(const Message& message);
    [[nodiscard]] std::uint32_t hashOf(std::string_view tag) const noexcept;
    /// Those of group playback are no call-quality lines on most builds.
    void giveGroupSummaries(const Message& message, std::string_view service, Session& session);

    const SessionFilter wanted_;
    const std::size_t mostBytes_;
    std::size_t bytes_ = 0;
    std::uint64_t lastSerial_ = 0;
    std::map<std::uint64_t, Session> sessions_;
    std::unordered_map<std::string, std::uint64_t, SeededTextHash, std::equal_to<>> open_; ///< by name
    std::map<std::pair<std::string, std::string>, std::uint64_t> events_; ///< by application and service
    std::deque<Place> places_;
    double lastCallQuality_ = 0;                 ///< the last line's time
    std::set<std::string, std::less<>> running_; ///< applications of sessions that had not stopped there
    SeededTextHash tagHash_;
    SharedTexts texts_;
    KeyNames keys_;
    LeftOut leftOut_;
};

} // namespace tamblo::report
