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
#include <cstring>
#include <memory>
#include <mutex>

#include "HcallDecoder.h"
#include "VmsgDeviceInternal.h"
#include "VmsgDeviceReply.h"
#include "vmsg/guest/VmsgDevice.h"

namespace vmsgdev {
namespace {

// Which descriptors are the device's, readable without a lock because every
// close() and ioctl() in the process asks.
constexpr int kMaxFd = 65536;
std::atomic<uint64_t> gDeviceFds[kMaxFd / 64];

void markDeviceFd(int fd, bool on) {
    const uint64_t bit = uint64_t(1) << (fd % 64);
    if (on)
        gDeviceFds[fd / 64].fetch_or(bit, std::memory_order_release);
    else
        gDeviceFds[fd / 64].fetch_and(~bit, std::memory_order_release);
}

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
    uint32_t requestBytes = 0;   // readable host-bound bytes
    uint32_t guestOffset = 0;    // where the reply goes
    uint32_t replyBytes = 0;     // writable guest-bound bytes
    std::vector<uint8_t> taken;  // the request as the host took it
    ~SharedMemory() {
        if (view != nullptr) munmap(view, length);
    }
};

struct Connection {
    bool connected = false;
    uint32_t hostBoundCapacity = 0;
    uint32_t guestBoundCapacity = 0;
    int inFlight = 0;
    std::shared_ptr<SharedMemory> memory;  // null when the layout is not backed
};

uint32_t le32(const uint8_t* p) {
    return uint32_t(p[0]) | uint32_t(p[1]) << 8 | uint32_t(p[2]) << 16 | uint32_t(p[3]) << 24;
}

void putLe32(uint8_t* p, uint32_t v) {
    for (int i = 0; i < 4; ++i) p[i] = uint8_t(v >> (8 * i));
}

int fail(int err) {
    errno = err;
    return -1;
}

void writeAll(int fd, const std::string& text) {
    size_t done = 0;
    while (done < text.size()) {
        const ssize_t n = write(fd, text.data() + done, text.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;
        done += size_t(n);
    }
}

// What one exchange carries from its start to its record.
struct Exchange {
    int fd = -1;
    std::shared_ptr<const VmsgDeviceScript> script;
    std::shared_ptr<SharedMemory> memory;
    std::function<void(uint32_t)> hook;
    uint32_t hostBoundCapacity = 0;
    uint32_t guestBoundCapacity = 0;
    uint64_t seq = 0;
    bool overlapped = false;
    uint32_t requestLen = 0;
    uint32_t replyLen = 0;
    int sendErrno = 0;
    uint32_t extraDelayUs = 0;  // drawn at random
    bool failed = false;        // answered with the script's failure result
};

// splitmix64: small, fast, and the same sequence on every platform.
class Random {
  public:
    void seed(uint64_t seed) { mState = seed; }
    uint64_t next() {
        uint64_t z = (mState += 0x9E3779B97F4A7C15ULL);
        z = (z ^ (z >> 30)) * 0xBF58476D1CE4E5B9ULL;
        z = (z ^ (z >> 27)) * 0x94D049BB133111EBULL;
        return z ^ (z >> 31);
    }
    // Uniform enough in [0, bound] for pauses and shares.
    uint32_t upTo(uint32_t bound) { return uint32_t(next() % (uint64_t(bound) + 1)); }
    bool perMille(uint32_t share) { return share != 0 && upTo(999) < share; }

  private:
    uint64_t mState = 0;
};

class Device {
  public:
    Device() : mScript(std::make_shared<VmsgDeviceScript>(scriptFromEnvironment())) {
        mRandom.seed(mScript->randomSeed);
        openTrace();
    }

    static Device& get() {
        // Never destroyed: the client disconnects from static destructors
        // that may run after ours would have.
        static Device* device = new Device;
        return *device;
    }

    int open(int flags) {
        std::lock_guard<std::mutex> lock(mMutex);
        VmsgDeviceEvent ev;
        ev.kind = VmsgDeviceEventKind::Open;
        ev.openFlags = flags;
        int fd = -1;
        if (mScript->openErrno != 0) {
            fd = fail(mScript->openErrno);
        } else {
            fd = memfd_create("kivvmsg",
                              MFD_ALLOW_SEALING | ((flags & O_CLOEXEC) ? MFD_CLOEXEC : 0));
            if (fd >= kMaxFd) {
                ::close(fd);
                fd = fail(EMFILE);
            }
        }
        if (fd >= 0) {
            mConnections[fd] = Connection{};
            markDeviceFd(fd, true);
        }
        ev.fd = ev.result = fd;
        ev.error = fd < 0 ? errno : 0;
        recordEvent(ev);
        errno = ev.error;
        return fd;
    }

    int ioctl(int fd, unsigned long request, void* arg) {
        if (request == VMSG_IOC_SEND_RECEIVE) return sendReceive(fd);
        std::lock_guard<std::mutex> lock(mMutex);
        VmsgDeviceEvent ev;
        ev.fd = fd;
        ev.request = request;
        if (request == VMSG_IOC_CONNECT) {
            ev.kind = VmsgDeviceEventKind::Connect;
            ev.result = connect(fd, static_cast<uint8_t*>(arg), ev);
        } else if (request == VMSG_IOC_DISCONNECT) {
            ev.kind = VmsgDeviceEventKind::Disconnect;
            ev.result = disconnect(fd);
        } else {
            ev.kind = VmsgDeviceEventKind::OtherIoctl;
            ev.result = fail(ENOTTY);
        }
        ev.error = ev.result < 0 ? errno : 0;
        recordEvent(ev);
        errno = ev.error;
        return ev.result;
    }

    int close(int fd, int (*realClose)(int)) {
        {  // acquire lock
            std::lock_guard<std::mutex> lock(mMutex);
            mConnections.erase(fd);
            markDeviceFd(fd, false);
        }  // release lock: the descriptor is no longer ours when the number is reused
        const int result = realClose(fd);
        const int err = errno;
        VmsgDeviceEvent ev;
        ev.kind = VmsgDeviceEventKind::Close;
        ev.fd = fd;
        ev.result = result;
        ev.error = result < 0 ? err : 0;
        {
            std::lock_guard<std::mutex> lock(mMutex);
            recordEvent(ev);
        }
        errno = err;
        return result;
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

    VmsgDeviceScript script() {
        std::lock_guard<std::mutex> lock(mMutex);
        return *mScript;
    }
    std::vector<VmsgDeviceExchange> exchanges() {
        std::lock_guard<std::mutex> lock(mMutex);
        return mExchanges;
    }
    std::vector<VmsgDeviceEvent> events() {
        std::lock_guard<std::mutex> lock(mMutex);
        return mEvents;
    }
    size_t overlaps() {
        std::lock_guard<std::mutex> lock(mMutex);
        return mOverlaps;
    }
    bool waitForExchanges(size_t count, uint32_t timeoutMs) {
        std::unique_lock<std::mutex> lock(mMutex);
        return mRecorded.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                                  [&] { return mExchanges.size() >= count; });
    }
    uint64_t served() {
        std::lock_guard<std::mutex> lock(mMutex);
        return mServed;
    }
    bool waitForServed(uint64_t count, uint32_t timeoutMs) {
        std::unique_lock<std::mutex> lock(mMutex);
        return mServedChanged.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                                       [&] { return mServed >= count; });
    }
    size_t openCount() {
        std::lock_guard<std::mutex> lock(mMutex);
        return mConnections.size();
    }
    void setHook(std::function<void(uint32_t)> hook) {
        std::lock_guard<std::mutex> lock(mMutex);
        mHook = std::move(hook);
    }

  private:
    int connect(int fd, uint8_t* arg, VmsgDeviceEvent& ev) {
        const auto it = mConnections.find(fd);
        if (it == mConnections.end()) return fail(EBADF);
        if (arg == nullptr) return fail(EFAULT);
        std::memcpy(ev.connectIn.data(), arg, ev.connectIn.size());
        Connection& conn = it->second;
        const VmsgDeviceScript& s = *mScript;
        int result = 0;
        if (conn.connected) {
            result = fail(EISCONN);
        } else if (le32(arg) != hcall::kServiceId) {
            result = fail(ECONNREFUSED);
        } else if (s.connectErrno != 0) {
            result = fail(s.connectErrno);
        } else {
            result = establish(fd, conn, arg);
        }
        std::memcpy(ev.connectOut.data(), arg, ev.connectOut.size());
        return result;
    }

    int establish(int fd, Connection& conn, uint8_t* arg) {
        const VmsgDeviceScript& s = *mScript;
        const uint64_t page = uint64_t(sysconf(_SC_PAGESIZE));
        const uint32_t offset =
            s.guestBoundOffset != 0
                ? s.guestBoundOffset
                : uint32_t(std::min<uint64_t>((s.hostBoundCapacity + page - 1) / page * page,
                                              0xFFFFFFFFu));
        const uint64_t length = uint64_t(offset) + s.guestBoundCapacity;
        if (length != 0 && length <= kMaxBackedLayout) {
            if (ftruncate(fd, off_t(length)) != 0) return -1;
            if (s.mmapFails) {
                // No writable shared mapping of the memfd can be made after
                // this seal, so the client's mmap fails in the kernel.
                if (fcntl(fd, F_ADD_SEALS, F_SEAL_WRITE) != 0) return -1;
            } else if (!backConnection(fd, conn, length, offset)) {
                return -1;
            }
        }
        conn.connected = true;
        conn.hostBoundCapacity = s.hostBoundCapacity;
        conn.guestBoundCapacity = s.guestBoundCapacity;
        putLe32(arg + 4, s.hostBoundCapacity);
        putLe32(arg + 8, s.guestBoundCapacity);
        putLe32(arg + 12, s.spare);
        putLe32(arg + 16, offset);
        return 0;
    }

    bool backConnection(int fd, Connection& conn, uint64_t length, uint32_t offset) {
        void* view = mmap(nullptr, length, PROT_READ | PROT_WRITE, MAP_SHARED, fd, 0);
        if (view == MAP_FAILED) return false;
        auto memory = std::make_shared<SharedMemory>();
        memory->view = static_cast<uint8_t*>(view);
        memory->length = length;
        memory->requestBytes = uint32_t(std::min<uint64_t>(mScript->hostBoundCapacity, length));
        memory->guestOffset = offset;
        memory->replyBytes = mScript->guestBoundCapacity;
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

    // Starts an exchange under the lock: everything it needs is copied or
    // shared, so the host can serve it with the lock released.
    int begin(int fd, Exchange& x) {
        std::lock_guard<std::mutex> lock(mMutex);
        const auto it = mConnections.find(fd);
        if (it == mConnections.end()) return fail(EBADF);
        Connection& conn = it->second;
        if (!conn.connected) return fail(ENOTCONN);
        if (!conn.memory) return fail(EFAULT);
        x.fd = fd;
        x.script = mScript;
        x.memory = conn.memory;
        if (mHook) x.hook = mHook;
        x.hostBoundCapacity = conn.hostBoundCapacity;
        x.guestBoundCapacity = conn.guestBoundCapacity;
        x.seq = mSeq++;
        x.overlapped = ++conn.inFlight > 1;
        const VmsgDeviceScript& s = *mScript;
        if (s.delayJitterUs != 0) x.extraDelayUs = mRandom.upTo(s.delayJitterUs);
        if (mRandom.perMille(s.sendFailurePerMille)) x.sendErrno = EIO;
        x.failed = mRandom.perMille(s.failurePerMille);
        return 0;
    }

    int sendReceive(int fd) {
        Exchange x;
        if (begin(fd, x) != 0) {
            const int err = errno;
            std::lock_guard<std::mutex> lock(mMutex);
            VmsgDeviceEvent ev;
            ev.kind = VmsgDeviceEventKind::SendReceive;
            ev.fd = fd;
            ev.request = VMSG_IOC_SEND_RECEIVE;
            ev.result = -1;
            ev.error = err;
            recordEvent(ev);
            return fail(err);
        }
        SharedMemory& m = *x.memory;
        // An overlapping exchange must not share the snapshot buffer with
        // the one it overlaps.
        std::vector<uint8_t> ownCopy;
        uint8_t* taken = m.taken.data();
        if (x.overlapped) {
            ownCopy.resize(m.requestBytes);
            taken = ownCopy.data();
        }
        const uint32_t total = m.requestBytes >= 8 ? le32(m.view + 4) : 0;
        x.requestLen = std::min(m.requestBytes, std::max<uint32_t>(total, 8));
        if (x.requestLen != 0) std::memcpy(taken, m.view, x.requestLen);

        bool rewritten = false;
        if (x.script->sendErrno != 0) x.sendErrno = x.script->sendErrno;
        if (x.sendErrno == 0) {
            const HcallDecoded d =
                hcallCheck(taken, x.requestLen, x.hostBoundCapacity, x.guestBoundCapacity);
            const uint32_t delayUs = x.script->delayUs + x.extraDelayUs;
            if (delayUs != 0) usleep(delayUs);
            if (x.hook) x.hook(d.opCode);
            rewritten = x.requestLen != 0 && std::memcmp(taken, m.view, x.requestLen) != 0;
            x.replyLen =
                writeReply(*x.script, d, m.view + m.guestOffset, m.replyBytes, x.seq, x.failed);
        }
        finish(x, taken, rewritten);
        return x.sendErrno != 0 ? fail(x.sendErrno) : 0;
    }

    void finish(const Exchange& x, const uint8_t* taken, bool rewritten) {
        std::lock_guard<std::mutex> lock(mMutex);
        const auto it = mConnections.find(x.fd);
        if (it != mConnections.end() && it->second.memory == x.memory) --it->second.inFlight;
        const bool overlapped = x.overlapped || rewritten;
        if (overlapped) ++mOverlaps;
        ++mServed;
        mServedChanged.notify_all();
        const VmsgDeviceScript& s = *x.script;
        if (!s.record && mTraceFd < 0 && !s.printCalls && !overlapped) return;

        VmsgDeviceExchange e;
        e.request.assign(taken, taken + x.requestLen);
        const uint8_t* reply = x.memory->view + x.memory->guestOffset;
        if (x.sendErrno == 0) e.reply.assign(reply, reply + x.replyLen);
        const HcallDecoded d =
            hcallDecode(e.request.data(), e.request.size(), x.sendErrno ? nullptr : reply,
                        x.replyLen, x.hostBoundCapacity, x.guestBoundCapacity);
        e.opCode = d.opCode;
        e.wellFormed = d.wellFormed;
        e.problem = d.problem;
        e.text = d.text;
        if (x.sendErrno != 0) e.text += " -> !failed: errno " + std::to_string(x.sendErrno);
        e.sendErrno = x.sendErrno;
        e.overlapped = overlapped;
        report(e, s);
        if (s.record) {
            mExchanges.push_back(std::move(e));
            mRecorded.notify_all();
        }
        VmsgDeviceEvent ev;
        ev.kind = VmsgDeviceEventKind::SendReceive;
        ev.fd = x.fd;
        ev.request = VMSG_IOC_SEND_RECEIVE;
        ev.result = x.sendErrno ? -1 : 0;
        ev.error = x.sendErrno;
        recordEvent(ev);
    }

    void report(const VmsgDeviceExchange& e, const VmsgDeviceScript& s) {
        if (e.overlapped)
            writeAll(STDERR_FILENO, "vmsg-device: overlapping exchange: " + e.text + "\n");
        if (s.printCalls) writeAll(STDERR_FILENO, e.text + "\n");
        if (mTraceFd >= 0) {
            const std::string reply =
                e.sendErrno ? std::string("-") : hcallHex(e.reply.data(), e.reply.size());
            writeAll(mTraceFd, "req=" + hcallHex(e.request.data(), e.request.size()) + " reply=" +
                                   reply + " " + e.text + (e.overlapped ? " !overlap" : "") + "\n");
        }
    }

    void recordEvent(const VmsgDeviceEvent& ev) {
        if (mScript->record) mEvents.push_back(ev);
    }

    void openTrace() {
        if (mTraceFd >= 0) ::close(mTraceFd);
        mTraceFd = -1;
        const std::string& path = mScript->tracePath;
        if (path.empty()) return;
        if (isDevicePath(path.c_str())) {
            // Opening it here would come back to this device under its lock.
            writeAll(STDERR_FILENO, "vmsg-device: the device cannot trace into itself\n");
            return;
        }
        mTraceFd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
        if (mTraceFd < 0) writeAll(STDERR_FILENO, "vmsg-device: cannot open trace " + path + "\n");
    }

    std::mutex mMutex;
    std::condition_variable mRecorded;
    std::condition_variable mServedChanged;
    std::shared_ptr<const VmsgDeviceScript> mScript;
    std::map<int, Connection> mConnections;
    std::vector<VmsgDeviceExchange> mExchanges;
    std::vector<VmsgDeviceEvent> mEvents;
    size_t mOverlaps = 0;
    uint64_t mServed = 0;
    uint64_t mSeq = 0;
    Random mRandom;
    std::function<void(uint32_t)> mHook;
    int mTraceFd = -1;
};

}  // namespace

bool isDevicePath(const char* path) {
    return path != nullptr && std::strcmp(path, VMSG_DEVICE_PATH) == 0;
}

bool isDeviceFd(int fd) {
    if (fd < 0 || fd >= kMaxFd) return false;
    return (gDeviceFds[fd / 64].load(std::memory_order_acquire) >> (fd % 64)) & 1;
}

int openDevice(int flags) { return Device::get().open(flags); }

int deviceIoctl(int fd, unsigned long request, void* arg) {
    return Device::get().ioctl(fd, request, arg);
}

int closeDevice(int fd, int (*realClose)(int)) { return Device::get().close(fd, realClose); }

}  // namespace vmsgdev

