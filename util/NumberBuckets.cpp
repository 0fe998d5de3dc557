#include "util/NumberBuckets.h"

#include "base/Format.h"

#include <algorithm>
#include <cmath>
#include <cstddef>

namespace tamblo {

namespace {

/// More digits than a double tells apart say nothing.
constexpr unsigned kMostFractionDigits = 60;

std::string bucketText(double bucket, unsigned fractionDigits) {
    const unsigned digits = std::min(fractionDigits, kMostFractionDigits);
    std::string text = formatted("{}", fixed(bucket, static_cast<int>(digits)));
    const std::size_t point = text.find('.');
    if (point == std::string::npos) {
        return text;
    }
    while (text.back() == '0' && text.size() > point + 2) {
        text.pop_back();
    }
    return text;
}

} // namespace

std::optional<std::size_t> nearestBucket(double value, std::span<const double> buckets) noexcept {
    std::optional<std::size_t> best;
    double bestDistance = 0;
    for (std::size_t i = 0; i < buckets.size(); ++i) {
        const double distance = std::fabs(value - buckets[i]);
        if (best && distance > bestDistance) {
            break;
        }
        best = i;
        bestDistance = distance;
    }
    return best;
}

std::optional<std::string> ZRReportingUtilityBucketNumberToString(double value,
                                                                  std::span<const double> buckets,
                                                                  unsigned fractionDigits) {
    const std::optional<std::size_t> nearest = nearestBucket(value, buckets);
    return nearest ? std::optional(bucketText(buckets[*nearest], fractionDigits)) : std::nullopt;
}

} // namespace tamblo
