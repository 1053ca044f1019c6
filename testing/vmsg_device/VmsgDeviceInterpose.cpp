// The C library entry points through which the device appears. Each one
// hands the device path or a device descriptor to the model and passes every
// other call to the next definition (the C library, or a sanitizer's
// interceptor in front of it) unchanged.
#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <atomic>
#include <cstdarg>

#include "VmsgDeviceInternal.h"

#define VMSG_INTERPOSE extern "C" __attribute__((visibility("default")))

namespace {

// Resolves the next definition of a symbol once; later calls read the cached
// pointer. A racing first lookup resolves the same address twice, harmlessly.
template <typename Fn>
class NextSymbol {
  public:
    explicit NextSymbol(const char* name) : mName(name) {}
    Fn get() {
        Fn fn = mFn.load(std::memory_order_acquire);
        if (fn == nullptr) {
            fn = reinterpret_cast<Fn>(dlsym(RTLD_NEXT, mName));
            mFn.store(fn, std::memory_order_release);
        }
        return fn;
    }

  private:
    const char* mName;
    std::atomic<Fn> mFn{nullptr};
};

using OpenFn = int (*)(const char*, int, ...);
using Open2Fn = int (*)(const char*, int);
using OpenAtFn = int (*)(int, const char*, int, ...);
using OpenAt2Fn = int (*)(int, const char*, int);
using IoctlFn = int (*)(int, unsigned long, ...);
using CloseFn = int (*)(int);

NextSymbol<OpenFn> nextOpen("open");
NextSymbol<OpenFn> nextOpen64("open64");
NextSymbol<Open2Fn> nextOpen2("__open_2");
NextSymbol<Open2Fn> nextOpen64_2("__open64_2");
NextSymbol<OpenAtFn> nextOpenAt("openat");
NextSymbol<OpenAtFn> nextOpenAt64("openat64");
NextSymbol<OpenAt2Fn> nextOpenAt2("__openat_2");
NextSymbol<OpenAt2Fn> nextOpenAt64_2("__openat64_2");
NextSymbol<IoctlFn> nextIoctl("ioctl");
NextSymbol<CloseFn> nextClose("close");

bool needsMode(int flags) { return (flags & O_CREAT) != 0 || (flags & O_TMPFILE) == O_TMPFILE; }

int missing() {
    errno = ENOSYS;
    return -1;
}

// The device path is absolute, so the directory descriptor of openat never
// changes its meaning.
int openAny(NextSymbol<OpenFn>& next, const char* path, int flags, mode_t mode) {
    if (vmsgdev::isDevicePath(path)) return vmsgdev::openDevice(flags);
    OpenFn fn = next.get();
    return fn ? fn(path, flags, mode) : missing();
}

int openAtAny(NextSymbol<OpenAtFn>& next, int dirfd, const char* path, int flags, mode_t mode) {
    if (vmsgdev::isDevicePath(path)) return vmsgdev::openDevice(flags);
    OpenAtFn fn = next.get();
    return fn ? fn(dirfd, path, flags, mode) : missing();
}

int open2Any(NextSymbol<Open2Fn>& next, const char* path, int flags) {
    if (vmsgdev::isDevicePath(path)) return vmsgdev::openDevice(flags);
    Open2Fn fn = next.get();
    return fn ? fn(path, flags) : missing();
}

int openAt2Any(NextSymbol<OpenAt2Fn>& next, int dirfd, const char* path, int flags) {
    if (vmsgdev::isDevicePath(path)) return vmsgdev::openDevice(flags);
    OpenAt2Fn fn = next.get();
    return fn ? fn(dirfd, path, flags) : missing();
}

int realClose(int fd) {
    CloseFn fn = nextClose.get();
    return fn ? fn(fd) : missing();
}

}  // namespace

// The optional mode argument is read only when the flags say it was passed.
#define VMSG_MODE_ARG(flags, mode) \
    mode_t mode = 0;               \
    if (needsMode(flags)) {        \
        va_list ap;                \
        va_start(ap, flags);       \
        mode = va_arg(ap, mode_t); \
        va_end(ap);                \
    }

VMSG_INTERPOSE int open(const char* path, int flags, ...) {
    VMSG_MODE_ARG(flags, mode);
    return openAny(nextOpen, path, flags, mode);
}

VMSG_INTERPOSE int open64(const char* path, int flags, ...) {
    VMSG_MODE_ARG(flags, mode);
    return openAny(nextOpen64, path, flags, mode);
}

VMSG_INTERPOSE int openat(int dirfd, const char* path, int flags, ...) {
    VMSG_MODE_ARG(flags, mode);
    return openAtAny(nextOpenAt, dirfd, path, flags, mode);
}

VMSG_INTERPOSE int openat64(int dirfd, const char* path, int flags, ...) {
    VMSG_MODE_ARG(flags, mode);
    return openAtAny(nextOpenAt64, dirfd, path, flags, mode);
}

VMSG_INTERPOSE int __open_2(const char* path, int flags) {
    return open2Any(nextOpen2, path, flags);
}

VMSG_INTERPOSE int __open64_2(const char* path, int flags) {
    return open2Any(nextOpen64_2, path, flags);
}

VMSG_INTERPOSE int __openat_2(int dirfd, const char* path, int flags) {
    return openAt2Any(nextOpenAt2, dirfd, path, flags);
}

VMSG_INTERPOSE int __openat64_2(int dirfd, const char* path, int flags) {
    return openAt2Any(nextOpenAt64_2, dirfd, path, flags);
}

// Every ioctl request takes at most one argument, passed on as a pointer-sized
// word as the C library itself does.
VMSG_INTERPOSE int ioctl(int fd, unsigned long request, ...) noexcept {
    va_list ap;
    va_start(ap, request);
    void* arg = va_arg(ap, void*);
    va_end(ap);
    if (vmsgdev::isDeviceFd(fd)) return vmsgdev::deviceIoctl(fd, request, arg);
    IoctlFn fn = nextIoctl.get();
    return fn ? fn(fd, request, arg) : missing();
}

VMSG_INTERPOSE int close(int fd) {
    if (vmsgdev::isDeviceFd(fd)) return vmsgdev::closeDevice(fd, realClose);
    return realClose(fd);
}
