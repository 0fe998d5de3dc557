#include "tools/report/SessionCollector.h"

#include "tools/report/Lines.h"
#include "tools/report/NamedSessions.h"

#include <algorithm>
#include <cmath>
#include <compare>
#include <tuple>
#include <utility>

namespace tamblo::report {

namespace {

constexpr double kSecondsOfDay = 86400;
/// What lies further from its line is no time that a message can have had.
constexpr double kFarthestTimestamp = 365 * kSecondsOfDay;
/// Lines of different threads may be written in another order than that in which they were made.
constexpr double kUsualDisorder = 1;
/// The call-quality file's summary of all messages, whose texts are those of the messages again.
constexpr double kCategoryOfSummary = 65535;
constexpr std::size_t kLongestName = 100;
/// Until a session's call-quality lines are written as its messages come, and how many lines of others may
/// come meanwhile.
constexpr double kLongestSetUp = 10;
constexpr std::size_t kMostLookedAt = 256;
/// Call-quality lines wait for a quarter of a second at most; their writer can be late.
constexpr double kLongestLag = 1;

/// The call-quality file has service types with an ending.
std::string_view withoutEnding(std::string_view service) {
    constexpr std::string_view kEnding = "_session";
    return service.ends_with(kEnding) ? service.substr(0, service.size() - kEnding.size()) : service;
}

bool isTrue(const JsonItem& item) {
    return item.kind == JsonItem::Kind::scalar && item.scalar.boolValue();
}

std::optional<SummaryKind> summaryKindOf(std::string_view tag, std::string_view event) {
    for (std::size_t i = 0; i < kSummaryRows.size(); ++i) {
        if (tag == kSummaryRows[i].tag && (event.empty() || event.ends_with(kSummaryRows[i].event))) {
            return static_cast<SummaryKind>(i);
        }
    }
    return std::nullopt;
}

bool isIssue(std::string_view tag) {
    return tag.ends_with("IssueDetector") || tag.starts_with("Error") || tag.ends_with("Error");
}

} // namespace

std::optional<SessionCollector::Message> SessionCollector::messageOf(const JsonItem& line,
                                                                     std::string_view event) {
    const std::optional<double> time = timeOf(line);
    const JsonItem* const payload = line.find("payload");
    if (!time || payload == nullptr || payload->kind != JsonItem::Kind::object) {
        return std::nullopt;
    }
    Message message{.time = *time,
                    .at = numberIn(*payload, "zrreporting_timestamp").value_or(*time),
                    .application = textIn(*payload, "HostApplicationDisplayID"),
                    .tag = textIn(*payload, "audiotag"),
                    .summary = std::nullopt,
                    .payload = payload};
    if (std::abs(message.at - message.time) > kFarthestTimestamp) {
        message.at = message.time;
    }
    message.summary = summaryKindOf(message.tag, event);
    return message;
}

bool SessionCollector::takeCallQuality(const JsonItem& line) {
    evict();
    const std::optional<double> time = timeOf(line);
    const std::string_view op = textIn(line, "op");
    const std::string_view name = textIn(line, "session");
    if (!time || name.empty() || name.size() > kLongestName) {
        return false;
    }
    lastCallQuality_ = *time;
    if (op == "open") {
        open(line, *time, name);
        return true;
    }
    if (op == "flush") {
        Session& session = namedSession(name, *time);
        follow(session, *time);
        session.hasStop = true;
        open_.erase(open_.find(name));
        if (!wanted_.wantsApplication(session.application.stringValue())) {
            bytes_ -= session.bytes;
            sessions_.erase(session.serial);
        }
        return true;
    }
    const auto message = op == "message" ? messageOf(line, {}) : std::nullopt;
    if (!message) {
        return false;
    }
    if (numberIn(line, "category") == kCategoryOfSummary) {
        return true;
    }
    Session& session = namedSession(name, *time);
    if (session.application.stringValue().empty()) {
        session.application = texts_.of(message->application);
    }
    if (!wanted_.wantsApplication(session.application.stringValue())) {
        return true;
    }
    // Of another session of the application, too: its events shall not be taken for those of the one wanted.
    places_.push_back(
        {*time, session.serial, static_cast<std::uint32_t>(session.facts.size()), hashOf(message->tag)});
    count(session, sizeof(Place));
    if (wanted_.mayWant(session)) {
        add(session, *message);
    }
    return true;
}

void SessionCollector::open(const JsonItem& line, double time, std::string_view name) {
    Session& session = namedSession(name, time);
    session.hasStart = true;
    const JsonItem* const user = line.find("userInfo");
    if (user == nullptr || user->kind != JsonItem::Kind::object) {
        return;
    }
    session.application = texts_.of(textIn(*user, "HostApplicationDisplayID"));
    session.service = texts_.of(withoutEnding(textIn(*user, "ServiceName")));
    const JsonItem* const reporter = user->find("ZRReportingSessionID");
    if (reporter != nullptr && reporter->kind == JsonItem::Kind::scalar) {
        session.reporter = reporter->scalar.integerValue();
    }
}

bool SessionCollector::takeEvent(const JsonItem& line, std::string_view service) {
    evict();
    const auto message = messageOf(line, textIn(line, "event"));
    if (!message || textIn(line, "event").empty()) {
        return false;
    }
    // Older lines belong to sessions that were left out.
    if (message->application.empty() || message->time <= leftOut_.until ||
        !wanted_.wantsApplication(message->application)) {
        return true;
    }
    const bool isStop = message->summary == SummaryKind::session;
    if (Place* const place = placeOf(*message); place != nullptr) {
        place->tag = kFound;
        // The call-quality file has no timestamps on most builds.
        std::vector<Fact>& facts = sessions_.at(place->session).facts;
        for (std::size_t i = place->fact; i < facts.size() && facts[i].time == place->time; ++i) {
            facts[i].at = message->at;
        }
        if (isStop) {
            giveGroupSummaries(*message, service, sessions_.at(place->session));
        }
        return true;
    }
    takeUnnamed(*message, service);
    return true;
}

/// Of an event that no call-quality line belongs to.
void SessionCollector::takeUnnamed(const Message& message, std::string_view service) {
    const bool isStop = message.summary == SummaryKind::session;
    if (isStillToCome(message)) {
        return;
    }
    if (!wanted_.session.empty() && message.summary != SummaryKind::group) {
        // No session without a name is wanted: only what comes in front of the stop of one that has a name.
        if (isStop) {
            Session other;
            giveGroupSummaries(message, service, other);
        }
        return;
    }
    Session& session = eventsSession(message, service);
    add(session, message);
    if (isStop) {
        session.hasStop = true;
        session.service = texts_.of(textIn(*message.payload, "summaryServiceName"));
    }
}

bool SessionCollector::isStillToCome(const Message& message) {
    const double lag = message.time - lastCallQuality_;
    return lag > 0 && lag <= kLongestLag && running_.contains(texts_.of(message.application).stringValue());
}

void SessionCollector::finishCallQuality() {
    std::ranges::sort(places_, {},
                      [](const Place& place) { return std::tuple(place.time, place.session, place.fact); });
    for (const auto& [name, serial] : open_) {
        running_.emplace(sessions_.at(serial).application.stringValue());
    }
}

void SessionCollector::finish() {
    // What is known of a session that is named is told there: what is left of its events is what the
    // call-quality file has no line for.
    const NamedSessions named(sessions_);
    std::erase_if(sessions_, [this, &named](const auto& entry) {
        const Session& session = entry.second;
        const bool isRest = session.name.stringValue().empty() && !session.hasStop && session.facts.empty();
        return !wanted_.wants(session) ||
               (isRest && named.ranOf(session.application, session.began - kUsualDisorder, session.ended));
    });
}

void SessionCollector::add(Session& session, const Message& message) {
    follow(session, message.time);
    if (session.application.stringValue().empty()) {
        session.application = texts_.of(message.application);
    }
    for (const JsonItem* item = message.payload->first(); item != message.payload->end();
         item = item->next()) {
        if (const std::size_t key = keys_.of(item->key); key != KeyNames::kNone) {
            session.addKey(key);
        }
    }
    if (message.summary) {
        addSummary(session, message);
    } else {
        ++session.messages;
        addFacts(session, message);
    }
}

void SessionCollector::addFacts(Session& session, const Message& message) {
    const JsonItem* const issue = message.payload->find("issue_type");
    const JsonItem* const duration = message.payload->find("session_duration");
    if (const JsonItem* item = message.payload->find("active_devices")) {
        addFact(session, message, FactKind::route, texts_.of(*item));
    }
    if (const JsonItem* item = message.payload->find("QVSessionVolume")) {
        addFact(session, message, FactKind::volume, texts_.of(*item));
    }
    if (const JsonItem* item = message.payload->find("session_output_running")) {
        addFact(session, message, isTrue(*item) ? FactKind::outputStarts : FactKind::outputStops);
    }
    if (const JsonItem* item = message.payload->find("session_input_running")) {
        addFact(session, message, isTrue(*item) ? FactKind::inputStarts : FactKind::inputStops);
    }
    if (duration != nullptr) {
        addFact(session, message, FactKind::activityEnds);
    }
    if (issue != nullptr && issue->text == "overload") {
        // As in the session's own summary, one with a duration does not count.
        if (duration == nullptr) {
            addFact(session, message, FactKind::overload, texts_.of(*issue));
        }
    } else if (issue != nullptr || isIssue(message.tag)) {
        addFact(session, message, FactKind::issue,
                issue != nullptr ? texts_.of(*issue) : texts_.of(message.tag));
    }
}

void SessionCollector::addFact(Session& session, const Message& message, FactKind kind, Value value) {
    // What ends a stretch is kept a while longer than what begins one.
    const bool isEnd = kind == FactKind::outputStops || kind == FactKind::inputStops;
    if (session.facts.size() >= kMostFacts * (isEnd ? 2 : 1)) {
        ++leftOut_.facts;
        return;
    }
    count(session, sizeof(Fact) + value.heldBytes());
    session.facts.push_back({message.time, message.at, std::move(value), kind});
}

void SessionCollector::addSummary(Session& session, const Message& message) {
    if (session.summaries.size() == kMostSummaries) {
        ++leftOut_.summaries;
        return;
    }
    const SummaryRow& row = kSummaryRows[static_cast<std::size_t>(*message.summary)];
    Summary summary{.kind = *message.summary, .values = {}};
    std::size_t bytes = sizeof(Summary) + row.keys.size() * sizeof(std::optional<Value>);
    summary.values.reserve(row.keys.size());
    for (const std::string_view key : row.keys) {
        const JsonItem* const item = message.payload->find(key);
        summary.values.push_back(item != nullptr ? std::optional(texts_.of(*item)) : std::nullopt);
        bytes += item != nullptr ? summary.values.back()->heldBytes() : 0;
    }
    if (summary.kind == SummaryKind::session) {
        session.process = texts_.of(textIn(*message.payload, "clientProcessName"));
        if (session.service.stringValue().empty()) {
            session.service = texts_.of(textIn(*message.payload, "summaryServiceName"));
        }
    }
    session.summaries.push_back(std::move(summary));
    count(session, bytes);
}

void SessionCollector::follow(Session& session, double time) {
    session.isClockSetBack = session.isClockSetBack || time < session.ended - kUsualDisorder;
    session.ended = time;
}

Session& SessionCollector::make(double time) {
    Session& session = sessions_[++lastSerial_];
    session.serial = lastSerial_;
    session.name = session.application = session.service = session.process = Value("");
    session.began = session.ended = time;
    constexpr std::size_t kMapsAndTexts = 512;
    count(session, sizeof(Session) + kMapsAndTexts);
    return session;
}

Session& SessionCollector::namedSession(std::string_view name, double time) {
    const auto known = open_.find(name);
    if (known != open_.end()) {
        return sessions_.at(known->second);
    }
    Session& session = make(time);
    session.name = Value(name);
    open_.emplace(name, session.serial);
    return session;
}

Session& SessionCollector::eventsSession(const Message& message, std::string_view service) {
    const std::pair key(std::string(cutUtf8(message.application, SharedTexts::kLongest)),
                        std::string(cutUtf8(service, SharedTexts::kLongest)));
    const auto known = events_.find(key);
    if (known != events_.end()) {
        // The summaries of input, and what drivers counted, come behind the session's own.
        Session& session = sessions_.at(known->second);
        const bool isRest = message.summary == SummaryKind::input || message.tag.starts_with("Chanlog");
        if (!session.hasStop || isRest) {
            return session;
        }
    }
    Session& session = make(message.time);
    session.service = texts_.of(service);
    events_[key] = session.serial;
    return session;
}

void SessionCollector::giveGroupSummaries(const Message& message, std::string_view service,
                                          Session& session) {
    const auto known = events_.find(std::pair(std::string(message.application), std::string(service)));
    if (known == events_.end()) {
        return;
    }
    Session& rest = sessions_.at(known->second);
    if (rest.hasStop) {
        return;
    }
    for (Summary& summary : rest.summaries) {
        if (summary.kind == SummaryKind::group) {
            session.summaries.push_back(std::move(summary));
        }
    }
    std::erase_if(rest.summaries, [](const Summary& summary) { return summary.kind == SummaryKind::group; });
    if (rest.facts.empty() && rest.summaries.empty()) {
        bytes_ -= rest.bytes;
        sessions_.erase(known->second);
        events_.erase(known);
    }
}

SessionCollector::Place* SessionCollector::placeOf(const Message& message) {
    const Value application = texts_.of(message.application);
    const std::uint32_t tag = hashOf(message.tag);
    auto place = std::ranges::lower_bound(places_, message.time, {}, &Place::time);
    for (std::size_t looked = 0; place != places_.end() && looked < kMostLookedAt; ++place, ++looked) {
        const double delay = place->time - message.time;
        if (delay > kLongestSetUp) {
            break;
        }
        const Session& session = sessions_.at(place->session);
        const bool isSettingUp = place->tag == tag && place->time - session.began <= kLongestSetUp;
        if (session.application == application && (delay == 0 || isSettingUp)) {
            return &*place;
        }
    }
    return nullptr;
}

std::uint32_t SessionCollector::hashOf(std::string_view tag) const noexcept {
    const auto hash = static_cast<std::uint32_t>(tagHash_(tag));
    return hash != kFound ? hash : 1;
}

void SessionCollector::count(Session& session, std::size_t bytes) {
    session.bytes += bytes;
    bytes_ += bytes;
}

void SessionCollector::evict() {
    if (bytes_ <= mostBytes_) {
        return;
    }
    struct Candidate {
        bool mayBeWanted = false;
        double ended = 0;
        std::uint64_t serial = 0;
        auto operator<=>(const Candidate&) const = default;
    };
    std::vector<Candidate> oldest;
    oldest.reserve(sessions_.size());
    for (const auto& [serial, session] : sessions_) {
        oldest.push_back({wanted_.mayWant(session), session.ended, serial});
    }
    std::ranges::sort(oldest);
    for (const Candidate& candidate : oldest) {
        if (bytes_ <= mostBytes_ / 8 * 7) {
            break;
        }
        const Session& session = sessions_.at(candidate.serial);
        leftOut_.sessions += wanted_.wants(session) ? 1 : 0;
        if (candidate.mayBeWanted) {
            leftOut_.until = std::max(leftOut_.until, candidate.ended);
        }
        bytes_ -= session.bytes;
        sessions_.erase(candidate.serial);
    }
    const auto isGone = [this](std::uint64_t serial) { return !sessions_.contains(serial); };
    std::erase_if(open_, [&](const auto& entry) { return isGone(entry.second); });
    std::erase_if(events_, [&](const auto& entry) { return isGone(entry.second); });
    std::erase_if(places_, [&](const Place& place) { return isGone(place.session); });
}

} // namespace tamblo::report
