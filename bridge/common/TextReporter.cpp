#include "bridge/common/TextReporter.h"

#include "base/Format.h"
#include "base/Json.h"
#include "base/TextBuffer.h"

namespace tamblo::bridge {

SessionID TextReporter::begin(ServiceType serviceType, const std::string& application) {
    write(formatted("session {}: begin, {}, of {}", ++last_, client::serviceTypeName(serviceType),
                    application));
    return last_;
}

void TextReporter::send(SessionID session, EventCategory category, EventType type, Dictionary payload,
                        WallTime at) {
    payload.set("zrreporting_timestamp", secondsSince1970(at));
    TextBuffer text;
    appendJson(text, Value(std::move(payload)));
    write(formatted("session {}: {} {} {}", session, client::categoryName(category), client::typeName(type),
                    text.view()));
}

void TextReporter::end(SessionID session) {
    write(formatted("session {}: end", session));
}

void TextReporter::write(const std::string& line) {
    std::fprintf(out_, "%s\n", line.c_str());
    std::fflush(out_);
}

} // namespace tamblo::bridge
