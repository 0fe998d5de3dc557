#include "workers/accessories/AccessoryRegistry.h"

#include "base/Rfc3339.h"

#include <algorithm>
#include <cmath>
#include <map>
#include <string>
#include <string_view>

namespace tamblo {

namespace {

constexpr std::string_view kFirstSeen = "first_seen";
constexpr std::string_view kLastSeen = "last_seen";
constexpr std::string_view kLastReported = "last_reported";

constexpr std::string_view kDayPattern = "0000-00-00";

struct Entry {
    std::string firstSeen;
    std::string lastSeen;
    std::optional<double> lastReported; ///< seconds since 1970
};
using Entries = std::map<std::string, Entry, std::less<>>;

bool isDay(const Value* value) noexcept {
    const std::string_view text = value != nullptr ? value->stringValue() : std::string_view();
    return std::equal(
        text.begin(), text.end(), kDayPattern.begin(), kDayPattern.end(),
        [](char c, char expected) { return expected == '0' ? c >= '0' && c <= '9' : c == expected; });
}

Entries entriesOf(const std::optional<Value>& kept, bool& hadRubbish) {
    Entries entries;
    if (!kept) {
        return entries;
    }
    hadRubbish = !kept->isDictionary();
    const Dictionary& registered = kept->dictionaryValue();
    for (std::size_t i = 0; i < registered.size(); ++i) {
        const Dictionary& fields = registered.valueAt(i).dictionaryValue();
        const Value* firstSeen = fields.find(kFirstSeen);
        const Value* lastSeen = fields.find(kLastSeen);
        const Value* lastReported = fields.find(kLastReported);
        if (!isDay(firstSeen) || !isDay(lastSeen) || lastReported == nullptr || !lastReported->isNumber()) {
            hadRubbish = true;
            continue;
        }
        entries[std::string(registered.keyAt(i))] = {std::string(firstSeen->stringValue()),
                                                     std::string(lastSeen->stringValue()),
                                                     lastReported->doubleValue()};
    }
    return entries;
}

/// A time far ahead was written while the clock was wrong, and must not silence the accessory until then; one
/// a little ahead may be of a clock that was just set.
bool isDue(const Entry& entry, double now) noexcept {
    constexpr double kInterval = std::chrono::duration<double>(AccessoryRegistry::kReportInterval).count();
    return !entry.lastReported || !(std::abs(now - *entry.lastReported) < kInterval);
}

/// A day ahead is of a clock that was wrong: those go first, not the ones that are seen now.
void forgetLongestUnseen(Entries& entries, std::string_view today) {
    const auto day = [today](const auto& entry) {
        return entry.second.lastSeen <= today ? std::string_view(entry.second.lastSeen) : std::string_view();
    };
    while (entries.size() > AccessoryRegistry::kMostAccessories) {
        entries.erase(std::min_element(entries.begin(), entries.end(),
                                       [&day](const auto& a, const auto& b) { return day(a) < day(b); }));
    }
}

} // namespace

AccessoryRegistry::Update AccessoryRegistry::update(const std::optional<Value>& kept,
                                                    std::span<const Accessory> seen, WallTime now) {
    Update update;
    Entries entries = entriesOf(kept, update.hadRubbish);
    const std::string today = formatRfc3339Date(secondsSince1970(now)).value_or(std::string(kDayPattern));
    for (const Accessory& accessory : seen.first(std::min(seen.size(), kMostAccessories))) {
        Entry& entry = entries[accessory.identifier];
        entry.firstSeen = entry.firstSeen.empty() ? today : std::min(entry.firstSeen, today);
        entry.lastSeen = today;
        if (isDue(entry, secondsSince1970(now))) {
            entry.lastReported = secondsSince1970(now);
            update.reports.push_back({{"model", accessory.model.empty() ? "unknown" : accessory.model},
                                      {"first_seen_day", entry.firstSeen},
                                      {"last_seen_day", entry.lastSeen}});
        }
    }
    forgetLongestUnseen(entries, today);
    for (const auto& [identifier, entry] : entries) {
        update.registered.set(identifier, Dictionary{{kFirstSeen, entry.firstSeen},
                                                     {kLastSeen, entry.lastSeen},
                                                     {kLastReported, entry.lastReported.value_or(0.0)}});
    }
    return update;
}

} // namespace tamblo
