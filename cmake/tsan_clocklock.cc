// For builds with ThreadSanitizer. The runtime of g++ 12 does not know pthread_mutex_clocklock, by which std::timed_mutex
// waits on the steady clock: it would miss the lock and report its unlock. This one waits by a function that it knows.
#include <pthread.h>
#include <time.h>

extern "C" int pthread_mutex_clocklock(pthread_mutex_t* mutex, clockid_t clock, const timespec* until) noexcept {
  constexpr long kNanosecondsPerSecond = 1'000'000'000;
  timespec now{};
  timespec deadline{};
  clock_gettime(clock, &now);
  clock_gettime(CLOCK_REALTIME, &deadline);
  deadline.tv_sec += until->tv_sec - now.tv_sec;
  deadline.tv_nsec += until->tv_nsec - now.tv_nsec;
  if (deadline.tv_nsec < 0) {
    deadline.tv_nsec += kNanosecondsPerSecond;
    --deadline.tv_sec;
  } else if (deadline.tv_nsec >= kNanosecondsPerSecond) {
    deadline.tv_nsec -= kNanosecondsPerSecond;
    ++deadline.tv_sec;
  }
  return pthread_mutex_timedlock(mutex, &deadline);
}
