#pragma once

#include "base/Dictionary.h"
#include "base/UniqueFunction.h"
#include "tools/SessionFile.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace tamblo::tools {

/// Writes a session from the lines of a tap of its reporter, from its start, or the first line of one that is
/// started already, to its stop.
class LiveRecorder {
public:
    /// What the service's status has of the reporter's session, if it is there. Asked when the session is
    /// first seen, for its configuration, and when messages were left out: its stop may be one of them.
    using SessionFunction = UniqueFunction<std::optional<Dictionary>()>;

    LiveRecorder(std::int64_t reporterID, SessionFileWriter& writer, SessionFunction session)
        : reporterID_(reporterID), writer_(writer), session_(std::move(session)) {}

    /// Whether the session goes on.
    [[nodiscard]] bool take(std::string_view line);

    [[nodiscard]] bool hasBegun() const noexcept { return hasBegun_; }
    /// Whether it is known to have ended.
    [[nodiscard]] bool hasStopped() const noexcept { return hasStopped_; }
    [[nodiscard]] const std::string& serviceType() const noexcept { return serviceType_; }
    [[nodiscard]] std::uint64_t withoutNull() const noexcept { return withoutNull_; }
    /// For people: a line for each thing that is missing; empty when nothing is.
    [[nodiscard]] std::string missing() const;

private:
    void begin(const Dictionary& record, bool isAtStart);

    const std::int64_t reporterID_;
    SessionFileWriter& writer_;
    SessionFunction session_;
    bool hasBegun_ = false;
    bool hasBeginning_ = true;
    bool hasConfiguration_ = true;
    bool hasStopped_ = false;
    double start_ = 0; ///< in seconds since 1970
    std::string serviceType_;
    std::uint64_t leftOut_ = 0;
    std::uint64_t large_ = 0;
    std::uint64_t withoutNull_ = 0;
};

} // namespace tamblo::tools
