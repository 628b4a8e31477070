#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>

// Says in code which lock guards what; clang checks it (-Wthread-safety, part of the static checks), other compilers
// ignore it. A field that a mutex guards is declared
//
//   int _count GUARDED_BY(_mutex) = 0;
//
// and a function that is called with the lock held ends in REQUIRES(_mutex). The analysis does not look into lambdas:
// wait in a loop rather than with a predicate, and let a lambda that is called under the lock take what it needs by
// argument.
#if defined(__clang__)
#define ORVANTA_THREAD_ANNOTATION(x) __attribute__((x))
#else
#define ORVANTA_THREAD_ANNOTATION(x)
#endif
#define CAPABILITY(name) ORVANTA_THREAD_ANNOTATION(capability(name))
#define SCOPED_CAPABILITY ORVANTA_THREAD_ANNOTATION(scoped_lockable)
#define GUARDED_BY(mutex) ORVANTA_THREAD_ANNOTATION(guarded_by(mutex))
#define POINTEE_GUARDED_BY(mutex) ORVANTA_THREAD_ANNOTATION(pt_guarded_by(mutex))
#define REQUIRES(...) ORVANTA_THREAD_ANNOTATION(requires_capability(__VA_ARGS__))
#define EXCLUDES(...) ORVANTA_THREAD_ANNOTATION(locks_excluded(__VA_ARGS__))
#define ACQUIRE(...) ORVANTA_THREAD_ANNOTATION(acquire_capability(__VA_ARGS__))
#define RELEASE(...) ORVANTA_THREAD_ANNOTATION(release_capability(__VA_ARGS__))
#define TRY_ACQUIRE(...) ORVANTA_THREAD_ANNOTATION(try_acquire_capability(__VA_ARGS__))
#define RETURN_CAPABILITY(mutex) ORVANTA_THREAD_ANNOTATION(lock_returned(mutex))
#define NO_THREAD_SAFETY_ANALYSIS ORVANTA_THREAD_ANNOTATION(no_thread_safety_analysis)

namespace orvanta::platform {

class CAPABILITY("mutex") Mutex {
 public:
  void lock() ACQUIRE() { _mutex.lock(); }
  void unlock() RELEASE() { _mutex.unlock(); }
  bool try_lock() TRY_ACQUIRE(true) { return _mutex.try_lock(); }

 private:
  friend class MutexLock;
  std::mutex _mutex;
};

class CAPABILITY("mutex") RecursiveMutex {
 public:
  void lock() ACQUIRE() { _mutex.lock(); }
  void unlock() RELEASE() { _mutex.unlock(); }
  bool try_lock() TRY_ACQUIRE(true) { return _mutex.try_lock(); }

 private:
  std::recursive_mutex _mutex;
};

// Holds a mutex from here to the end of the block; may release it in between.
class SCOPED_CAPABILITY MutexLock {
 public:
  explicit MutexLock(Mutex& mutex) ACQUIRE(mutex) : _lock(mutex._mutex) {}
  MutexLock(const MutexLock&) = delete;
  MutexLock& operator=(const MutexLock&) = delete;
  ~MutexLock() RELEASE() = default;

  void lock() ACQUIRE() { _lock.lock(); }
  void unlock() RELEASE() { _lock.unlock(); }

 private:
  friend class Condition;
  std::unique_lock<std::mutex> _lock;
};

// Holds a recursive mutex from here to the end of the block.
class SCOPED_CAPABILITY RecursiveMutexLock {
 public:
  explicit RecursiveMutexLock(RecursiveMutex& mutex) ACQUIRE(mutex) : _mutex(mutex) { _mutex.lock(); }
  RecursiveMutexLock(const RecursiveMutexLock&) = delete;
  RecursiveMutexLock& operator=(const RecursiveMutexLock&) = delete;
  ~RecursiveMutexLock() RELEASE() { _mutex.unlock(); }

 private:
  RecursiveMutex& _mutex;
};

// A condition variable for a Mutex. Wakes also without cause: wait in a loop.
class Condition {
 public:
  void wait(MutexLock& lock) { _condition.wait(lock._lock); }
  // Return false when the time came before a notification.
  template <class Clock, class Duration>
  bool waitUntil(MutexLock& lock, std::chrono::time_point<Clock, Duration> time) {
    return _condition.wait_until(lock._lock, time) == std::cv_status::no_timeout;
  }
  template <class Rep, class Period>
  bool waitFor(MutexLock& lock, std::chrono::duration<Rep, Period> time) {
    return _condition.wait_for(lock._lock, time) == std::cv_status::no_timeout;
  }
  void notifyOne() noexcept { _condition.notify_one(); }
  void notifyAll() noexcept { _condition.notify_all(); }

 private:
  std::condition_variable _condition;
};

}  // namespace orvanta::platform
