// A stand-in for the paravirtual message device "/dev/kivvmsg" and the host
// behind it, for the process it lives in.
//
// Linked into a test program (target vmsg_device_objects) or preloaded
// (libvmsg_device.so), it interposes open/openat, ioctl and close: opening the
// device path yields a memfd, so the client's mmap and munmap are the real
// calls on real shared memory, and the three device requests on that
// descriptor are served by an in-process host built on the host half of the
// protocol (hcall/host/HcallHost.h). Every other path and descriptor passes
// through untouched.
//
// Tests drive it through the functions below; a preloaded copy reads the same
// settings from VMSG_DEVICE_* environment variables (listed in README.md).
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

// What the device and the host answer. Settings that describe the connection
// (capacities, offset, spare word, the mmap fault) take effect at the next
// CONNECT; the others at the next request.
struct VmsgDeviceScript {
    // Out-words of CONNECT. guestBoundOffset 0 means "right after the
    // host-bound buffer, rounded up to a page". The memfd is sized to
    // guestBoundOffset + guestBoundCapacity, computed without wrapping. A
    // layout beyond 256 MiB (a sum that wraps in 32 bits, say) is answered
    // but not backed: SEND_RECEIVE on it fails with EFAULT.
    uint32_t hostBoundCapacity = 65536;
    uint32_t guestBoundCapacity = 65536;
    uint32_t spare = 0;
    uint32_t guestBoundOffset = 0;

    // Faults, each an errno value; 0 means no fault. The device refuses
    // service ids other than "hcal" with ECONNREFUSED whatever is set here.
    int openErrno = 0;     // open("/dev/kivvmsg") fails
    int connectErrno = 0;  // VMSG_IOC_CONNECT fails
    int sendErrno = 0;     // VMSG_IOC_SEND_RECEIVE fails (the request is still recorded)
    // The memfd is sealed against writable shared mappings after CONNECT, so
    // the client's mmap fails for real (EPERM).
    bool mmapFails = false;

    // Answers. results maps an operation code to its 4-byte result; codes not
    // listed answer defaultResult. Operation 24 answers results[24] when it is
    // listed, else launchAllowed as a bool field (1 or 0).
    std::map<uint32_t, int32_t> results;
    int32_t defaultResult = 0;
    bool launchAllowed = true;
    // A malformed request is answered with this result in the first 4 bytes.
    int32_t malformedResult = -22;

    // Filled data. Buffers get the bytes of the text, NUL-padded (or cut, and
    // then unterminated) to the capacity the request named.
    std::string propsText;   // operation 1, the char * buffer
    int32_t propsValue = 0;  // operation 1, the i32 *
    uint64_t timeValue = 0;  // operation 5, the u64 *
    std::string timeText;    // operation 5, the char * buffer

    // Pause inside SEND_RECEIVE before the reply is written.
    uint32_t delayUs = 0;

    // A host that is slow and unreliable at random, reproducibly: every
    // exchange draws from a generator seeded with randomSeed whenever a script
    // is configured. It pauses a further 0 to delayJitterUs microseconds
    // (uniformly); failurePerMille of the exchanges are answered with
    // failureResult (a flag operation with false) instead of their result, and
    // sendFailurePerMille of them fail SEND_RECEIVE itself with EIO.
    uint32_t delayJitterUs = 0;
    uint32_t failurePerMille = 0;
    int32_t failureResult = 5;  // XERR_IO
    uint32_t sendFailurePerMille = 0;
    uint64_t randomSeed = 1;

    VmsgDeviceReplyMode replyMode = VmsgDeviceReplyMode::Scripted;
    uint32_t shortReplyBytes = 0;
    std::vector<uint8_t> rawReply;

    // Each exchange is also appended, one line, to this file (empty: none) and,
    // when printCalls is set, its decoded call is written to standard error.
    std::string tracePath;
    bool printCalls = false;
    // Keep exchanges and events for vmsgDeviceExchanges/Events. A benchmark
    // turns it off: the host then allocates nothing on the exchange path.
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

// Replaces the script (and applies its trace and print settings).
VMSG_DEVICE_API void vmsgDeviceConfigure(const VmsgDeviceScript& script);
// The script in force.
VMSG_DEVICE_API VmsgDeviceScript vmsgDeviceScript();
// Default script, and forgets exchanges, events and overlaps. Open device
// descriptors and their connections stay as they are.
VMSG_DEVICE_API void vmsgDeviceReset();

VMSG_DEVICE_API std::vector<VmsgDeviceExchange> vmsgDeviceExchanges();
VMSG_DEVICE_API std::vector<VmsgDeviceEvent> vmsgDeviceEvents();
// Exchanges that began while another was in flight or whose request bytes
// changed while the host was serving them. Tests expect 0.
VMSG_DEVICE_API size_t vmsgDeviceOverlapCount();
// Waits until at least `count` exchanges are recorded (since the last reset)
// or timeoutMs passes; true when they are. For tests whose host calls run on
// another thread. Needs record on.
VMSG_DEVICE_API bool vmsgDeviceWaitForExchanges(size_t count, uint32_t timeoutMs);
// Device descriptors currently open.
VMSG_DEVICE_API size_t vmsgDeviceOpenCount();
// SEND_RECEIVE requests that reached the host (served or failed) since the
// last reset. Counted whether or not exchanges are recorded, so a long run
// can pace itself on it without the model growing.
VMSG_DEVICE_API uint64_t vmsgDeviceServedCount();
// Waits until the served count reaches `count` or timeoutMs passes; true when
// it has.
VMSG_DEVICE_API bool vmsgDeviceWaitForServed(uint64_t count, uint32_t timeoutMs);

// Called inside every SEND_RECEIVE after the request was taken and before the
// reply is written, outside the model's locks, with the operation code. Lets a
// test hold an exchange in flight behind a gate. An empty function removes it.
VMSG_DEVICE_API void vmsgDeviceSetHostHook(std::function<void(uint32_t opCode)> hook);
