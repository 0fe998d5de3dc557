#pragma once

#include "base/UniqueFunction.h"

#include <string>
#include <string_view>

namespace tamblo::report {

/// The analytics file has most messages twice, one line under the general name and one under that of the
/// service type, with the same time and payload. This takes two such lines in a row for one, without reading
/// the second, which also tells the service type.
class EventTwins {
public:
    using Take = UniqueFunction<void(std::string_view line, std::string_view service)>;

    explicit EventTwins(Take& take) : take_(take) {}

    void add(std::string_view line);
    /// Hands over what is held back.
    void finish();

private:
    Take& take_;
    std::string held_;
    std::string service_; ///< of the line held back
};

} // namespace tamblo::report
