#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>
#include <shared_mutex>

// What a mutex guards is said with these, and clang holds the code to it (`./dev lint --locks`). To
// other compilers they are nothing.
#ifdef __clang__
#define APPSYNC_THREAD_ANNOTATION(annotation) __attribute__((annotation))
#else
#define APPSYNC_THREAD_ANNOTATION(annotation)
#endif

/// Of a member: it is touched only with the mutex held.
#define APPSYNC_GUARDED_BY(mutex) APPSYNC_THREAD_ANNOTATION(guarded_by(mutex))
/// Of a function: it is called with the mutex held.
#define APPSYNC_REQUIRES(mutex) APPSYNC_THREAD_ANNOTATION(requires_capability(mutex))
/// Of a function: it is not called with the mutex held, since it takes it itself.
#define APPSYNC_EXCLUDES(mutex) APPSYNC_THREAD_ANNOTATION(locks_excluded(mutex))
/// Of a function that clang cannot follow; a comment says why, and what makes it right.
#define APPSYNC_NOT_ANALYSED APPSYNC_THREAD_ANNOTATION(no_thread_safety_analysis)
/// Of a class that guards members.
#define APPSYNC_CAPABILITY(kind) APPSYNC_THREAD_ANNOTATION(capability(kind))

// For the classes below only.
#define APPSYNC_SCOPED_CAPABILITY APPSYNC_THREAD_ANNOTATION(scoped_lockable)
#define APPSYNC_ACQUIRE(...) APPSYNC_THREAD_ANNOTATION(acquire_capability(__VA_ARGS__))
#define APPSYNC_ACQUIRE_SHARED(...) \
  APPSYNC_THREAD_ANNOTATION(acquire_shared_capability(__VA_ARGS__))
#define APPSYNC_RELEASE(...) APPSYNC_THREAD_ANNOTATION(release_capability(__VA_ARGS__))
#define APPSYNC_RELEASE_SHARED(...) \
  APPSYNC_THREAD_ANNOTATION(release_shared_capability(__VA_ARGS__))

namespace appsync {

/// Held by one thread at a time, which must not ask for it again. Held through a Lock.
class APPSYNC_CAPABILITY("mutex") Mutex {
 public:
  void lock() APPSYNC_ACQUIRE() { mutex_.lock(); }
  void unlock() APPSYNC_RELEASE() { mutex_.unlock(); }

 private:
  friend class Condition;

  std::mutex mutex_;
};

/// Held by one thread through a Lock, or by any number through a SharedLock each.
class APPSYNC_CAPABILITY("mutex") SharedMutex {
 public:
  void lock() APPSYNC_ACQUIRE() { mutex_.lock(); }
  void unlock() APPSYNC_RELEASE() { mutex_.unlock(); }
  void lockShared() APPSYNC_ACQUIRE_SHARED() { mutex_.lock_shared(); }
  void unlockShared() APPSYNC_RELEASE_SHARED() { mutex_.unlock_shared(); }

 private:
  std::shared_mutex mutex_;
};

/// Holds a mutex for as long as it lives.
template <typename Lockable>
class APPSYNC_SCOPED_CAPABILITY Lock {
 public:
  explicit Lock(Lockable& mutex) APPSYNC_ACQUIRE(mutex) : mutex_(mutex) { mutex_.lock(); }
  ~Lock() APPSYNC_RELEASE() { mutex_.unlock(); }
  Lock(const Lock&) = delete;
  Lock& operator=(const Lock&) = delete;

 private:
  Lockable& mutex_;
};

class APPSYNC_SCOPED_CAPABILITY SharedLock {
 public:
  explicit SharedLock(SharedMutex& mutex) APPSYNC_ACQUIRE_SHARED(mutex) : mutex_(mutex) {
    mutex_.lockShared();
  }
  ~SharedLock() APPSYNC_RELEASE() { mutex_.unlockShared(); }
  SharedLock(const SharedLock&) = delete;
  SharedLock& operator=(const SharedLock&) = delete;

 private:
  SharedMutex& mutex_;
};

/// Lets go of a mutex that is held, and takes it again at its end: for a call out.
class APPSYNC_SCOPED_CAPABILITY Unlock {
 public:
  explicit Unlock(Mutex& mutex) APPSYNC_RELEASE(mutex) : mutex_(mutex) { mutex_.unlock(); }
  ~Unlock() APPSYNC_RELEASE() { mutex_.lock(); }  // "releases" what the constructor let go of
  Unlock(const Unlock&) = delete;
  Unlock& operator=(const Unlock&) = delete;

 private:
  Mutex& mutex_;
};

/// Where threads wait for a change of what a mutex guards. A wait lets go of the mutex meanwhile
/// and has it again when it returns, which may be without any notification: it belongs into a loop
/// that looks at what it waits for.
class Condition {
 public:
  void wait(Mutex& mutex) APPSYNC_REQUIRES(mutex) {
    std::unique_lock lock(mutex.mutex_, std::adopt_lock);
    condition_.wait(lock);
    lock.release();
  }

  /// False when the time has come.
  bool waitUntil(Mutex& mutex, std::chrono::steady_clock::time_point time) APPSYNC_REQUIRES(mutex) {
    std::unique_lock lock(mutex.mutex_, std::adopt_lock);
    const std::cv_status status = condition_.wait_until(lock, time);
    lock.release();
    return status == std::cv_status::no_timeout;
  }

  void notifyOne() noexcept { condition_.notify_one(); }
  void notifyAll() noexcept { condition_.notify_all(); }

 private:
  std::condition_variable condition_;
};

}  // namespace appsync
