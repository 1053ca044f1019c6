#include "vmsg/guest/VmsgGuest.h"

#include <android-base/unique_fd.h>
#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "xpl/Xlog.h"
#include "xpl/XplLayout.h"

namespace {

XPL_LAYOUT_FIRST(VmsgGuestClient, mFd)
XPL_LAYOUT_FOLLOWS(VmsgGuestClient, mFd, mMaxHostBoundSize)
XPL_LAYOUT_FOLLOWS(VmsgGuestClient, mMaxHostBoundSize, mMaxGuestBoundSize)
XPL_LAYOUT_FOLLOWS(VmsgGuestClient, mMaxGuestBoundSize, mSpare)
XPL_LAYOUT_FOLLOWS(VmsgGuestClient, mSpare, mGuestBoundOffset)
XPL_LAYOUT_FOLLOWS(VmsgGuestClient, mGuestBoundOffset, mHostBoundBuf)
XPL_LAYOUT_FOLLOWS(VmsgGuestClient, mHostBoundBuf, mGuestBoundBuf)
XPL_LAYOUT_FOLLOWS(VmsgGuestClient, mGuestBoundBuf, mServiceName)
XPL_LAYOUT_LAST(VmsgGuestClient, mServiceName)

constexpr char kSource[] = "Source/vmsg/guest/VmsgGuest";
constexpr char kConnect[] = "bool VmsgGuestClient::connect(VmsgServiceId)";
constexpr char kDisconnect[] = "void VmsgGuestClient::disconnect()";
constexpr char kGetHostBoundBuffer[] = "void *VmsgGuestClient::getHostBoundBuffer(uint32_t)";
constexpr char kProcessRequest[] = "void *VmsgGuestClient::processRequest(void *, uint32_t)";

// Lines that lead with "<function>:<line>" take the line of the statement
// itself, so both __LINE__ come from this one macro body.
#define VMSG_AT_LINE(level, function, format, ...)                                                 \
    XLOG_AT(XLOG_MODULE_VMSG, (level), kSource, (function), "%s:%d " format, (function), __LINE__, \
            __VA_ARGS__)
#define VMSG_TRACE(function, format, ...) VMSG_AT_LINE(XLOG_LEVEL_I, function, format, __VA_ARGS__)
#define VMSG_ERROR(function, ...) \
    XLOG_AT(XLOG_MODULE_VMSG, XLOG_LEVEL_E, kSource, (function), __VA_ARGS__)

// The id's bytes as they lie in memory, up to the first zero byte.
std::string serviceName(VmsgServiceId id) {
    char bytes[sizeof(id) + 1] = {};
    std::memcpy(bytes, &id, sizeof(id));
    return std::string(bytes);
}

}  // namespace

