// Stands in for a process that has run out of threads: this program's
// pthread_create is replaced by one that, while a ThreadCreateFault is in
// scope, lets a given number of creations through and then fails the rest
// with EAGAIN, as the system does at its thread limit. It also counts every
// creation. Include it in exactly one file of a test program.
#pragma once

#include <dlfcn.h>
#include <pthread.h>

#include <atomic>
#include <cerrno>

namespace threadfault {
// Creations still allowed before failures begin; below 0, no fault.
inline std::atomic<int> allowed{-1};
inline std::atomic<int> attempts{0};
}  // namespace threadfault

extern "C" int pthread_create(pthread_t* thread, const pthread_attr_t* attr, void* (*entry)(void*),
                              void* arg) {
    using Create = int (*)(pthread_t*, const pthread_attr_t*, void* (*)(void*), void*);
    static const Create real = reinterpret_cast<Create>(dlsym(RTLD_NEXT, "pthread_create"));
    threadfault::attempts.fetch_add(1);
    int left = threadfault::allowed.load();
    while (left >= 0) {
        if (left == 0) return EAGAIN;
        if (threadfault::allowed.compare_exchange_weak(left, left - 1)) break;
    }
    return real(thread, attr, entry, arg);
}

class ThreadCreateFault {
  public:
    explicit ThreadCreateFault(int succeedFirst) { threadfault::allowed.store(succeedFirst); }
    ~ThreadCreateFault() { threadfault::allowed.store(-1); }
    ThreadCreateFault(const ThreadCreateFault&) = delete;
    ThreadCreateFault& operator=(const ThreadCreateFault&) = delete;
};

inline int threadCreateAttempts() { return threadfault::attempts.load(); }
