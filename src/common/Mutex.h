// A mutex that clang's thread-safety analysis understands, so that "guarded by"
// is checked at compile time instead of being a comment.
//
// See https://clang.llvm.org/docs/ThreadSafetyAnalysis.html
#pragma once

#include <mutex>

#if defined(__clang__)
#define HY_THREAD_ANNOTATION(x) __attribute__((x))
#else
#define HY_THREAD_ANNOTATION(x)
#endif

#define HY_GUARDED_BY(mutex) HY_THREAD_ANNOTATION(guarded_by(mutex))
#define HY_REQUIRES(mutex) HY_THREAD_ANNOTATION(requires_capability(mutex))
#define HY_EXCLUDES(mutex) HY_THREAD_ANNOTATION(locks_excluded(mutex))

namespace halyard {

class HY_THREAD_ANNOTATION(capability("mutex")) Mutex {
public:
    void lock() HY_THREAD_ANNOTATION(acquire_capability()) { mutex_.lock(); }
    void unlock() HY_THREAD_ANNOTATION(release_capability()) { mutex_.unlock(); }

private:
    std::mutex mutex_;
};

class HY_THREAD_ANNOTATION(scoped_lockable) MutexLock {
public:
    explicit MutexLock(Mutex& mutex) HY_THREAD_ANNOTATION(acquire_capability(mutex))
        : mutex_(mutex) {
        mutex_.lock();
    }
    ~MutexLock() HY_THREAD_ANNOTATION(release_capability()) { mutex_.unlock(); }
    MutexLock(const MutexLock&) = delete;
    MutexLock& operator=(const MutexLock&) = delete;

private:
    Mutex& mutex_;
};

} // namespace halyard
