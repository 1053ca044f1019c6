// The wire contract of the paravirtual message device /dev/kivvmsg: its path,
// its three ioctl requests and the connect argument. Shared by the guest client
// and by anything that stands in for the device.
#pragma once

#include <cstdint>

typedef uint32_t VmsgServiceId;

constexpr const char VMSG_DEVICE_PATH[] = "/dev/kivvmsg";

// The connect argument; every word little-endian, no padding. The client fills
// serviceId and zeroes the rest; the device fills the four out-words.
struct VmsgConnectArgs {
    uint32_t serviceId;
    uint32_t maxHostBoundSize;
    uint32_t maxGuestBoundSize;
    uint32_t spare;
    uint32_t guestBoundOffset;
};
static_assert(sizeof(VmsgConnectArgs) == 20, "the device reads and writes 20 bytes");

// Requests of type 'v' in the kernel's direction/size/type/number encoding.
constexpr unsigned long VMSG_IOC_CONNECT = 0xC0147601UL;   // _IOWR('v', 1, 20 bytes)
constexpr unsigned long VMSG_IOC_DISCONNECT = 0x7602UL;    // _IO('v', 2)
constexpr unsigned long VMSG_IOC_SEND_RECEIVE = 0x7603UL;  // _IO('v', 3)
