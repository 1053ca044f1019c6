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

// Calls the next definition with `args`, or fails with ENOSYS without one.
template <typename Fn, typename... Args>
int callNext(NextSymbol<Fn>& next, Args... args) {
    Fn fn = next.get();
    if (fn != nullptr) return fn(args...);
    errno = ENOSYS;
    return -1;
}

// The device path is absolute, so the directory descriptor of openat never
// changes its meaning.
template <typename Fn, typename... Args>
int openVia(NextSymbol<Fn>& next, const char* path, int flags, Args... args) {
    return vmsgdev::isDevicePath(path) ? vmsgdev::openDevice(flags) : callNext(next, args...);
}

}  // namespace

// The variants with an optional mode read it only when the flags say it was
// passed.
#define VMSG_OPEN(name, next, params, ...)                                \
    VMSG_INTERPOSE int name params {                                      \
        mode_t mode = 0;                                                  \
        if ((flags & O_CREAT) != 0 || (flags & O_TMPFILE) == O_TMPFILE) { \
            va_list ap;                                                   \
            va_start(ap, flags);                                          \
            mode = va_arg(ap, mode_t);                                    \
            va_end(ap);                                                   \
        }                                                                 \
        return openVia(next, path, flags, __VA_ARGS__, mode);             \
    }
VMSG_OPEN(open, nextOpen, (const char* path, int flags, ...), path, flags)
VMSG_OPEN(open64, nextOpen64, (const char* path, int flags, ...), path, flags)
VMSG_OPEN(openat, nextOpenAt, (int dirfd, const char* path, int flags, ...), dirfd, path, flags)
VMSG_OPEN(openat64, nextOpenAt64, (int dirfd, const char* path, int flags, ...), dirfd, path, flags)

// clang-format off
VMSG_INTERPOSE int __open_2(const char* path, int flags) { return openVia(nextOpen2, path, flags, path, flags); }
VMSG_INTERPOSE int __open64_2(const char* path, int flags) { return openVia(nextOpen64_2, path, flags, path, flags); }
VMSG_INTERPOSE int __openat_2(int dirfd, const char* path, int flags) { return openVia(nextOpenAt2, path, flags, dirfd, path, flags); }
VMSG_INTERPOSE int __openat64_2(int dirfd, const char* path, int flags) { return openVia(nextOpenAt64_2, path, flags, dirfd, path, flags); }
// clang-format on

// Every ioctl request takes at most one argument, passed on as a pointer-sized
// word as the C library itself does.
VMSG_INTERPOSE int ioctl(int fd, unsigned long request, ...) noexcept {
    va_list ap;
    va_start(ap, request);
    void* arg = va_arg(ap, void*);
    va_end(ap);
    if (vmsgdev::isDeviceFd(fd)) return vmsgdev::deviceIoctl(fd, request, arg);
    return callNext(nextIoctl, fd, request, arg);
}

VMSG_INTERPOSE int close(int fd) {
    if (vmsgdev::isDeviceFd(fd))
        return vmsgdev::closeDevice(fd, [](int n) { return callNext(nextClose, n); });
    return callNext(nextClose, fd);
}