bool VmsgGuestClient::connect(VmsgServiceId id) {
    VMSG_TRACE(kConnect, "called for %s\n", mServiceName.c_str());
    mServiceName = serviceName(id);
    // Not connected until the new connection stands; an earlier one is the
    // caller's to have released.
    mFd = -1;

    android::base::unique_fd fd(::open(VMSG_DEVICE_PATH, O_RDWR));
    if (fd.get() < 0) {
        VMSG_ERROR(kConnect, "%s: service %s: open failed for %s", kConnect, mServiceName.c_str(),
                   VMSG_DEVICE_PATH);
        return false;
    }

    VmsgConnectArgs args = {};
    args.serviceId = id;
    int ret = ::ioctl(fd.get(), VMSG_IOC_CONNECT, &args);
    if (ret < 0) {
        int error = errno;
        VMSG_ERROR(kConnect, "%s: service %s: connection ioctl failed: ret %d, errno %d", kConnect,
                   mServiceName.c_str(), ret, error);
        return false;
    }
    vmsgStoreCapacity(mMaxHostBoundSize, args.maxHostBoundSize);
    vmsgStoreCapacity(mMaxGuestBoundSize, args.maxGuestBoundSize);
    mSpare = args.spare;
    mGuestBoundOffset = args.guestBoundOffset;
    VMSG_TRACE(kConnect, "mMaxHostBoundSize %u, mMaxGuestBoundSize %u service %s",
               mMaxHostBoundSize, mMaxGuestBoundSize, mServiceName.c_str());

    // The device's values are not trusted to describe a sane layout: a length
    // that wraps in 32 bits, or a host-bound buffer running past the mapping,
    // would let a request or a reply overrun the mapping.
    size_t length = size_t(mGuestBoundOffset) + mMaxGuestBoundSize;
    if (length > UINT32_MAX || mMaxHostBoundSize > length) {
        VMSG_ERROR(kConnect,
                   "%s: service %s: impossible buffer layout: mMaxHostBoundSize %u, "
                   "mMaxGuestBoundSize %u, mGuestBoundOffset %u",
                   kConnect, mServiceName.c_str(), mMaxHostBoundSize, mMaxGuestBoundSize,
                   mGuestBoundOffset);
        return false;
    }
    void* map = ::mmap(nullptr, length, PROT_READ | PROT_WRITE, MAP_SHARED, fd.get(), 0);
    if (map == MAP_FAILED) {
        int error = errno;
        VMSG_ERROR(kConnect, "%s: service %s: mmap() failed: size %zu, errno %d", kConnect,
                   mServiceName.c_str(), length, error);
        return false;
    }

    mHostBoundBuf = map;
    mGuestBoundBuf = static_cast<char*>(map) + mGuestBoundOffset;
    mFd = fd.release();
    return true;
}

void VmsgGuestClient::disconnect() {
    VMSG_TRACE(kDisconnect, "called for %s\n", mServiceName.c_str());
    if (mFd < 0) return;
    ::ioctl(mFd, VMSG_IOC_DISCONNECT);
    ::munmap(mHostBoundBuf, uint32_t(mMaxGuestBoundSize + mGuestBoundOffset));
    ::close(mFd);
    mFd = -1;
}

void* VmsgGuestClient::getHostBoundBufferDirect(uint32_t len) {
    VMSG_TRACE(kGetHostBoundBuffer, "called for %s\n", mServiceName.c_str());
    if (len > mMaxHostBoundSize) {
        VMSG_AT_LINE(XLOG_LEVEL_E, kGetHostBoundBuffer, "len %u, mMaxHostBoundSize %u", len,
                     mMaxHostBoundSize);
        return nullptr;
    }
    // Capacities outlive a failed connect and a disconnect; the mapping does not.
    if (mFd < 0) {
        VMSG_ERROR(kGetHostBoundBuffer, "%s: service %s: not connected", kGetHostBoundBuffer,
                   mServiceName.c_str());
        return nullptr;
    }
    return mHostBoundBuf;
}

void* VmsgGuestClient::processRequestDirect(void* /*request*/, uint32_t len) {
    VMSG_TRACE(kProcessRequest, "called for %s\n", mServiceName.c_str());
    // Refused without a line of its own, like an oversized request: the
    // caller's getHostBoundBuffer has already said why.
    if (len > mMaxHostBoundSize || mFd < 0) return nullptr;
    // The request is whatever lies at the start of the host-bound buffer; its
    // length reaches the host through the service's own framing.
    int ret = ::ioctl(mFd, VMSG_IOC_SEND_RECEIVE);
    if (ret < 0) {
        int error = errno;
        VMSG_ERROR(kProcessRequest, "%s: service %s: SEND_RECEIVE ioctl failed: ret %d, errno %d",
                   kProcessRequest, mServiceName.c_str(), ret, error);
        return nullptr;
    }
    return mGuestBoundBuf;
}

void* VmsgGuestClient::getHostBoundBuffer(uint32_t len) { return getHostBoundBufferDirect(len); }

void* VmsgGuestClient::processRequest(void* request, uint32_t len) {
    return processRequestDirect(request, len);
}
