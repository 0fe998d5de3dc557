#pragma once

#include <array>

namespace tamblo {

/// The classes into which summaries put loudness and time, for counting over many devices. Ascending.

/// Session volumes, 0 to 1: the sixteen steps of a device's volume keys, and silence.
inline constexpr std::array<double, 17> kVolumeBuckets{0,     0.0625, 0.125, 0.1875, 0.25,  0.3125,
                                                       0.375, 0.4375, 0.5,   0.5625, 0.625, 0.6875,
                                                       0.75,  0.8125, 0.875, 0.9375, 1};

/// Seconds of playing or recording: from one second to a day, each one and a half to two and a half times the
/// one before.
inline constexpr std::array<double, 18> kTimeBuckets{1,   2,   5,    10,   15,   30,    60,    120,   300,
                                                     600, 900, 1800, 3600, 7200, 14400, 28800, 43200, 86400};

} // namespace tamblo
