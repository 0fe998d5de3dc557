#pragma once

#include <cmath>
#include <cstddef>
#include <cstdint>
#include <random>
#include <span>

namespace tamblo::bench {

/// Draws that are the same on every machine for the same seed, which the standard's distributions are not.
class Random {
public:
    Random(std::uint64_t seed, std::uint64_t stream) : engine_(seed * 1'000'003 + stream) {}

    /// From 0 up to, but not, 1.
    double fraction() { return static_cast<double>(engine_() >> 11U) * 0x1p-53; }
    double between(double low, double high) { return low + (high - low) * fraction(); }
    bool happens(double probability) { return fraction() < probability; }
    /// The wait until something that happens once in that time on average.
    double waitOf(double mean) { return -mean * std::log(1.0 - fraction()); }
    double normal(double mean, double deviation) {
        double sum = 0;
        for (int i = 0; i < 12; ++i) {
            sum += fraction();
        }
        return mean + deviation * (sum - 6);
    }
    /// How often something happens that does so that often on average.
    int count(double mean) {
        int happened = 0;
        for (double when = waitOf(1); when < mean; when += waitOf(1)) {
            ++happened;
        }
        return happened;
    }
    /// The place of one of these weights.
    std::size_t pick(std::span<const double> weights) {
        double total = 0;
        for (const double weight : weights) {
            total += weight;
        }
        double left = total * fraction();
        std::size_t place = 0;
        while (place + 1 < weights.size() && left >= weights[place]) {
            left -= weights[place++];
        }
        return place;
    }

private:
    std::mt19937_64 engine_;
};

} // namespace tamblo::bench
