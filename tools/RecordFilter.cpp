#include "tools/RecordFilter.h"

#include "tools/Payload.h"
#include "tools/SinkFile.h"

#include <algorithm>

namespace tamblo::tools {

namespace {

bool matches(std::string_view name, std::string_view pattern) {
    return pattern.ends_with('*') ? name.starts_with(pattern.substr(0, pattern.size() - 1)) : name == pattern;
}

const Value* findKey(const Dictionary& record, std::string_view key) {
    if (const Value* payload = record.find("payload")) {
        if (const Value* value = payload->dictionaryValue().find(key)) {
            return value;
        }
    }
    return record.find(key);
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

bool RecordFilter::accepts(const Dictionary& record) const {
    const std::string name = nameOfRecord(record);
    const bool isWantedEvent =
        events_.empty() || std::any_of(events_.begin(), events_.end(),
                                       [&](const auto& pattern) { return matches(name, pattern); });
    return isWantedEvent && std::all_of(keys_.begin(), keys_.end(), [&record](const Key& key) {
               const Value* const value = findKey(record, key.name);
               return value != nullptr &&
                      (!key.value || *value == parseScalar(*key.value) || *value == Value(*key.value));
           });
}

} // namespace tamblo::tools
