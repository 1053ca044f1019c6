// One exchange with the host-call service, holding the connection from the
// request buffer to the reading of the reply.
#pragma once

#include <cstddef>
#include <cstdint>

#include "hcall/guest/HcallEnc.h"
#include "xpl/XplThreadAnnotations.h"

namespace hcall {

// The source path that every host-call log line names.
inline constexpr char kEncSource[] = "Source/hcall/guest/HcallEnc";

// Holds the exchange lock for its lifetime: the worker's calls and the
// queries on Java threads share one pair of buffers and must never overlap.
class SCOPED_CAPABILITY Exchange {
  public:
    Exchange() ACQUIRE(gExchangeLock);
    ~Exchange() RELEASE();
    Exchange(const Exchange&) = delete;
    Exchange& operator=(const Exchange&) = delete;

    // The host-bound buffer for a request of `requestLength` bytes whose reply
    // takes `replyLength` bytes, or null when either does not fit or the
    // connection is closed. Nothing has been sent when it is refused.
    uint8_t* requestBuffer(const char* function, size_t requestLength, size_t replyLength)
        REQUIRES(gExchangeLock);
    // Delivers the request and waits for the reply; null when that fails.
    const uint8_t* send(uint8_t* request, uint32_t length) REQUIRES(gExchangeLock);
};

}  // namespace hcall
