// One exchange with the host-call service, holding the connection from the
// request buffer to the reading of the reply.
#pragma once

#include <cstddef>
#include <cstdint>
#include <mutex>

namespace hcall {

// The source path that every host-call log line names.
inline constexpr char kEncSource[] = "Source/hcall/guest/HcallEnc";

// Takes the connection's lock for its lifetime: the worker's calls and the
// queries on Java threads share one pair of buffers and must never overlap.
class Exchange {
  public:
    Exchange();
    Exchange(const Exchange&) = delete;
    Exchange& operator=(const Exchange&) = delete;

    // The host-bound buffer for a request of `requestLength` bytes whose reply
    // takes `replyLength` bytes, or null when either does not fit or the
    // connection is closed. Nothing has been sent when it is refused.
    uint8_t* requestBuffer(const char* function, size_t requestLength, size_t replyLength);
    // Delivers the request and waits for the reply; null when that fails.
    const uint8_t* send(uint8_t* request, uint32_t length);

  private:
    std::lock_guard<std::mutex> mGuard;
};

// The connection's lock, for the few operations that touch the connection
// outside an exchange (start, sizes, exit).
std::mutex& connectionLock();

}  // namespace hcall
