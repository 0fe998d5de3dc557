#include "platform/ProcessList.h"

#include <algorithm>
#include <limits>

namespace tamblo {

void ProcessList::add(std::span<const pid_t> processes) {
    for (const pid_t process : processes) {
        add(process);
    }
}

void ProcessList::addNamedBy(const Dictionary& payload) {
    const Value* const named = payload.find(kProcessIDs);
    if (named == nullptr) {
        return;
    }
    const std::span<const Value> elements = named->isArray() ? named->arrayValue() : std::span(named, 1);
    const std::size_t looked = std::min(elements.size(), kMaximumNamed);
    leftOut_ += elements.size() - looked;
    for (const Value& element : elements.first(looked)) {
        if (element.isNumber() && element.kind() != Value::Kind::boolean) {
            add(element.integerValue());
        } else {
            ++leftOut_;
        }
    }
}

void ProcessList::add(std::int64_t process) {
    if (process <= 0 || process > std::numeric_limits<pid_t>::max()) {
        ++leftOut_;
        return;
    }
    const auto identifier = static_cast<pid_t>(process);
    if (std::find(processes_.begin(), processes_.end(), identifier) != processes_.end()) {
        return;
    }
    if (processes_.size() == maximum_) {
        ++leftOut_;
        return;
    }
    processes_.push_back(identifier);
}

} // namespace tamblo
