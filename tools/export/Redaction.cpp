#include "tools/export/Redaction.h"

#include "base/Json.h"
#include "base/Sha256.h"

#include <cstddef>
#include <vector>

namespace tamblo::tools {

namespace {

constexpr std::size_t kDigits = 16;

} // namespace

Dictionary Redaction::of(const Dictionary& record) const {
    std::vector<std::string_view> keys;
    std::vector<Value> values;
    for (std::size_t i = 0; i != record.size(); ++i) {
        const std::string_view key = record.keyAt(i);
        const Value& value = record.valueAt(i);
        if (dropped_.contains(key)) {
            continue;
        }
        keys.push_back(key);
        values.push_back(hashed_.contains(key) ? Value(sha256(secret_ + jsonText(value)).substr(0, kDigits))
                                               : of(value));
    }
    return Dictionary::fromSorted(keys, values);
}

Value Redaction::of(const Value& value) const {
    if (value.isDictionary()) {
        return of(value.dictionaryValue());
    }
    if (!value.isArray()) {
        return value;
    }
    Array elements;
    for (const Value& element : value.arrayValue()) {
        elements.push_back(of(element));
    }
    return elements;
}

} // namespace tamblo::tools