void vmsgDeviceConfigure(const VmsgDeviceScript& script) {
    vmsgdev::Device::get().configure(script);
}
VmsgDeviceScript vmsgDeviceScript() { return vmsgdev::Device::get().script(); }
void vmsgDeviceReset() { vmsgdev::Device::get().reset(); }
std::vector<VmsgDeviceExchange> vmsgDeviceExchanges() { return vmsgdev::Device::get().exchanges(); }
std::vector<VmsgDeviceEvent> vmsgDeviceEvents() { return vmsgdev::Device::get().events(); }
size_t vmsgDeviceOverlapCount() { return vmsgdev::Device::get().overlaps(); }
bool vmsgDeviceWaitForExchanges(size_t count, uint32_t timeoutMs) {
    return vmsgdev::Device::get().waitForExchanges(count, timeoutMs);
}
size_t vmsgDeviceOpenCount() { return vmsgdev::Device::get().openCount(); }
uint64_t vmsgDeviceServedCount() { return vmsgdev::Device::get().served(); }
bool vmsgDeviceWaitForServed(uint64_t count, uint32_t timeoutMs) {
    return vmsgdev::Device::get().waitForServed(count, timeoutMs);
}
void vmsgDeviceSetHostHook(std::function<void(uint32_t)> hook) {
    vmsgdev::Device::get().setHook(std::move(hook));
}
