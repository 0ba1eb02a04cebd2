#pragma once

#include <condition_variable>
#include <mutex>
#include <shared_mutex>

/// Clang checks these attributes (-Wthread-safety); other compilers ignore them. A thread must hold the mutex while it
/// uses a member that is GUARDED_BY it, and when it calls a function that REQUIRES it.
#ifdef __clang__
#define THREAD_SAFETY(...) __attribute__((__VA_ARGS__))
#else
#define THREAD_SAFETY(...)
#endif
#define GUARDED_BY(mutex) THREAD_SAFETY(guarded_by(mutex))
#define REQUIRES(...) THREAD_SAFETY(requires_capability(__VA_ARGS__))

namespace platform {

/// The number of mutexes of the classes below that this thread holds. A thread that holds one must not call
/// `Queue::sync`.
inline constinit thread_local unsigned heldMutexes = 0;

/// A lock for the little state that no queue guards. A thread holds it for a few lines, in which it neither blocks nor
/// runs a callback. Not recursive.
class THREAD_SAFETY(capability("mutex")) Mutex {
public:
    Mutex() = default;
    Mutex(const Mutex&) = delete;
    Mutex& operator=(const Mutex&) = delete;

    void lock() THREAD_SAFETY(acquire_capability())
    {
        _mutex.lock();
        ++heldMutexes;
    }
    void unlock() THREAD_SAFETY(release_capability())
    {
        --heldMutexes;
        _mutex.unlock();
    }

private:
    friend class Condition;
    std::mutex _mutex;
};

/// A Mutex that one writer or several readers can hold.
class THREAD_SAFETY(capability("mutex")) SharedMutex {
public:
    SharedMutex() = default;
    SharedMutex(const SharedMutex&) = delete;
    SharedMutex& operator=(const SharedMutex&) = delete;

    void lock() THREAD_SAFETY(acquire_capability())
    {
        _mutex.lock();
        ++heldMutexes;
    }
    void unlock() THREAD_SAFETY(release_capability())
    {
        --heldMutexes;
        _mutex.unlock();
    }
    void lock_shared() THREAD_SAFETY(acquire_shared_capability())
    {
        _mutex.lock_shared();
        ++heldMutexes;
    }
    void unlock_shared() THREAD_SAFETY(release_shared_capability())
    {
        --heldMutexes;
        _mutex.unlock_shared();
    }

private:
    std::shared_mutex _mutex;
};

/// Holds a mutex exclusively from its construction to its destruction.
template <class M = Mutex> class THREAD_SAFETY(scoped_lockable) MutexLock {
public:
    explicit MutexLock(M& mutex) THREAD_SAFETY(acquire_capability(mutex)) : _mutex(mutex) { _mutex.lock(); }
    ~MutexLock() THREAD_SAFETY(release_capability()) { _mutex.unlock(); }
    MutexLock(const MutexLock&) = delete;
    MutexLock& operator=(const MutexLock&) = delete;

private:
    M& _mutex;
};

/// Holds a mutex as a reader from its construction to its destruction.
class THREAD_SAFETY(scoped_lockable) SharedMutexLock {
public:
    explicit SharedMutexLock(SharedMutex& mutex) THREAD_SAFETY(acquire_shared_capability(mutex)) : _mutex(mutex)
    {
        _mutex.lock_shared();
    }
    ~SharedMutexLock() THREAD_SAFETY(release_generic_capability()) { _mutex.unlock_shared(); }
    SharedMutexLock(const SharedMutexLock&) = delete;
    SharedMutexLock& operator=(const SharedMutexLock&) = delete;

private:
    SharedMutex& _mutex;
};

/// A condition variable for state that a mutex guards. wait() may return without a notification: call it in a loop that
/// checks the state.
class Condition {
public:
    void wait(Mutex& mutex) REQUIRES(mutex)
    {
        std::unique_lock lock(mutex._mutex, std::adopt_lock);
        _condition.wait(lock);
        lock.release();
    }
    void notifyOne() { _condition.notify_one(); }

private:
    std::condition_variable _condition;
};

} // namespace platform
