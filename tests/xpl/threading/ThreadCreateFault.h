// Replaces pthread_create: while a ThreadCreateFault is in scope, the first
// `succeedFirst` creations go through and the rest fail with EAGAIN, as at the
// system's thread limit. Include it in exactly one file of a test program.
#pragma once

#include <dlfcn.h>
#include <pthread.h>

#include <atomic>
#include <cerrno>

namespace threadfault {
inline std::atomic<int> allowed{-1};  // below 0: no fault
inline std::atomic<int> attempts{0};
}  // namespace threadfault

extern "C" int pthread_create(pthread_t* thread, const pthread_attr_t* attr, void* (*entry)(void*),
                              void* arg) {
    static const auto real =
        reinterpret_cast<decltype(&pthread_create)>(dlsym(RTLD_NEXT, __func__));
    threadfault::attempts.fetch_add(1);
    int left = threadfault::allowed.load();
    while (left >= 0) {
        if (left == 0) return EAGAIN;
        if (threadfault::allowed.compare_exchange_weak(left, left - 1)) break;
    }
    return real(thread, attr, entry, arg);
}

struct ThreadCreateFault {
    explicit ThreadCreateFault(int succeedFirst) { threadfault::allowed.store(succeedFirst); }
    ~ThreadCreateFault() { threadfault::allowed.store(-1); }
};

inline int threadCreateAttempts() { return threadfault::attempts.load(); }
