#include "tools/report/Timeline.h"

#include <algorithm>
#include <optional>
#include <utility>

namespace tamblo::report {

namespace {

/// Seconds; a file can claim any length.
constexpr double kLongestEstimate = 366 * 86400.0;

/// Output or input of one session, as its messages turn it on and off.
class Running {
public:
    Running(Timeline& timeline, bool isOutput) : timeline_(timeline), isOutput_(isOutput) {}

    void start(double at) {
        begin_ = isRunning_ ? begin_ : at;
        isRunning_ = true;
    }
    void stop(double at, bool isOpen = false) {
        if (isRunning_) {
            timeline_.stretches.push_back(
                {.begin = begin_, .end = at, .isOutput = isOutput_, .isOpen = isOpen});
        }
        isRunning_ = false;
    }

private:
    Timeline& timeline_;
    const bool isOutput_;
    bool isRunning_ = false;
    double begin_ = 0;
};

/// Adds a mark where the value is another than before.
void markChange(Timeline& timeline, std::optional<Value>& last, const Fact& fact) {
    if (last != fact.value) {
        timeline.marks.push_back({fact.at, fact.kind, &fact.value});
        last = fact.value;
    }
}

void addEstimated(Timeline& timeline, const Session& session, SummaryKind kind) {
    const bool isOutput = kind == SummaryKind::output;
    const bool isKnown = std::ranges::any_of(
        timeline.stretches, [isOutput](const Stretch& stretch) { return stretch.isOutput == isOutput; });
    if (isKnown) {
        return;
    }
    double end = session.ended;
    for (auto summary = session.summaries.rbegin(); summary != session.summaries.rend(); ++summary) {
        // The first of a summary's values is its length.
        if (summary->kind == kind && summary->values[0]) {
            const double length = summary->values[0]->doubleValue();
            const double begin = end - std::clamp(length, -kLongestEstimate, kLongestEstimate);
            timeline.stretches.push_back(
                {.begin = begin, .end = end, .isOutput = isOutput, .isEstimated = true});
            end = begin;
        }
    }
}

} // namespace

Timeline timelineOf(const Session& session) {
    Timeline timeline;
    std::vector<const Fact*> facts;
    facts.reserve(session.facts.size());
    for (const Fact& fact : session.facts) {
        facts.push_back(&fact);
    }
    if (!session.isClockSetBack) {
        // They lie in their order, which decides between those of one time.
        std::ranges::sort(facts, {}, [](const Fact* fact) { return std::pair(fact->at, fact); });
    }
    Running output(timeline, true);
    Running input(timeline, false);
    std::optional<Value> volume;
    std::optional<Value> route;
    for (const Fact* fact : facts) {
        switch (fact->kind) {
        case FactKind::outputStarts:
            output.start(fact->at);
            break;
        case FactKind::outputStops:
            output.stop(fact->at);
            break;
        case FactKind::inputStarts:
            input.start(fact->at);
            break;
        case FactKind::inputStops:
            input.stop(fact->at);
            break;
        case FactKind::activityEnds:
            output.stop(fact->at);
            input.stop(fact->at);
            break;
        case FactKind::volume:
            markChange(timeline, volume, *fact);
            break;
        case FactKind::route:
            markChange(timeline, route, *fact);
            break;
        case FactKind::overload:
        case FactKind::issue:
            timeline.marks.push_back({fact->at, fact->kind, &fact->value});
            break;
        }
    }
    const double end = facts.empty() ? session.ended : std::max(session.ended, facts.back()->at);
    output.stop(end, true);
    input.stop(end, true);
    addEstimated(timeline, session, SummaryKind::output);
    addEstimated(timeline, session, SummaryKind::input);
    return timeline;
}

} // namespace tamblo::report
