#pragma once

#include "tools/report/Session.h"

#include <vector>

namespace tamblo::report {

/// A time in which output, or input, ran.
struct Stretch {
    double begin = 0;
    double end = 0; ///< before the beginning where the clock was set back meanwhile
    bool isOutput = true;
    bool isOpen = false;      ///< ran on when the last line came
    bool isEstimated = false; ///< its length is known, and its place is not
};

/// Something that happened at one moment.
struct Mark {
    double at = 0;
    FactKind kind = FactKind::issue; ///< volume, route, overload or issue
    const Value* value = nullptr;    ///< the session's
};

struct Timeline {
    std::vector<Stretch> stretches;
    std::vector<Mark> marks;
};

/// What a session's row shows. Messages count in the order of their timestamps, as clients may send them
/// late; where the clock was set back, in the order in which they came. Where only summaries tell of output
/// or input, their stretches stand one behind the other before the stop.
[[nodiscard]] Timeline timelineOf(const Session& session);

} // namespace tamblo::report
