// A mutex for std::lock_guard. The library's own throws when it cannot be had, and what throws is
// linked into a program that never does.
#pragma once

#include <pthread.h>

namespace kivd {

class mutex {
 public:
    constexpr mutex() = default;
    mutex(const mutex&) = delete;
    mutex& operator=(const mutex&) = delete;

    void lock() { (void)pthread_mutex_lock(&mutex_); }
    void unlock() { (void)pthread_mutex_unlock(&mutex_); }

 private:
    pthread_mutex_t mutex_ = PTHREAD_MUTEX_INITIALIZER;
};

}  // namespace kivd
