// Starting the library's own detached threads without exceptions: a thread
// that cannot be created is reported as an error number.
#pragma once

#include <pthread.h>

// Returns 0 or the error number of pthread_create.
inline int xthrStartDetached(void* (*entry)(void*), void* arg) {
    pthread_t thread;
    int err = pthread_create(&thread, nullptr, entry, arg);
    if (err == 0) pthread_detach(thread);
    return err;
}
