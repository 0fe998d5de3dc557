#pragma once

#include "base/Dictionary.h"
#include "base/Mutex.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>

namespace tamblo {

/// The system monitor's snapshot: the latest state of each feature, by the feature's name, observable per
/// name.
///
/// Shared by the monitor, which stores, and by the workers that read and observe it; always made with
/// `std::make_shared`. It outlives its monitor for as long as a worker holds it, and then changes no more.
/// Any thread. Observers are called inside a store, with the lock held, on the storing thread: they may read,
/// observe, and end observations, their own and others', meanwhile.
class SystemMonitorDictionary : public std::enable_shared_from_this<SystemMonitorDictionary> {
public:
    using Lock = std::unique_lock<std::recursive_mutex>;

    class KeyObserver {
    public:
        /// The key's value is to be read from the dictionary.
        virtual void keyValueChanged(std::string_view key) = 0;

    protected:
        ~KeyObserver() = default;
    };

    /// One observer's interest in one key, until this is destroyed: no call follows, and one that runs on
    /// another thread is waited for. Keeps the dictionary.
    class Observation {
    public:
        Observation(Observation&&) noexcept = default;
        ~Observation();

    private:
        friend class SystemMonitorDictionary;
        Observation(std::shared_ptr<SystemMonitorDictionary> dictionary, std::string_view key,
                    std::uint64_t id) noexcept
            : dictionary_(std::move(dictionary)), key_(key), id_(id) {}

        std::shared_ptr<SystemMonitorDictionary> dictionary_; ///< null after a move
        std::string_view key_;                                ///< the dictionary's own
        std::uint64_t id_;
    };

    /// For what takes more than one step. Recursive.
    [[nodiscard]] Lock lock() const { return Lock(mutex_.native()); }
    /// The state stored last; empty when there is none.
    [[nodiscard]] Dictionary find(std::string_view key) const;
    /// Stores a state, then calls the key's observers, in the order in which they came.
    void set(std::string_view key, Dictionary state);

    /// From the next store under the key on, each calls the observer; the current state is not told. The
    /// observer must outlive the observation.
    [[nodiscard]] Observation addKeyObserver(KeyObserver& observer, std::string_view key);
    /// Of all keys; for tests, which look for one that was left behind.
    [[nodiscard]] std::size_t observationCount() const;

private:
    struct Entry {
        Dictionary state;
        std::map<std::uint64_t, KeyObserver*> observers;
    };
    using Entries = std::map<std::string, Entry, std::less<>>;

    /// Entries are never removed.
    Entries::iterator entry(std::string_view key) TAMBLO_REQUIRES(mutex_);
    void removeKeyObserver(std::string_view key, std::uint64_t id);

    mutable RecursiveMutex mutex_;
    Entries entries_ TAMBLO_GUARDED_BY(mutex_);
    std::uint64_t lastObserver_ TAMBLO_GUARDED_BY(mutex_) = 0;
};

} // namespace tamblo
