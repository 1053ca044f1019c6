// The device and the host-call host behind it: descriptors, connections, the
// three requests, and the record of everything that reached them.
#include <errno.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <cstring>
#include <memory>
#include <mutex>
#include <random>

#include "VmsgDeviceInternal.h"
#include "hcall/host/HcallBytes.h"
#include "vmsg/guest/VmsgDevice.h"

namespace vmsgdev {
namespace {

using hcall::le32;
using Kind = VmsgDeviceEventKind;

// Which descriptors are the device's, readable without a lock because every
// close() and ioctl() in the process asks.
constexpr int kMaxFd = 65536;
std::atomic<bool> gDeviceFds[kMaxFd];
std::atomic<bool> gFastAnswers{false};

// Layouts larger than this are answered on CONNECT but never backed: the
// client's mapping of such a size is its own business, and the host serves
// no exchange on it.
constexpr uint64_t kMaxBackedLayout = uint64_t(256) << 20;

// The host's view of one connection's shared memory. Held by shared pointer
// so that an exchange in progress keeps it alive even if the client closes
// the descriptor under it.
struct SharedMemory {
    uint8_t* view = nullptr;
    size_t length = 0;
    HcallLimits limits;          // the connection's capacities
    uint32_t requestBytes = 0;   // readable host-bound bytes
    uint32_t guestOffset = 0;    // where the reply goes
    std::vector<uint8_t> taken;  // the request as the host took it
    ~SharedMemory() {
        if (view != nullptr) munmap(view, length);
    }
};

struct Connection {
    bool connected = false;
    int inFlight = 0;
    std::shared_ptr<SharedMemory> memory;  // null when the layout is not backed
};

int fail(int err) {
    errno = err;
    return -1;
}

// What one exchange carries from its start to its record: copied or shared
// under the lock, so that the host serves it with the lock released.
struct Exchange {
    int fd = -1;
    std::shared_ptr<const VmsgDeviceScript> script;
    std::shared_ptr<SharedMemory> memory;
    std::function<void(uint32_t)> hook;
    uint64_t seq = 0;
    bool overlapped = false;
    int sendErrno = 0;
    uint32_t delayUs = 0;
    bool failed = false;  // answered with the script's failure result
    uint32_t requestLen = 0;
    uint32_t replyLen = 0;
};

class Device {
  public:
    Device() : mScript(std::make_shared<VmsgDeviceScript>(scriptFromEnvironment())) {
        mRandom.seed(mScript->randomSeed);
        openTrace();
    }

    int open(int flags) {
        std::lock_guard<std::mutex> lock(mMutex);
        const unsigned cloexec = (flags & O_CLOEXEC) ? MFD_CLOEXEC : 0;
        int fd = mScript->openErrno != 0 ? fail(mScript->openErrno)
                                         : memfd_create("kivvmsg", MFD_ALLOW_SEALING | cloexec);
        if (fd >= kMaxFd) {
            ::close(fd);
            fd = fail(EMFILE);
        }
        if (fd >= 0) {
            mConnections[fd] = Connection{};
            gDeviceFds[fd].store(true);
        }
        VmsgDeviceEvent ev{Kind::Open, fd, flags};
        return record(ev, fd);
    }

    int ioctl(int fd, unsigned long request, void* arg) {
        if (request == VMSG_IOC_SEND_RECEIVE) return gFastAnswers.load() ? 0 : sendReceive(fd);
        std::lock_guard<std::mutex> lock(mMutex);
        VmsgDeviceEvent ev{Kind::OtherIoctl, fd, 0, request};
        int result = -1;
        if (request == VMSG_IOC_CONNECT) {
            ev.kind = Kind::Connect;
            result = connect(fd, static_cast<uint8_t*>(arg), ev);
        } else if (request == VMSG_IOC_DISCONNECT) {
            ev.kind = Kind::Disconnect;
            result = disconnect(fd);
        } else {
            result = fail(ENOTTY);
        }
        return record(ev, result);
    }

    int close(int fd, int (*realClose)(int)) {
        {  // acquire lock
            std::lock_guard<std::mutex> lock(mMutex);
            mConnections.erase(fd);
            gDeviceFds[fd].store(false);
        }  // release lock: the descriptor is no longer ours when the number is reused
        const int result = realClose(fd);
        VmsgDeviceEvent ev{Kind::Close, fd};
        const int err = errno;
        std::lock_guard<std::mutex> lock(mMutex);
        errno = err;
        return record(ev, result);
    }

