#include "system/SystemMonitorDictionary.h"

#include <utility>

namespace tamblo {

SystemMonitorDictionary::Observation::~Observation() {
    if (dictionary_ != nullptr) {
        dictionary_->removeKeyObserver(key_, id_);
    }
}

Dictionary SystemMonitorDictionary::find(std::string_view key) const {
    const RecursiveMutexLock held(mutex_);
    const auto found = entries_.find(key);
    return found != entries_.end() ? found->second.state : Dictionary();
}

void SystemMonitorDictionary::set(std::string_view key, Dictionary state) {
    const RecursiveMutexLock held(mutex_);
    const auto stored = entry(key);
    stored->second.state = std::move(state);
    const auto& observers = stored->second.observers;
    // Observers come and go while they are called: the way on is found by number, and those that come
    // meanwhile have read this state themselves.
    const std::uint64_t last = lastObserver_;
    auto next = observers.begin();
    while (next != observers.end() && next->first <= last) {
        const auto [id, observer] = *next;
        observer->keyValueChanged(stored->first);
        next = observers.upper_bound(id);
    }
}

SystemMonitorDictionary::Observation SystemMonitorDictionary::addKeyObserver(KeyObserver& observer,
                                                                             std::string_view key) {
    const RecursiveMutexLock held(mutex_);
    const auto observed = entry(key);
    observed->second.observers.emplace(++lastObserver_, &observer);
    return {shared_from_this(), observed->first, lastObserver_};
}

std::size_t SystemMonitorDictionary::observationCount() const {
    const RecursiveMutexLock held(mutex_);
    std::size_t count = 0;
    for (const auto& [key, entry] : entries_) {
        count += entry.observers.size();
    }
    return count;
}

SystemMonitorDictionary::Entries::iterator SystemMonitorDictionary::entry(std::string_view key) {
    const auto found = entries_.find(key);
    return found != entries_.end() ? found : entries_.emplace(key, Entry()).first;
}

void SystemMonitorDictionary::removeKeyObserver(std::string_view key, std::uint64_t id) {
    const RecursiveMutexLock held(mutex_);
    entry(key)->second.observers.erase(id);
}

} // namespace tamblo
