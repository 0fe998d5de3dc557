#include "platform/linux/captures/DailyAllowance.h"

#include "base/Format.h"
#include "base/Json.h"
#include "base/Rfc3339.h"

#include <utility>
#include <variant>

namespace tamblo {

namespace {

constexpr std::string_view kDay = "day";
constexpr std::string_view kCaptures = "captures";

} // namespace

DailyAllowance::DailyAllowance(const SmallFile& file, std::string_view path, StructuredLog& log) {
    if (file.isMissing()) {
        return;
    }
    const std::variant<Value, JsonError> content = readJson(file.text);
    const Value* const object = std::get_if<Value>(&content);
    const bool isObject = object != nullptr && object->isDictionary();
    const Value* const day = isObject ? object->dictionaryValue().find(kDay) : nullptr;
    const Value* const taken = isObject ? object->dictionaryValue().find(kCaptures) : nullptr;
    if (day == nullptr || !day->isString() || taken == nullptr || !taken->isNumber() ||
        taken->doubleValue() < 0) {
        log.report(LogLevel::error, "zrrb",
                   formatted("{}: {}; captures are counted from 0", path,
                             file.error != 0 ? file.reason() : "no day and number of captures"));
        return;
    }
    day_ = day->stringValue();
    taken_ = taken->unsignedValue();
}

bool DailyAllowance::take(WallTime now) {
    std::string day = formatRfc3339Date(secondsSince1970(now)).value_or("");
    const MutexLock lock(mutex_);
    if (day != day_) {
        day_ = std::move(day);
        taken_ = 0;
    }
    if (taken_ >= kCapturesADay) {
        return false;
    }
    ++taken_;
    return true;
}

std::string DailyAllowance::text() const {
    const MutexLock lock(mutex_);
    return jsonText(Dictionary{{kDay, day_}, {kCaptures, taken_}}) + '\n';
}

} // namespace tamblo
