// Any bytes as what a reader of the status socket sends: a line, a request of a browser, a tap with its
// filter. Whatever it is, it is a request, or a text says what is wrong with it; and a filter that is one can
// be asked.

#include "Demand.h"
#include "platform/linux/status/StatusRequest.h"
#include "platform/linux/tap/TapFilter.h"

#include <cstdint>

namespace tamblo {
namespace {

using fuzz::demand;

/// A request stays whole, whatever comes behind it.
void arrive(std::string_view received) {
    bool isWhole = false;
    for (std::size_t i = 0; i <= received.size(); ++i) {
        const bool isWholeNow = StatusQuestion::isWhole(received.substr(0, i));
        demand(isWholeNow || !isWhole);
        isWhole = isWholeNow;
    }
}

void ask(std::string_view received) {
    const StatusQuestion question = StatusQuestion::of(received);
    demand(question.line.find('\n') == question.line.npos);
    const auto parsed = StatusRequest::parse(question.line);
    const auto* const request = std::get_if<StatusRequest>(&parsed);
    // The error goes into a document as it stands.
    demand(request != nullptr || std::get<std::string>(parsed).find_first_of("\"\\\n") == std::string::npos);
    demand(question.headOf(5, request).empty() != question.isHttp);
}

void tap(std::string_view json) {
    const auto parsed = TapFilter::parse(json);
    const auto* const filter = std::get_if<TapFilter>(&parsed);
    if (filter == nullptr) {
        demand(!std::get<std::string>(parsed).empty());
        return;
    }
    demand(filter->sample != 0);
    const Dictionary payload{{"n", 1}, {"route", "speaker"}, {"text", ""}};
    const TappedMessage message{
        .reporterID = 7, .serviceName = "telephony", .category = 4, .type = 1, .payload = payload};
    const bool isOpen = filter->reporters.empty() && filter->categories.empty() && filter->types.empty() &&
                        filter->events.empty() && filter->keys.empty() && filter->values.empty();
    demand(filter->accepts(message) || !isOpen);
}

} // namespace
} // namespace tamblo

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
    const std::string_view text(reinterpret_cast<const char*>(bytes), size);
    if (size <= 512) {
        tamblo::arrive(text);
    }
    tamblo::ask(text);
    tamblo::tap(text);
    if (text.starts_with("tap ")) {
        tamblo::tap(text.substr(4));
    }
    return 0;
}
