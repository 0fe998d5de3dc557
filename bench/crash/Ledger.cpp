#include "Ledger.h"

#include <cstdio>

namespace tamblo::bench {

namespace {

constexpr std::uint64_t kMostTold = 20;

} // namespace

Ledger::Ledger() : states_(new std::atomic<std::uint8_t>[kClients * kMostRecords]()) {}

void Ledger::sent(std::size_t client, std::uint64_t number) noexcept {
    stateOf(client, number) = kSent;
    lastSent_[client] = number;
}

void Ledger::answered(std::size_t client, std::uint64_t number, bool mayBeLost) noexcept {
    stateOf(client, number) |= static_cast<std::uint8_t>(kAnswered | (mayBeLost ? kMayBeLost : 0));
}

void Ledger::found(Sink sink, const SinkRecord& record) {
    if (record.client >= kClients || record.number > lastSent_[record.client]) {
        ++verdict_.strange;
        return;
    }
    std::uint64_t& last = lastFound_[static_cast<std::size_t>(sink)][record.client];
    verdict_.strange += record.number <= last ? 1U : 0U;
    last = record.number;
    ++verdict_.records;
    stateOf(record.client, record.number) |= sink == Sink::analyticsEvents ? kFoundEvent : kFoundPower;
}

const Ledger::Verdict& Ledger::judge() {
    for (std::size_t client = 0; client < kClients; ++client) {
        for (std::uint64_t number = lastJudged_[client] + 1; number <= lastSent_[client]; ++number) {
            const unsigned state = stateOf(client, number);
            if ((state & kAnswered) == 0) {
                continue;
            }
            ++verdict_.answered;
            const unsigned wanted = kFoundEvent | (makesPowerEvent(number) ? kFoundPower : 0U);
            if ((state & wanted) != wanted) {
                const bool isExcused = (state & kMayBeLost) != 0;
                ++(isExcused ? verdict_.excused : verdict_.missing);
                if (!isExcused && verdict_.missing <= kMostTold) {
                    std::fprintf(stderr, "tamblo_crash: record %llu of client %zu is missing (found: %s%s)\n",
                                 static_cast<unsigned long long>(number), client,
                                 (state & kFoundEvent) != 0 ? "event " : "",
                                 (state & kFoundPower) != 0 ? "power event" : "");
                }
            }
        }
        lastJudged_[client] = lastSent_[client];
    }
    return verdict_;
}

} // namespace tamblo::bench
