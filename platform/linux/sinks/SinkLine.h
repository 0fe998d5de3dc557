#pragma once

#include "base/JsonObject.h"
#include "platform/Clock.h"

namespace tamblo {

/// One line of a sink: an object that begins with "time", the seconds since 1970.
class SinkLine : public JsonObject {
public:
    SinkLine(TextBuffer& line, WallTime time) : JsonObject(line) { number("time", secondsSince1970(time)); }
};

} // namespace tamblo
