#pragma once

#include <cstddef>
#include <optional>
#include <span>
#include <string>

namespace tamblo {

/// The place of the bucket that is nearest to the value, or nothing without buckets. Buckets ascend or
/// descend: the walk ends at the first that is farther away than the one before. Halfway between two, the
/// later one is taken.
[[nodiscard]] std::optional<std::size_t> nearestBucket(double value,
                                                       std::span<const double> buckets) noexcept;

/// The text of that bucket, with at most `fractionDigits` digits after the point, and at least one unless
/// that is 0.
[[nodiscard]] std::optional<std::string>
ZRReportingUtilityBucketNumberToString(double value, std::span<const double> buckets,
                                       unsigned fractionDigits);

} // namespace tamblo
