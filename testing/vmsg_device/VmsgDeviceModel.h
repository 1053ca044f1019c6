// A stand-in for the paravirtual message device "/dev/kivvmsg" and the host
// behind it. Linked into a test program (vmsg_device_objects) or preloaded
// (libvmsg_device.so), it interposes open/openat, ioctl and close: the device
// path opens a memfd, so the client maps real shared memory, and the device's
// requests are served by an in-process host built on hcall/host/HcallHost.h.
// Every other path and descriptor passes through untouched. A preloaded copy
// takes its script from the VMSG_DEVICE_* variables that README.md lists.
// All functions are thread-safe.
#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <vector>

#define VMSG_DEVICE_API __attribute__((visibility("default")))

// How the host writes a reply into the guest-bound buffer.
enum class VmsgDeviceReplyMode {
    Scripted,  // the proper reply: filled data, then the 4-byte result
    Short,     // only the first shortReplyBytes bytes of the proper reply
    Garbage,   // the whole guest-bound buffer filled with a pseudo-random pattern
    Raw,       // exactly rawReply, whatever the operation
};

// What the device and the host answer; README.md tells each setting's
// environment variable. Settings of the connection take effect at the next
// CONNECT, the others at the next request.
struct VmsgDeviceScript {
    // Out-words of CONNECT. guestBoundOffset 0 means "after the host-bound
    // buffer, page-rounded". A layout beyond 256 MiB (a 32-bit sum that wraps,
    // say) is answered but not backed: SEND_RECEIVE on it fails with EFAULT.
    uint32_t hostBoundCapacity = 65536;
    uint32_t guestBoundCapacity = 65536;
    uint32_t spare = 0;
    uint32_t guestBoundOffset = 0;

    // Faults, each an errno value, 0 for none. Service ids other than "hcal"
    // are always refused with ECONNREFUSED.
    int openErrno = 0;
    int connectErrno = 0;
    int sendErrno = 0;       // the request is still recorded
    bool mmapFails = false;  // the memfd is sealed, so the client's mmap fails (EPERM)

    // Answers: results by operation code, else defaultResult (operation 24:
    // launchAllowed). A malformed request gets -22 (XERR_INVAL).
    std::map<uint32_t, int32_t> results;
    int32_t defaultResult = 0;
    bool launchAllowed = true;

    // Filled data; a text is NUL-padded, or cut to the buffer and unterminated.
    std::string propsText;   // operation 1, the char * buffer
    int32_t propsValue = 0;  // operation 1, the i32 *
    uint64_t timeValue = 0;  // operation 5, the u64 *
    std::string timeText;    // operation 5, the char * buffer

    // Pause inside SEND_RECEIVE before the reply is written.
    uint32_t delayUs = 0;
    // A host slow and unreliable at random, reproducibly: the generator is
    // seeded with randomSeed whenever a script is configured.
    uint32_t delayJitterUs = 0;
    uint32_t failurePerMille = 0;
    int32_t failureResult = 5;  // XERR_IO
    uint32_t sendFailurePerMille = 0;
    uint64_t randomSeed = 1;

    VmsgDeviceReplyMode replyMode = VmsgDeviceReplyMode::Scripted;
    uint32_t shortReplyBytes = 0;
    std::vector<uint8_t> rawReply;

    std::string tracePath;  // a line per exchange appended to this file
    bool printCalls = false;
    // Keep exchanges and events. Off, the host allocates nothing per exchange.
    bool record = true;
};

// One SEND_RECEIVE as the host saw it.
struct VmsgDeviceExchange {
    uint32_t opCode = 0;           // first word of the request (0 if unreadable)
    std::vector<uint8_t> request;  // raw request bytes: totalLength of them, cut to the capacity
    std::string text;              // decoded call, e.g. hcallOnLocaleChangedRpc("en-US") -> 0
    bool wellFormed = false;       // the framing matched the catalogue exactly
    std::string problem;           // why not, when not
    std::vector<uint8_t> reply;    // bytes the host wrote into the guest-bound buffer
    int sendErrno = 0;             // nonzero: the request was failed with this errno
    bool overlapped = false;  // another exchange was in flight, or the request changed under it
};

enum class VmsgDeviceEventKind { Open, Connect, Disconnect, SendReceive, OtherIoctl, Close };

// One call that reached the device, in order.
struct VmsgDeviceEvent {
    VmsgDeviceEventKind kind = VmsgDeviceEventKind::Open;
    int fd = -1;                           // descriptor (for a failed open, -1)
    int openFlags = 0;                     // Open: the flags passed
    unsigned long request = 0;             // ioctl request number
    std::array<uint8_t, 20> connectIn{};   // Connect: the argument as the client passed it
    std::array<uint8_t, 20> connectOut{};  // Connect: the argument as the device left it
    int result = 0;                        // what the call returned
    int error = 0;                         // errno when result is negative
};

VMSG_DEVICE_API void vmsgDeviceConfigure(const VmsgDeviceScript& script);
VMSG_DEVICE_API VmsgDeviceScript vmsgDeviceScript();
// Default script, and forgets exchanges, events and overlaps. Open device
// descriptors and their connections stay as they are.
VMSG_DEVICE_API void vmsgDeviceReset();

VMSG_DEVICE_API std::vector<VmsgDeviceExchange> vmsgDeviceExchanges();
VMSG_DEVICE_API std::vector<VmsgDeviceEvent> vmsgDeviceEvents();
// Exchanges that began while another was in flight or whose request bytes
// changed while the host was serving them. Tests expect 0.
VMSG_DEVICE_API size_t vmsgDeviceOverlapCount();
// Device descriptors currently open.
VMSG_DEVICE_API size_t vmsgDeviceOpenCount();
// SEND_RECEIVE requests that reached the host since the last reset, recorded
// or not, so that a long run can pace itself without the model growing.
VMSG_DEVICE_API uint64_t vmsgDeviceServedCount();
VMSG_DEVICE_API bool vmsgDeviceWaitForServed(uint64_t count, uint32_t timeoutMs);

// For timing the guest alone: while on, SEND_RECEIVE returns 0 at once; nothing
// is read, checked or recorded, and the guest-bound buffer keeps what it held.
VMSG_DEVICE_API void vmsgDeviceSetFastAnswers(bool on);

// Called in every SEND_RECEIVE between taking the request and replying,
// outside the model's locks, with the operation code: a test can hold an
// exchange in flight. An empty function removes it.
VMSG_DEVICE_API void vmsgDeviceSetHostHook(std::function<void(uint32_t opCode)> hook);
