// One exchange with the host-call service, holding the connection from the
// request buffer to the reading of the reply. Inline, so that each operation
// runs the path that succeeds without a call of its own; only the client's two
// steps and the refusals are calls, all bound inside the library.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

#include "hcall/guest/HcallEnc.h"
#include "xpl/XplThreadAnnotations.h"

namespace hcall {

// The source path that every host-call log line names.
inline constexpr char kEncSource[] = "Source/hcall/guest/HcallEnc";

// Set once g_hcall is being destroyed; later exchanges are refused. Read
// under the exchange lock, which orders it after the destructor's store.
extern std::atomic<bool> gClosed;

// Holds the exchange lock for its lifetime: the worker's calls and the
// queries on Java threads share one pair of buffers and must never overlap.
class SCOPED_CAPABILITY Exchange {
  public:
    Exchange() ACQUIRE(gExchangeLock) { gExchangeLock.lock(); }
    ~Exchange() RELEASE() { gExchangeLock.unlock(); }
    Exchange(const Exchange&) = delete;
    Exchange& operator=(const Exchange&) = delete;

    // The host-bound buffer for a request of `requestLength` bytes whose reply
    // takes `replyLength` bytes, or null when either does not fit or the
    // connection is closed. Nothing has been sent when it is refused.
    uint8_t* requestBuffer(const char* function, size_t requestLength, size_t replyLength)
        REQUIRES(gExchangeLock) {
        VmsgGuestClient& client = g_hcall.client;
        if (gClosed.load(std::memory_order_relaxed) || requestLength > UINT32_MAX)
            return refuse(function, requestLength, replyLength);
        auto* buffer =
            static_cast<uint8_t*>(client.getHostBoundBufferDirect(uint32_t(requestLength)));
        if (buffer && replyLength > client.mMaxGuestBoundSize)
            return refuse(function, requestLength, replyLength);
        return buffer;
    }
    // Delivers the request and waits for the reply; null when that fails.
    const uint8_t* send(uint8_t* request, uint32_t length) REQUIRES(gExchangeLock) {
        return static_cast<const uint8_t*>(g_hcall.client.processRequestDirect(request, length));
    }

  private:
    // Says why requestBuffer refuses, where there is anyone to tell; null.
    // Cold: the compiler lays every operation out for the request that fits.
    __attribute__((cold)) static uint8_t* refuse(const char* function, size_t requestLength,
                                                 size_t replyLength) REQUIRES(gExchangeLock);
};

}  // namespace hcall
