#pragma once

#include <mutex>

// What clang's thread-safety analysis is told (-Wthread-safety, an error in the clang build); nothing to
// other compilers. A field that a mutex guards says so: `int count_ TAMBLO_GUARDED_BY(mutex_) = 0;`, and a
// function that is called with the mutex held: `void countLocked() TAMBLO_REQUIRES(mutex_);`.
#if defined(__clang__)
#define TAMBLO_THREAD_ANNOTATION(...) __attribute__((__VA_ARGS__))
#else
#define TAMBLO_THREAD_ANNOTATION(...)
#endif
#define TAMBLO_GUARDED_BY(mutex) TAMBLO_THREAD_ANNOTATION(guarded_by(mutex))
#define TAMBLO_REQUIRES(...) TAMBLO_THREAD_ANNOTATION(requires_capability(__VA_ARGS__))
#define TAMBLO_EXCLUDES(...) TAMBLO_THREAD_ANNOTATION(locks_excluded(__VA_ARGS__))

namespace tamblo {

/// A standard mutex that the analysis follows.
template <typename Native> class TAMBLO_THREAD_ANNOTATION(capability("mutex")) AnnotatedMutex {
public:
    void lock() TAMBLO_THREAD_ANNOTATION(acquire_capability()) { native_.lock(); }
    void unlock() TAMBLO_THREAD_ANNOTATION(release_capability()) { native_.unlock(); }
    [[nodiscard]] bool try_lock() TAMBLO_THREAD_ANNOTATION(try_acquire_capability(true)) {
        return native_.try_lock();
    }
    /// For what the analysis cannot follow: a lock that is handed on.
    [[nodiscard]] Native& native() noexcept { return native_; }

private:
    Native native_;
};

using Mutex = AnnotatedMutex<std::mutex>;
using RecursiveMutex = AnnotatedMutex<std::recursive_mutex>;

/// Holds a mutex for a scope; may let it go and take it again in between.
template <typename Native> class TAMBLO_THREAD_ANNOTATION(scoped_lockable) AnnotatedLock {
public:
    explicit AnnotatedLock(AnnotatedMutex<Native>& mutex) TAMBLO_THREAD_ANNOTATION(acquire_capability(mutex))
        : lock_(mutex.native()) {}
    ~AnnotatedLock() TAMBLO_THREAD_ANNOTATION(release_capability()) = default;
    AnnotatedLock(const AnnotatedLock&) = delete;
    AnnotatedLock& operator=(const AnnotatedLock&) = delete;

    void lock() TAMBLO_THREAD_ANNOTATION(acquire_capability()) { lock_.lock(); }
    void unlock() TAMBLO_THREAD_ANNOTATION(release_capability()) { lock_.unlock(); }
    /// For a condition variable to wait with: on return the mutex is held again, as before.
    [[nodiscard]] std::unique_lock<Native>& forWaiting() noexcept { return lock_; }

private:
    std::unique_lock<Native> lock_;
};

using MutexLock = AnnotatedLock<std::mutex>;
using RecursiveMutexLock = AnnotatedLock<std::recursive_mutex>;

} // namespace tamblo
