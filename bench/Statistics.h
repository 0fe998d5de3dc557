#pragma once

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <vector>

namespace tamblo::bench {

/// The value below which this share of the samples lies; 0 without samples.
[[nodiscard]] inline double quantile(std::vector<double> samples, double share) {
    if (samples.empty()) {
        return 0;
    }
    const auto index =
        std::min(samples.size() - 1, static_cast<std::size_t>(share * static_cast<double>(samples.size())));
    std::nth_element(samples.begin(), samples.begin() + static_cast<std::ptrdiff_t>(index), samples.end());
    return samples[index];
}

[[nodiscard]] inline double median(std::vector<double> samples) {
    return quantile(std::move(samples), 0.5);
}

[[nodiscard]] inline double microseconds(std::chrono::nanoseconds time) noexcept {
    return static_cast<double>(time.count()) / 1000.0;
}

[[nodiscard]] inline double secondsOf(std::chrono::nanoseconds time) noexcept {
    return static_cast<double>(time.count()) / 1e9;
}

[[nodiscard]] inline double mebibytes(std::size_t bytes) noexcept {
    return static_cast<double>(bytes) / (1024.0 * 1024.0);
}

} // namespace tamblo::bench
