// Seams between the model's parts: the libc interposers hand device calls to
// the device, which reads its start-up script from the environment.
#pragma once

#include <string>

#include "VmsgDeviceModel.h"

namespace vmsgdev {

bool isDevicePath(const char* path);
// Lock-free, since every close() in the process asks it.
bool isDeviceFd(int fd);

// open() of the device path: a new memfd, or -1 with errno set.
int openDevice(int flags);
int deviceIoctl(int fd, unsigned long request, void* arg);
// Forgets the descriptor, then closes it with realClose and records the close.
int closeDevice(int fd, int (*realClose)(int));

// The script that VMSG_DEVICE_* variables describe; unset ones keep defaults.
// Unreadable values are reported on standard error and ignored.
VmsgDeviceScript scriptFromEnvironment();

}  // namespace vmsgdev
