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

#include "VmsgDeviceInternal.h"
#include "VmsgDeviceReply.h"
#include "hcall/host/HcallBytes.h"
#include "vmsg/guest/VmsgDevice.h"

namespace vmsgdev {
namespace {

using hcall::le32;

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

void writeAll(int fd, const std::string& text) {
    for (size_t done = 0; done < text.size();) {
        const ssize_t n = write(fd, text.data() + done, text.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;
        done += size_t(n);
    }
}

// What one exchange carries from its start to its record: copied or shared
// under the lock, so the host serves it with the lock released.
struct Exchange {
    int fd = -1;
    std::shared_ptr<const VmsgDeviceScript> script;
    std::shared_ptr<SharedMemory> memory;
    std::function<void(uint32_t)> hook;
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
    uint32_t upTo(uint32_t bound) {
        uint64_t z = (mState += 0x9E3779B97F4A7C15ULL);
        z = (z ^ (z >> 30)) * 0xBF58476D1CE4E5B9ULL;
        z = (z ^ (z >> 27)) * 0x94D049BB133111EBULL;
        return uint32_t((z ^ (z >> 31)) % (uint64_t(bound) + 1));
    }
    bool perMille(uint32_t share) { return share != 0 && upTo(999) < share; }

  private:
    uint64_t mState = 0;
};

VmsgDeviceEvent event(VmsgDeviceEventKind kind, int fd, unsigned long request = 0) {
    VmsgDeviceEvent ev;
    ev.kind = kind;
    ev.fd = fd;
    ev.request = request;
    return ev;
}

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
        int fd = -1;
        if (mScript->openErrno != 0) {
            fd = fail(mScript->openErrno);
        } else {
            fd = memfd_create("kivvmsg",
                              MFD_ALLOW_SEALING | ((flags & O_CLOEXEC) ? MFD_CLOEXEC : 0));
            if (fd >= kMaxFd) fd = (::close(fd), fail(EMFILE));
        }
        if (fd >= 0) {
            mConnections[fd] = Connection{};
            markDeviceFd(fd, true);
        }
        VmsgDeviceEvent ev = event(VmsgDeviceEventKind::Open, fd);
        ev.openFlags = flags;
        return record(ev, fd);
    }

