// The guest client of the paravirtual message device: one connection to one
// host service, with a host-bound and a guest-bound buffer shared through one
// mapping of the device.
#pragma once

#include <cstdint>
#include <string>

#include "vmsg/guest/VmsgDevice.h"
#include "xpl/XplExport.h"

// Not thread-safe: an exchange (getHostBoundBuffer, writing the request,
// processRequest, reading the reply) owns both buffers until the reply has been
// read, so callers on several threads serialise whole exchanges themselves.
//
// The field layout is part of the exported interface; keep it.
class XPL_EXPORT VmsgGuestClient {
  public:
    VmsgGuestClient() = default;
    VmsgGuestClient(const VmsgGuestClient&) = delete;
    VmsgGuestClient& operator=(const VmsgGuestClient&) = delete;

    // Opens the device, connects to `id` and maps the shared buffers. Expects
    // a client that is not connected.
    bool connect(VmsgServiceId id);
    // Releases the mapping and the descriptor; the record keeps its sizes,
    // pointers and name. Does nothing more on a client that is not connected.
    void disconnect();
    // The host-bound buffer for a request of `len` bytes, or null when `len`
    // exceeds the capacity or the client is not connected.
    void* getHostBoundBuffer(uint32_t len);
    // Hands the request at the start of the host-bound buffer to the host and
    // waits for the reply; returns the guest-bound buffer, or null when refused
    // or failed.
    void* processRequest(void* request, uint32_t len);
    // The same two, as the library's own host calls reach them: bound inside
    // the library rather than through the dynamic linker's table, so an
    // interposed definition of the two above sees outside callers only.
    __attribute__((visibility("hidden"))) void* getHostBoundBufferDirect(uint32_t len);
    __attribute__((visibility("hidden"))) void* processRequestDirect(void* request, uint32_t len);

    int32_t mFd = -1;
    // The capacities change only inside connect, which stores each with
    // vmsgStoreCapacity, so a reader without the caller's lock can take them
    // with vmsgLoadCapacity.
    uint32_t mMaxHostBoundSize = 0;
    uint32_t mMaxGuestBoundSize = 0;
    uint32_t mSpare = 0;
    uint32_t mGuestBoundOffset = 0;
    void* mHostBoundBuf = nullptr;
    void* mGuestBoundBuf = nullptr;
    std::string mServiceName;
};

inline uint32_t vmsgLoadCapacity(const uint32_t& capacity) {
    return __atomic_load_n(&capacity, __ATOMIC_RELAXED);
}
inline void vmsgStoreCapacity(uint32_t& capacity, uint32_t value) {
    __atomic_store_n(&capacity, value, __ATOMIC_RELAXED);
}
