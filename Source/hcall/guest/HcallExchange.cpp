#include "hcall/guest/HcallExchange.h"

#include <atomic>
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

// Set once g_hcall is being destroyed; later exchanges are refused.
std::atomic<bool> gClosed{false};

}  // namespace

std::mutex& gExchangeLock = gLockStorage.mutex;

Exchange::Exchange() { gExchangeLock.lock(); }

Exchange::~Exchange() { gExchangeLock.unlock(); }

uint8_t* Exchange::requestBuffer(const char* function, size_t requestLength, size_t replyLength) {
    VmsgGuestClient& client = g_hcall.client;
    uint8_t* buffer = nullptr;
    if (gClosed.load()) {
        // The process is exiting; nothing to report to.
    } else if (requestLength > UINT32_MAX) {
        // Beyond what the header can state; the client's own test could not
        // see the true length.
        XLOG_AT(XLOG_MODULE_HCALL, XLOG_LEVEL_E, kEncSource, function,
                "%s: request of %zu bytes, mMaxHostBoundSize %u", function, requestLength,
                client.mMaxHostBoundSize);
    } else {
        buffer = static_cast<uint8_t*>(client.getHostBoundBuffer(uint32_t(requestLength)));
        // A reply running past the guest-bound buffer would be read from
        // beyond the mapping.
        if (buffer && replyLength > client.mMaxGuestBoundSize) {
            XLOG_AT(XLOG_MODULE_HCALL, XLOG_LEVEL_E, kEncSource, function,
                    "%s: reply of %zu bytes, mMaxGuestBoundSize %u", function, replyLength,
                    client.mMaxGuestBoundSize);
            buffer = nullptr;
        }
    }
    return buffer;
}

const uint8_t* Exchange::send(uint8_t* request, uint32_t length) {
    return static_cast<const uint8_t*>(g_hcall.client.processRequest(request, length));
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
