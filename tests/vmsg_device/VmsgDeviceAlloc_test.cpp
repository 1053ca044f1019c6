// The host must not allocate on the exchange path when it keeps no record, so
// that a benchmark counting heap allocations per host call sees only the
// guest's. This program replaces the global allocator to count them.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <new>

#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallCatalogue.h"
#include "vmsg/guest/VmsgDevice.h"

namespace {
thread_local long tAllocations = 0;
}

void* operator new(size_t size) {
    ++tAllocations;
    if (void* p = std::malloc(size ? size : 1)) return p;
    throw std::bad_alloc();
}
void operator delete(void* p) noexcept { std::free(p); }
void operator delete(void* p, size_t) noexcept { std::free(p); }

namespace {

TEST(VmsgDeviceAlloc, SendReceive_WhenNotRecording_AllocatesNothing) {
    VmsgDeviceScript script;
    script.record = false;
    vmsgDeviceConfigure(script);
    const int fd = open(VMSG_DEVICE_PATH, O_RDWR);
    ASSERT_GE(fd, 0);
    VmsgConnectArgs args{hcall::kServiceId, 0, 0, 0, 0};
    ASSERT_EQ(ioctl(fd, VMSG_IOC_CONNECT, &args), 0);
    const size_t length = args.guestBoundOffset + args.maxGuestBoundSize;
    void* map = mmap(nullptr, length, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
    ASSERT_NE(map, MAP_FAILED);
    // hcallGetPropsRpc with a 16-byte buffer: the longest reply path.
    const uint8_t request[] = {1, 0, 0, 0, 20, 0, 0, 0, 16, 0, 0, 0, 16, 0, 0, 0, 4, 0, 0, 0};
    std::memcpy(map, request, sizeof request);

    const long before = tAllocations;
    for (int i = 0; i < 100; ++i) ASSERT_EQ(ioctl(fd, VMSG_IOC_SEND_RECEIVE), 0);
    EXPECT_EQ(tAllocations - before, 0) << "the host allocated while serving exchanges";

    munmap(map, length);
    close(fd);
    vmsgDeviceReset();
}

}  // namespace
