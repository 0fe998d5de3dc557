#include "platform/linux/captures/DailyAllowance.h"

#include "base/Format.h"
#include "base/Json.h"
#include "base/Rfc3339.h"
#include "platform/linux/settings/JsonFile.h"

#include <utility>

namespace tamblo {

namespace {

constexpr std::string_view kDay = "day";
constexpr std::string_view kCaptures = "captures";

} // namespace

DailyAllowance::DailyAllowance(const std::string& path, StructuredLog& log) {
    const auto content = JsonFile(path).read(log);
    if (!content) {
        return;
    }
    const Value* const day = content->find(kDay);
    const Value* const taken = content->find(kCaptures);
    if (day == nullptr || !day->isString() || taken == nullptr || !taken->isNumber() ||
        taken->doubleValue() < 0) {
        log.report(LogLevel::error, "zrrb",
                   formatted("{}: no day and number of captures; they are counted from 0", path));
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