    int ioctl(int fd, unsigned long request, void* arg) {
        if (request == VMSG_IOC_SEND_RECEIVE) return sendReceive(fd);
        std::lock_guard<std::mutex> lock(mMutex);
        VmsgDeviceEvent ev = event(VmsgDeviceEventKind::OtherIoctl, fd, request);
        int result = -1;
        if (request == VMSG_IOC_CONNECT) {
            ev.kind = VmsgDeviceEventKind::Connect;
            result = connect(fd, static_cast<uint8_t*>(arg), ev);
        } else if (request == VMSG_IOC_DISCONNECT) {
            ev.kind = VmsgDeviceEventKind::Disconnect;
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
            markDeviceFd(fd, false);
        }  // release lock: the descriptor is no longer ours when the number is reused
        const int result = realClose(fd);
        const int err = errno;
        std::lock_guard<std::mutex> lock(mMutex);
        VmsgDeviceEvent ev = event(VmsgDeviceEventKind::Close, fd);
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

    // Reads one piece of state under the lock.
    template <typename Read>
    auto read(Read read) {
        std::lock_guard<std::mutex> lock(mMutex);
        return read();
    }
    template <typename Done>
    bool waitFor(std::condition_variable& changed, uint32_t timeoutMs, Done done) {
        std::unique_lock<std::mutex> lock(mMutex);
        return changed.wait_for(lock, std::chrono::milliseconds(timeoutMs), done);
    }

    std::shared_ptr<const VmsgDeviceScript> mScript;
    std::map<int, Connection> mConnections;
    std::vector<VmsgDeviceExchange> mExchanges;
    std::vector<VmsgDeviceEvent> mEvents;
    size_t mOverlaps = 0;
    uint64_t mServed = 0;
    std::function<void(uint32_t)> mHook;
    std::condition_variable mRecorded;
    std::condition_variable mServedChanged;

  private:
    // Records a call's event with its result and errno, and returns the result
    // with errno as the call left it.
    int record(VmsgDeviceEvent& ev, int result) {
        const int err = errno;
        ev.result = result;
        ev.error = result < 0 ? err : 0;
        if (ev.kind == VmsgDeviceEventKind::Open) ev.fd = result;
        if (mScript->record) mEvents.push_back(ev);
        errno = err;
        return result;
    }

    int connect(int fd, uint8_t* arg, VmsgDeviceEvent& ev) {
        const auto it = mConnections.find(fd);
        if (it == mConnections.end()) return fail(EBADF);
        if (arg == nullptr) return fail(EFAULT);
        std::memcpy(ev.connectIn.data(), arg, ev.connectIn.size());
        int result = 0;
        if (it->second.connected) {
            result = fail(EISCONN);
        } else if (le32(arg) != hcall::kServiceId) {
            result = fail(ECONNREFUSED);
        } else if (mScript->connectErrno != 0) {
            result = fail(mScript->connectErrno);
        } else {
            result = establish(fd, it->second, arg);
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

    int begin(int fd, Exchange& x) {
        std::lock_guard<std::mutex> lock(mMutex);
        const auto it = mConnections.find(fd);
        int result = 0;
        if (it == mConnections.end()) {
            result = fail(EBADF);
        } else if (!it->second.connected) {
            result = fail(ENOTCONN);
        } else if (!it->second.memory) {
            result = fail(EFAULT);
        }
        if (result != 0) {
            VmsgDeviceEvent ev = event(VmsgDeviceEventKind::SendReceive, fd, VMSG_IOC_SEND_RECEIVE);
            return record(ev, result);
        }
        x.fd = fd;
        x.script = mScript;
        x.memory = it->second.memory;
        x.hook = mHook;
        x.seq = mSeq++;
        x.overlapped = ++it->second.inFlight > 1;
        const VmsgDeviceScript& s = *mScript;
        if (s.delayJitterUs != 0) x.extraDelayUs = mRandom.upTo(s.delayJitterUs);
        if (mRandom.perMille(s.sendFailurePerMille)) x.sendErrno = EIO;
        x.failed = mRandom.perMille(s.failurePerMille);
        if (s.sendErrno != 0) x.sendErrno = s.sendErrno;
        return 0;
    }

    // Takes the request, lets the host answer it, and records the exchange.
    int sendReceive(int fd) {
        Exchange x;
        if (begin(fd, x) != 0) return -1;
        SharedMemory& m = *x.memory;
        // An overlapping exchange must not share the snapshot buffer with
        // the one it overlaps.
        std::vector<uint8_t> ownCopy(x.overlapped ? m.requestBytes : 0);
        uint8_t* taken = x.overlapped ? ownCopy.data() : m.taken.data();
        const uint32_t total = m.requestBytes >= 8 ? le32(m.view + 4) : 0;
        x.requestLen = std::min(m.requestBytes, std::max<uint32_t>(total, 8));
        if (x.requestLen != 0) std::memcpy(taken, m.view, x.requestLen);

        bool rewritten = false;
        if (x.sendErrno == 0) {
            const uint32_t delayUs = x.script->delayUs + x.extraDelayUs;
            if (delayUs != 0) usleep(delayUs);
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
        if (!s.record && mTraceFd < 0 && !s.printCalls && !overlapped) return;

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
        if (s.record) {
            mExchanges.push_back(std::move(e));
            mRecorded.notify_all();
        }
        VmsgDeviceEvent ev = event(VmsgDeviceEventKind::SendReceive, x.fd, VMSG_IOC_SEND_RECEIVE);
        errno = x.sendErrno;
        record(ev, x.sendErrno ? -1 : 0);
    }

    void report(const VmsgDeviceExchange& e, const VmsgDeviceScript& s) {
        if (e.overlapped)
            writeAll(STDERR_FILENO, "vmsg-device: overlapping exchange: " + e.text + "\n");
        if (s.printCalls) writeAll(STDERR_FILENO, e.text + "\n");
        if (mTraceFd < 0) return;
        const std::string reply =
            e.sendErrno ? std::string("-") : hcallHex(e.reply.data(), e.reply.size());
        writeAll(mTraceFd, "req=" + hcallHex(e.request.data(), e.request.size()) + " reply=" +
                               reply + " " + e.text + (e.overlapped ? " !overlap" : "") + "\n");
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
    uint64_t mSeq = 0;
    Random mRandom;
    int mTraceFd = -1;
};

Device& device() { return Device::get(); }

}  // namespace

bool isDevicePath(const char* path) {
    return path != nullptr && std::strcmp(path, VMSG_DEVICE_PATH) == 0;
}

bool isDeviceFd(int fd) {
    if (fd < 0 || fd >= kMaxFd) return false;
    return (gDeviceFds[fd / 64].load(std::memory_order_acquire) >> (fd % 64)) & 1;
}

int openDevice(int flags) { return device().open(flags); }
int deviceIoctl(int fd, unsigned long request, void* arg) {
    return device().ioctl(fd, request, arg);
}
int closeDevice(int fd, int (*realClose)(int)) { return device().close(fd, realClose); }

}  // namespace vmsgdev

using vmsgdev::device;

void vmsgDeviceConfigure(const VmsgDeviceScript& script) { device().configure(script); }
VmsgDeviceScript vmsgDeviceScript() {
    return device().read([] { return *device().mScript; });
}
void vmsgDeviceReset() { device().reset(); }
std::vector<VmsgDeviceExchange> vmsgDeviceExchanges() {
    return device().read([] { return device().mExchanges; });
}
std::vector<VmsgDeviceEvent> vmsgDeviceEvents() {
    return device().read([] { return device().mEvents; });
}
size_t vmsgDeviceOverlapCount() {
    return device().read([] { return device().mOverlaps; });
}
bool vmsgDeviceWaitForExchanges(size_t count, uint32_t timeoutMs) {
    return device().waitFor(device().mRecorded, timeoutMs,
                            [count] { return device().mExchanges.size() >= count; });
}
size_t vmsgDeviceOpenCount() {
    return device().read([] { return device().mConnections.size(); });
}
uint64_t vmsgDeviceServedCount() {
    return device().read([] { return device().mServed; });
}
bool vmsgDeviceWaitForServed(uint64_t count, uint32_t timeoutMs) {
    return device().waitFor(device().mServedChanged, timeoutMs,
                            [count] { return device().mServed >= count; });
}
void vmsgDeviceSetHostHook(std::function<void(uint32_t)> hook) {
    device().read([&hook] { device().mHook = std::move(hook); });
}