    void configure(const VmsgDeviceScript& script) {
        std::lock_guard<std::mutex> lock(mMutex);
        const bool traceChanged = script.tracePath != mScript->tracePath;
        mScript = std::make_shared<VmsgDeviceScript>(script);
        mRandom.seed(script.randomSeed);
        if (traceChanged) openTrace();
    }

    void reset() {
        configure(VmsgDeviceScript{});
        std::lock_guard<std::mutex> lock(mMutex);
        mExchanges.clear();
        mEvents.clear();
        mOverlaps = 0;
        mServed = 0;
        mHook = nullptr;
    }

    // A copy of one piece of state, taken under the lock.
    template <typename T>
    T copy(T Device::*field) {
        std::lock_guard<std::mutex> lock(mMutex);
        return this->*field;
    }
    void setHook(std::function<void(uint32_t)> hook) {
        std::lock_guard<std::mutex> lock(mMutex);
        mHook = std::move(hook);
    }
    bool waitForServed(uint64_t count, uint32_t timeoutMs) {
        std::unique_lock<std::mutex> lock(mMutex);
        return mServedChanged.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                                       [&] { return mServed >= count; });
    }

    std::shared_ptr<const VmsgDeviceScript> mScript;
    std::map<int, Connection> mConnections;
    std::vector<VmsgDeviceExchange> mExchanges;
    std::vector<VmsgDeviceEvent> mEvents;
    size_t mOverlaps = 0;
    uint64_t mServed = 0;
    std::function<void(uint32_t)> mHook;
    std::condition_variable mServedChanged;

  private:
    // Records a call with its result and errno; returns the result with errno
    // as the call left it.
    int record(VmsgDeviceEvent& ev, int result) {
        const int err = errno;
        ev.result = result;
        ev.error = result < 0 ? err : 0;
        if (mScript->record) mEvents.push_back(ev);
        errno = err;
        return result;
    }

    int connect(int fd, uint8_t* arg, VmsgDeviceEvent& ev) {
        const auto it = mConnections.find(fd);
        if (it == mConnections.end()) return fail(EBADF);
        if (arg == nullptr) return fail(EFAULT);
        std::memcpy(ev.connectIn.data(), arg, ev.connectIn.size());
        const int result = it->second.connected             ? fail(EISCONN)
                           : le32(arg) != hcall::kServiceId ? fail(ECONNREFUSED)
                           : mScript->connectErrno != 0     ? fail(mScript->connectErrno)
                                                            : establish(fd, it->second, arg);
        std::memcpy(ev.connectOut.data(), arg, ev.connectOut.size());
        return result;
    }

    int establish(int fd, Connection& conn, uint8_t* arg) {
        const VmsgDeviceScript& s = *mScript;
        const uint64_t page = uint64_t(sysconf(_SC_PAGESIZE));
        const uint64_t afterHost = (s.hostBoundCapacity + page - 1) / page * page;
        const uint32_t offset =
            s.guestBoundOffset ? s.guestBoundOffset : uint32_t(std::min<uint64_t>(afterHost, ~0u));
        const uint64_t length = uint64_t(offset) + s.guestBoundCapacity;
        if (length != 0 && length <= kMaxBackedLayout) {
            if (ftruncate(fd, off_t(length)) != 0) return -1;
            // After this seal no writable shared mapping of the memfd can be
            // made, so the client's mmap fails in the kernel.
            if (s.mmapFails && fcntl(fd, F_ADD_SEALS, F_SEAL_WRITE) != 0) return -1;
            if (!s.mmapFails && !backConnection(fd, conn, length, offset)) return -1;
        }
        conn.connected = true;
        const uint32_t words[] = {s.hostBoundCapacity, s.guestBoundCapacity, s.spare, offset};
        for (int i = 0; i < 4; ++i) hcall::putLe32(arg + 4 + 4 * i, words[i]);
        return 0;
    }

