#pragma once

#include <mutex>

// Macros for clang's thread-safety analysis; empty for other compilers.
#if defined(__clang__)
#define TL_THREAD_ANNOTATION(x) __attribute__((x))
#else
#define TL_THREAD_ANNOTATION(x)
#endif
#define TL_CAPABILITY(x) TL_THREAD_ANNOTATION(capability(x))
#define TL_SCOPED_CAPABILITY TL_THREAD_ANNOTATION(scoped_lockable)
#define TL_GUARDED_BY(x) TL_THREAD_ANNOTATION(guarded_by(x))
#define TL_PT_GUARDED_BY(x) TL_THREAD_ANNOTATION(pt_guarded_by(x))
#define TL_REQUIRES(...) TL_THREAD_ANNOTATION(requires_capability(__VA_ARGS__))
#define TL_EXCLUDES(...) TL_THREAD_ANNOTATION(locks_excluded(__VA_ARGS__))
#define TL_ACQUIRE(...) TL_THREAD_ANNOTATION(acquire_capability(__VA_ARGS__))
#define TL_RELEASE(...) TL_THREAD_ANNOTATION(release_capability(__VA_ARGS__))
#define TL_ACQUIRED_BEFORE(...) TL_THREAD_ANNOTATION(acquired_before(__VA_ARGS__))
#define TL_NO_THREAD_SAFETY_ANALYSIS TL_THREAD_ANNOTATION(no_thread_safety_analysis)

namespace platform {

// A std::mutex known to the analysis. Works with std::condition_variable_any.
class TL_CAPABILITY("mutex") Mutex {
 public:
  void lock() TL_ACQUIRE() { _mutex.lock(); }
  void unlock() TL_RELEASE() { _mutex.unlock(); }

 private:
  std::mutex _mutex;
};

// A fair mutex: a waiting thread gets it before the thread that has just released it and locks it
// again, which would usually win with std::mutex.
class TL_CAPABILITY("mutex") FairMutex {
 public:
  void lock() TL_ACQUIRE() {
    std::lock_guard turn(_turn);
    _mutex.lock();
  }
  void unlock() TL_RELEASE() { _mutex.unlock(); }

 private:
  std::mutex _turn;  // held by the thread next in line
  std::mutex _mutex;
};

template <typename AnyMutex>
class TL_SCOPED_CAPABILITY MutexLock {
 public:
  explicit MutexLock(AnyMutex& mutex) TL_ACQUIRE(mutex) : _mutex(mutex) { _mutex.lock(); }
  ~MutexLock() TL_RELEASE() { _mutex.unlock(); }
  MutexLock(const MutexLock&) = delete;
  MutexLock& operator=(const MutexLock&) = delete;

 private:
  AnyMutex& _mutex;
};

}  // namespace platform
