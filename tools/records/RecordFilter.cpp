#include "tools/records/RecordFilter.h"

#include "base/NamePattern.h"
#include "tools/records/Payload.h"
#include "tools/records/SinkFile.h"

#include <algorithm>

namespace tamblo::tools {

namespace {

/// The value of a key of a dictionary of the record; null without either.
const Value* findWithin(const Dictionary& record, std::string_view dictionary, std::string_view key) {
    const Value* const inner = record.find(dictionary);
    return inner == nullptr ? nullptr : inner->dictionaryValue().find(key);
}

const Value* findKey(const Dictionary& record, std::string_view key) {
    const Value* const ofPayload = findWithin(record, "payload", key);
    return ofPayload != nullptr ? ofPayload : record.find(key);
}

} // namespace

void RecordFilter::wantKey(std::string_view text) {
    const std::size_t equals = text.find('=');
    Key key{.name = std::string(text.substr(0, equals)), .value = std::nullopt};
    if (equals != std::string_view::npos) {
        key.value = text.substr(equals + 1);
    }
    keys_.push_back(std::move(key));
}

bool RecordFilter::isEmpty() const noexcept {
    return events_.empty() && keys_.empty() && !reporter_ && !since_ && !until_;
}

bool RecordFilter::accepts(const Dictionary& record) const {
    const std::string name = nameOfRecord(record);
    const bool isWantedEvent =
        events_.empty() || std::any_of(events_.begin(), events_.end(),
                                       [&](const auto& pattern) { return matchesPattern(name, pattern); });
    return isWantedEvent && isOfTime(record) && isOfReporter(record) &&
           std::all_of(keys_.begin(), keys_.end(), [&record](const Key& key) {
               const Value* const value = findKey(record, key.name);
               return value != nullptr &&
                      (!key.value || *value == parseScalar(*key.value) || *value == Value(*key.value));
           });
}

bool RecordFilter::isOfTime(const Dictionary& record) const {
    if (!since_ && !until_) {
        return true;
    }
    const Value* const time = record.find("time");
    return time != nullptr && time->isNumber() && (!since_ || time->doubleValue() >= *since_) &&
           (!until_ || time->doubleValue() < *until_);
}

bool RecordFilter::isOfReporter(const Dictionary& record) const {
    if (!reporter_) {
        return true;
    }
    const Value reporter(*reporter_);
    for (const std::string_view key : {"reporter", "reporterid"}) {
        const Value* const named = findKey(record, key);
        if (named != nullptr && *named == reporter) {
            return true;
        }
    }
    const Value* const session = record.find("session");
    return session != nullptr && session->isString() &&
           sessions_.find(session->stringValue()) != sessions_.end();
}

void RecordFilter::noteSession(const Dictionary& record) {
    const Value* const session = record.find("session");
    const Value* const named = findWithin(record, "userInfo", "ZRReportingSessionID");
    if (reporter_ && session != nullptr && named != nullptr && *named == Value(*reporter_)) {
        sessions_.emplace(session->stringValue());
    }
}

} // namespace tamblo::tools