    bool backConnection(int fd, Connection& conn, uint64_t length, uint32_t offset) {
        void* view = mmap(nullptr, length, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
        if (view == MAP_FAILED) return false;
        auto memory = std::make_shared<SharedMemory>();
        memory->view = static_cast<uint8_t*>(view);
        memory->length = length;
        memory->limits = HcallLimits{mScript->hostBoundCapacity, mScript->guestBoundCapacity};
        memory->requestBytes = uint32_t(std::min<uint64_t>(mScript->hostBoundCapacity, length));
        memory->guestOffset = offset;
        memory->taken.resize(memory->requestBytes);
        conn.memory = std::move(memory);
        return true;
    }

    int disconnect(int fd) {
        const auto it = mConnections.find(fd);
        if (it == mConnections.end()) return fail(EBADF);
        if (!it->second.connected) return fail(ENOTCONN);
        it->second = Connection{};
        return 0;
    }

    // Starts an exchange under the lock, drawing its random fate.
    int begin(int fd, Exchange& x) {
        std::lock_guard<std::mutex> lock(mMutex);
        const auto it = mConnections.find(fd);
        const int result = it == mConnections.end() ? fail(EBADF)
                           : !it->second.connected  ? fail(ENOTCONN)
                           : !it->second.memory     ? fail(EFAULT)
                                                    : 0;
        if (result != 0) {
            VmsgDeviceEvent ev{Kind::SendReceive, fd, 0, VMSG_IOC_SEND_RECEIVE};
            return record(ev, result);
        }
        const VmsgDeviceScript& s = *mScript;
        x = Exchange{fd, mScript, it->second.memory, mHook, mSeq++, ++it->second.inFlight > 1};
        // Each draw only when its share is set, so one setting does not move
        // the others' sequence.
        auto upTo = [this](uint32_t bound) { return mRandom() % (uint64_t(bound) + 1); };
        x.delayUs = s.delayUs + (s.delayJitterUs ? uint32_t(upTo(s.delayJitterUs)) : 0);
        x.sendErrno = s.sendFailurePerMille && upTo(999) < s.sendFailurePerMille ? EIO : 0;
        if (s.sendErrno != 0) x.sendErrno = s.sendErrno;
        x.failed = s.failurePerMille != 0 && upTo(999) < s.failurePerMille;
        return 0;
    }

    // Takes the request, lets the scripted host answer it, records the exchange.
    int sendReceive(int fd) {
        Exchange x;
        if (begin(fd, x) != 0) return -1;
        SharedMemory& m = *x.memory;
        // An overlapping exchange must not share the snapshot with the one it
        // overlaps.
        std::vector<uint8_t> ownCopy(x.overlapped ? m.requestBytes : 0);
        uint8_t* taken = x.overlapped ? ownCopy.data() : m.taken.data();
        const uint32_t total = m.requestBytes >= 8 ? le32(m.view + 4) : 0;
        x.requestLen = std::min(m.requestBytes, std::max<uint32_t>(total, 8));
        if (x.requestLen != 0) std::memcpy(taken, m.view, x.requestLen);

        bool rewritten = false;
        if (x.sendErrno == 0) {
            if (x.delayUs != 0) usleep(x.delayUs);
            if (x.hook) x.hook(x.requestLen >= 4 ? le32(taken) : 0);
            rewritten = x.requestLen != 0 && std::memcmp(taken, m.view, x.requestLen) != 0;
            x.replyLen =
                writeReply(*x.script, taken, x.requestLen, m.limits, m.view + m.guestOffset,
                           m.limits.guestBoundCapacity, x.seq, x.failed);
        }
        finish(x, taken, rewritten);
        return x.sendErrno != 0 ? fail(x.sendErrno) : 0;
    }

    void finish(const Exchange& x, const uint8_t* taken, bool rewritten) {
        std::lock_guard<std::mutex> lock(mMutex);
        const auto it = mConnections.find(x.fd);
        if (it != mConnections.end() && it->second.memory == x.memory) --it->second.inFlight;
        const bool overlapped = x.overlapped || rewritten;
        mOverlaps += overlapped;
        ++mServed;
        mServedChanged.notify_all();
        const VmsgDeviceScript& s = *x.script;
        if (!s.record && mTrace == nullptr && !s.printCalls && !overlapped) return;

        VmsgDeviceExchange e;
        e.request.assign(taken, taken + x.requestLen);
        const uint8_t* reply = x.memory->view + x.memory->guestOffset;
        if (x.sendErrno == 0) e.reply.assign(reply, reply + x.replyLen);
        const HcallRequest r = hcallParseRequest(taken, x.requestLen, x.memory->limits);
        e.opCode = r.opCode;
        e.wellFormed = r.ok();
        e.problem = hcallFaultText(r);
        e.text = x.sendErrno != 0
                     ? hcallCallText(r) + " -> !failed: errno " + std::to_string(x.sendErrno)
                     : hcallExchangeText(r, e.reply.data(), e.reply.size());
        e.sendErrno = x.sendErrno;
        e.overlapped = overlapped;
        report(e, s);
        if (s.record) mExchanges.push_back(std::move(e));
        VmsgDeviceEvent ev{Kind::SendReceive, x.fd, 0, VMSG_IOC_SEND_RECEIVE};
        errno = x.sendErrno;
        record(ev, x.sendErrno ? -1 : 0);
    }

    void report(const VmsgDeviceExchange& e, const VmsgDeviceScript& s) {
        if (e.overlapped)
            std::fprintf(stderr, "vmsg-device: overlapping exchange: %s\n", e.text.c_str());
        if (s.printCalls) std::fprintf(stderr, "%s\n", e.text.c_str());
        if (mTrace == nullptr) return;
        const std::string reply = e.sendErrno ? "-" : hcallHex(e.reply.data(), e.reply.size());
        std::fprintf(mTrace, "req=%s reply=%s %s%s\n",
                     hcallHex(e.request.data(), e.request.size()).c_str(), reply.c_str(),
                     e.text.c_str(), e.overlapped ? " !overlap" : "");
        std::fflush(mTrace);
    }

    void openTrace() {
        if (mTrace != nullptr) std::fclose(mTrace);
        const std::string& path = mScript->tracePath;
        // Opening the device itself would come back here under the lock.
        mTrace =
            path.empty() || isDevicePath(path.c_str()) ? nullptr : std::fopen(path.c_str(), "ae");
        if (mTrace == nullptr && !path.empty())
            std::fprintf(stderr, "vmsg-device: cannot trace into %s\n", path.c_str());
    }

    std::mutex mMutex;
    uint64_t mSeq = 0;
    std::mt19937_64 mRandom;  // its sequence is the same on every platform
    FILE* mTrace = nullptr;
};

// Never destroyed: the client disconnects from static destructors that may
// run after ours would have.
Device& device() {
    static Device* device = new Device;
    return *device;
}

}  // namespace

bool isDevicePath(const char* path) {
    return path != nullptr && std::strcmp(path, VMSG_DEVICE_PATH) == 0;
}

bool isDeviceFd(int fd) { return fd >= 0 && fd < kMaxFd && gDeviceFds[fd].load(); }

int openDevice(int flags) { return device().open(flags); }
int deviceIoctl(int fd, unsigned long request, void* arg) {
    return device().ioctl(fd, request, arg);
}
int closeDevice(int fd, int (*realClose)(int)) { return device().close(fd, realClose); }

}  // namespace vmsgdev

using vmsgdev::Device;
using vmsgdev::device;

// clang-format off
void vmsgDeviceConfigure(const VmsgDeviceScript& script) { device().configure(script); }
VmsgDeviceScript vmsgDeviceScript() { return *device().copy(&Device::mScript); }
void vmsgDeviceReset() { device().reset(); }
std::vector<VmsgDeviceExchange> vmsgDeviceExchanges() { return device().copy(&Device::mExchanges); }
std::vector<VmsgDeviceEvent> vmsgDeviceEvents() { return device().copy(&Device::mEvents); }
size_t vmsgDeviceOverlapCount() { return device().copy(&Device::mOverlaps); }
size_t vmsgDeviceOpenCount() { return device().copy(&Device::mConnections).size(); }
uint64_t vmsgDeviceServedCount() { return device().copy(&Device::mServed); }
bool vmsgDeviceWaitForServed(uint64_t count, uint32_t timeoutMs) { return device().waitForServed(count, timeoutMs); }
void vmsgDeviceSetFastAnswers(bool on) { vmsgdev::gFastAnswers.store(on); }
void vmsgDeviceSetHostHook(std::function<void(uint32_t)> hook) { device().setHook(std::move(hook)); }
// clang-format on
