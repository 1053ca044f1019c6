#include "hcall/guest/HcallExchange.h"

#include <mutex>

#include "xpl/Xlog.h"

namespace hcall {
namespace {

// Built at compile time and never destroyed, so that a thread still in an
// exchange while the process runs its exit-time destructors, and g_hcall's
// own destructor, always meet a live lock (a C++ library whose mutex has a
// destructor would otherwise destroy it at exit, and some C libraries abort
// on a destroyed mutex).
union LockStorage {
    constexpr LockStorage() : mutex() {}
    // Not defaulted: where std::mutex has a destructor, a defaulted one would
    // be deleted.
    ~LockStorage() {}  // NOLINT(modernize-use-equals-default)
    std::mutex mutex;
};
LockStorage gLockStorage;

}  // namespace

std::mutex& gExchangeLock = gLockStorage.mutex;
std::atomic<bool> gClosed{false};

// Why requestBuffer refused, told where there is anyone to tell. Out of line,
// so that no operation carries these statements in its own code. It refuses
// for one of three reasons, tested here again in its order: the connection is
// closed because the process is exiting, the request is longer than the
// header's 32-bit length can state, or its reply would be longer than the
// guest-bound buffer. A request longer than the host-bound buffer is refused
// by the client, which says so itself; a reply is only checked once the
// client has handed out the buffer.
uint8_t* Exchange::refuse(const char* function, size_t requestLength, size_t replyLength) {
    const VmsgGuestClient& client = g_hcall.client;
    if (gClosed.load(std::memory_order_relaxed)) {
        // The process is exiting; nothing to report to.
    } else if (requestLength > UINT32_MAX) {
        // Beyond what the header can state; the client's own test could not
        // see the true length.
        XLOG_AT(XLOG_MODULE_HCALL, XLOG_LEVEL_E, kEncSource, function,
                "%s: request of %zu bytes, mMaxHostBoundSize %u", function, requestLength,
                client.mMaxHostBoundSize);
    } else {
        // The reply is read in place, so one running past the guest-bound
        // buffer would be read from beyond the mapping; the capacity the
        // device stated at connect is the only bound the guest has for it
        // (the mapping's length follows from it).
        XLOG_AT(XLOG_MODULE_HCALL, XLOG_LEVEL_E, kEncSource, function,
                "%s: reply of %zu bytes, mMaxGuestBoundSize %u", function, replyLength,
                client.mMaxGuestBoundSize);
    }
    return nullptr;
}

}  // namespace hcall

HcallGuestGlobals::~HcallGuestGlobals() {
    hcall::gClosed.store(true);
    // An exchange still running on another thread keeps the buffers: leave the
    // mapping and the descriptor to the end of the process.
    if (hcall::gExchangeLock.try_lock()) {
        if (client.mFd >= 0) client.disconnect();
        hcall::gExchangeLock.unlock();
    }
}
