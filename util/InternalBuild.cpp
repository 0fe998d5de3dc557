#include "util/InternalBuild.h"

#include "platform/Platform.h"

#include <atomic>

namespace tamblo {

namespace {

enum class Answer : unsigned char { notAsked, no, yes };

constinit std::atomic<Answer> cachedAnswer{Answer::notAsked};

} // namespace

bool ZRReportingUtilityIsInternalBuild() {
    Answer answer = cachedAnswer.load(std::memory_order_relaxed);
    if (answer == Answer::notAsked) {
        const bool isInternal = platform().deviceProperties.booleanProperty("InternalBuild").value_or(false);
        // Of several threads that ask at the same time, the first decides for all.
        const Answer mine = isInternal ? Answer::yes : Answer::no;
        if (cachedAnswer.compare_exchange_strong(answer, mine, std::memory_order_relaxed)) {
            answer = mine;
        }
    }
    return answer == Answer::yes;
}

void forgetInternalBuild() noexcept {
    cachedAnswer.store(Answer::notAsked, std::memory_order_relaxed);
}

} // namespace tamblo
