// Seams between the model's parts: the libc interposers hand device calls to
// the device, whose script comes from the environment and whose scripted host
// writes each reply.
#pragma once

#include "VmsgDeviceModel.h"
#include "hcall/host/HcallHost.h"

namespace vmsgdev {

bool isDevicePath(const char* path);
bool isDeviceFd(int fd);  // lock-free: every close() in the process asks
int openDevice(int flags);
int deviceIoctl(int fd, unsigned long request, void* arg);
// Forgets the descriptor, then closes it with realClose and records the close.
int closeDevice(int fd, int (*realClose)(int));

// The script that VMSG_DEVICE_* variables describe; unset ones keep defaults.
VmsgDeviceScript scriptFromEnvironment();

// Writes the reply the script asks for into `out` (`capacity` bytes of
// guest-bound buffer); returns how many bytes it wrote from the start. `seed`
// varies the garbage; `failed` answers failureResult (the launch query: false).
uint32_t writeReply(const VmsgDeviceScript& script, const uint8_t* request, uint32_t length,
                    HcallLimits limits, uint8_t* out, uint32_t capacity, uint64_t seed,
                    bool failed);

}  // namespace vmsgdev
