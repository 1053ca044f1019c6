// The device model through the real system calls of this process: the test
// program links the model's interposers, so open/ioctl/close below reach it
// exactly as the guest client's calls do.
#include "vmsg/guest/VmsgDevice.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <future>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "HcallDecoder.h"
#include "VmsgDeviceInternal.h"
#include "VmsgDeviceModel.h"

namespace {

std::vector<uint8_t> hex(const std::string& text) {
    std::vector<uint8_t> bytes;
    EXPECT_TRUE(hcallParseHex(text, bytes)) << text;
    return bytes;
}

// A client of the device at the system-call boundary, as bare as the guest's.
class RawClient {
  public:
    ~RawClient() {
        if (mMap != MAP_FAILED) munmap(mMap, mLength);
        if (mFd >= 0) close(mFd);
    }
    int open() { return mFd = ::open(VMSG_DEVICE_PATH, O_RDWR); }
    int connect(uint32_t serviceId = hcall::kServiceId) {
        mArgs = VmsgConnectArgs{serviceId, 0, 0, 0, 0};
        return ioctl(mFd, VMSG_IOC_CONNECT, &mArgs);
    }
    bool map() {
        mLength = uint32_t(mArgs.guestBoundOffset + mArgs.maxGuestBoundSize);
        mMap = mmap(nullptr, mLength, PROT_READ | PROT_WRITE, MAP_SHARED, mFd, 0);
        return mMap != MAP_FAILED;
    }
    bool start() { return open() >= 0 && connect() == 0 && map(); }
    int exchange(const std::vector<uint8_t>& request) {
        std::memcpy(hostBound(), request.data(), request.size());
        return ioctl(mFd, VMSG_IOC_SEND_RECEIVE);
    }
    std::vector<uint8_t> reply(size_t n) const { return {guestBound(), guestBound() + n}; }
    uint8_t* hostBound() const { return static_cast<uint8_t*>(mMap); }
    uint8_t* guestBound() const { return hostBound() + mArgs.guestBoundOffset; }
    int fd() const { return mFd; }
    int releaseFd() {
        const int fd = mFd;
        mFd = -1;
        return fd;
    }
    const VmsgConnectArgs& args() const { return mArgs; }

  private:
    int mFd = -1;
    VmsgConnectArgs mArgs{};
    void* mMap = MAP_FAILED;
    size_t mLength = 0;
};

// How long a test waits for exchanges on other threads before it gives up.
constexpr uint32_t kWaitToleranceMs = 30000;

const char kLocale[] =
    "0C000000 12000000 06000000 656E2D555300";  // hcallOnLocaleChangedRpc("en-US")

class VmsgDevice : public ::testing::Test {
  protected:
    void SetUp() override { vmsgDeviceReset(); }
    void TearDown() override {
        vmsgDeviceSetHostHook({});
        EXPECT_EQ(vmsgDeviceOpenCount(), 0u) << "every device descriptor was closed";
        vmsgDeviceReset();
    }
    static void configure(void (*edit)(VmsgDeviceScript&)) {
        VmsgDeviceScript s;
        edit(s);
        vmsgDeviceConfigure(s);
    }
};

TEST_F(VmsgDevice, Open_WhenPathIsNotTheDevice_PassesThroughUntouched) {
    char path[] = "/tmp/vmsg_device_testXXXXXX";
    const int made = mkstemp(path);
    ASSERT_GE(made, 0);
    ASSERT_EQ(write(made, "xyz", 3), 3);
    ASSERT_EQ(close(made), 0);

    const int a = open(path, O_RDONLY);
    const int b = openat(AT_FDCWD, path, O_RDONLY);
    ASSERT_GE(a, 0);
    ASSERT_GE(b, 0);
    int pending = -1;
    EXPECT_EQ(ioctl(a, FIONREAD, &pending), 0) << "ioctl on another descriptor reaches the kernel";
    EXPECT_EQ(pending, 3);
    char buf[4] = {};
    EXPECT_EQ(read(b, buf, sizeof buf), 3);
    EXPECT_STREQ(buf, "xyz");
    EXPECT_EQ(close(a), 0);
    EXPECT_EQ(close(b), 0);
    EXPECT_EQ(close(b), -1) << "a second close fails in the kernel as usual";
    EXPECT_EQ(errno, EBADF);
    EXPECT_EQ(open("/nonexistent/dir/file", O_RDONLY), -1);
    EXPECT_EQ(errno, ENOENT);
    unlink(path);
    EXPECT_TRUE(vmsgDeviceEvents().empty()) << "the device saw none of it";
}

TEST_F(VmsgDevice, Connect_WhenServiceIsHcal_AnswersScriptedWordsOverSharedMemory) {
    configure([](VmsgDeviceScript& s) {
        s.hostBoundCapacity = 100;
        s.guestBoundCapacity = 8192;
        s.spare = 7;
    });
    RawClient c;
    ASSERT_GE(c.open(), 0);
    ASSERT_EQ(c.connect(), 0);
    EXPECT_EQ(c.args().maxHostBoundSize, 100u);
    EXPECT_EQ(c.args().maxGuestBoundSize, 8192u);
    EXPECT_EQ(c.args().spare, 7u);
    EXPECT_EQ(c.args().guestBoundOffset, 4096u) << "after the host-bound buffer, page-rounded";
    ASSERT_TRUE(c.map());
    EXPECT_EQ(ioctl(c.fd(), 0x7699), -1) << "unknown requests are refused";
    EXPECT_EQ(errno, ENOTTY);

    const std::vector<VmsgDeviceEvent> events = vmsgDeviceEvents();
    ASSERT_EQ(events.size(), 3u);
    EXPECT_EQ(events[0].kind, VmsgDeviceEventKind::Open);
    EXPECT_EQ(events[0].openFlags, O_RDWR);
    EXPECT_EQ(events[1].kind, VmsgDeviceEventKind::Connect);
    EXPECT_EQ(events[1].request, VMSG_IOC_CONNECT);
    const std::array<uint8_t, 20> in = {0x68, 0x63, 0x61, 0x6C};
    EXPECT_EQ(events[1].connectIn, in) << "the client's argument as it arrived";
    EXPECT_EQ(events[1].connectOut[4], 100);
    EXPECT_EQ(events[2].kind, VmsgDeviceEventKind::OtherIoctl);

    EXPECT_EQ(ioctl(c.fd(), VMSG_IOC_CONNECT, &in), -1);
    EXPECT_EQ(errno, EISCONN) << "one connection per descriptor";
    EXPECT_EQ(ioctl(c.fd(), VMSG_IOC_DISCONNECT), 0);
    EXPECT_EQ(ioctl(c.fd(), VMSG_IOC_SEND_RECEIVE), -1);
    EXPECT_EQ(errno, ENOTCONN) << "no exchange after DISCONNECT";
}

TEST_F(VmsgDevice, SendReceive_WhenRequestIsWellFormed_RecordsItAndAnswersFromScript) {
    configure([](VmsgDeviceScript& s) { s.results[12] = -5; });
    RawClient c;
    ASSERT_TRUE(c.start());
    ASSERT_EQ(c.exchange(hex(kLocale)), 0);
    EXPECT_EQ(c.reply(4), hex("FBFFFFFF")) << "the scripted result, little-endian";

    const std::vector<VmsgDeviceExchange> all = vmsgDeviceExchanges();
    ASSERT_EQ(all.size(), 1u);
    EXPECT_EQ(all[0].opCode, 12u);
    EXPECT_EQ(all[0].request, hex(kLocale)) << "exactly totalLength bytes";
    EXPECT_TRUE(all[0].wellFormed) << all[0].problem;
    EXPECT_EQ(all[0].text, "hcallOnLocaleChangedRpc(\"en-US\") -> -5");
    EXPECT_EQ(all[0].reply, hex("FBFFFFFF"));
    EXPECT_FALSE(all[0].overlapped);
}

TEST_F(VmsgDevice, SendReceive_FilledOperationsAndLaunch_GetTheScriptedData) {
    configure([](VmsgDeviceScript& s) {
        s.propsText = "abc";
        s.propsValue = 3;
        s.timeValue = 0x0102030405060708ULL;
        s.timeText = "0123456789";  // longer than the buffer: cut, unterminated
        s.launchAllowed = false;
    });
    RawClient c;
    ASSERT_TRUE(c.start());
    ASSERT_EQ(c.exchange(hex("01000000 14000000 08000000 08000000 04000000")), 0);
    EXPECT_EQ(c.reply(16), hex("6162630000000000 03000000 00000000"));
    ASSERT_EQ(c.exchange(hex("05000000 14000000 08000000 04000000 04000000")), 0);
    EXPECT_EQ(c.reply(16), hex("0807060504030201 30313233 00000000"));
    ASSERT_EQ(c.exchange(hex("18000000 0E000000 02000000 7000")), 0);
    EXPECT_EQ(c.reply(4), hex("00000000")) << "launch refused";

    VmsgDeviceScript s = vmsgDeviceScript();
    s.results[24] = 0x100;  // first byte 0: read as false whatever follows
    vmsgDeviceConfigure(s);
    ASSERT_EQ(c.exchange(hex("18000000 0E000000 02000000 7000")), 0);
    EXPECT_EQ(c.reply(4), hex("00010000"));

    const std::vector<VmsgDeviceExchange> all = vmsgDeviceExchanges();
    ASSERT_EQ(all.size(), 4u);
    EXPECT_EQ(all[0].text, "hcallGetPropsRpc(char[8]=\"abc\", 8, i32*=3) -> 0");
    EXPECT_EQ(
        all[1].text,
        "hcallGetTimeInfoRpc(u64*=72623859790382856, char[4]=\"0123\"(unterminated), 4) -> 0");
    EXPECT_EQ(all[2].text, "hcallIsAppLaunchAllowedRpc(\"p\") -> false");
    EXPECT_EQ(all[3].text, "hcallIsAppLaunchAllowedRpc(\"p\") -> false");
}

TEST_F(VmsgDevice, SendReceive_WhenFramingIsBroken_AnswersMalformedResult) {
    configure([](VmsgDeviceScript& s) { s.hostBoundCapacity = 16; });
    RawClient c;
    ASSERT_TRUE(c.start());
    ASSERT_EQ(c.exchange(hex("0C000000 10000000 09000000 61626300")), 0);
    EXPECT_EQ(c.reply(4), hex("EAFFFFFF")) << "-22 for a request the host cannot read";
    ASSERT_EQ(c.exchange(hex("0C000000 11000000 05000000 6162636400")), 0)
        << "17 bytes do not fit a 16-byte host-bound buffer";

    const std::vector<VmsgDeviceExchange> all = vmsgDeviceExchanges();
    ASSERT_EQ(all.size(), 2u);
    EXPECT_FALSE(all[0].wellFormed);
    EXPECT_EQ(all[0].problem, "string count 9 at offset 8 runs past totalLength 16");
    EXPECT_FALSE(all[1].wellFormed);
    EXPECT_EQ(all[1].problem, "totalLength 17 exceeds the host-bound capacity 16");
    EXPECT_EQ(all[1].request.size(), 16u) << "the host reads no further than its buffer";
}

TEST_F(VmsgDevice, Faults_EachRowOfTheClientFailureTable_IsInjected) {
    {
        configure([](VmsgDeviceScript& s) { s.openErrno = EACCES; });
        EXPECT_EQ(open(VMSG_DEVICE_PATH, O_RDWR), -1);
        EXPECT_EQ(errno, EACCES);
        EXPECT_EQ(vmsgDeviceEvents().back().error, EACCES);
    }
    {
        configure([](VmsgDeviceScript& s) { s.connectErrno = EIO; });
        RawClient c;
        ASSERT_GE(c.open(), 0);
        EXPECT_EQ(c.connect(), -1);
        EXPECT_EQ(errno, EIO);
    }
    {
        vmsgDeviceReset();
        RawClient c;
        ASSERT_GE(c.open(), 0);
        EXPECT_EQ(c.connect(0x6C616300), -1) << "only the host-call service is served";
        EXPECT_EQ(errno, ECONNREFUSED);
    }
    {
        configure([](VmsgDeviceScript& s) { s.mmapFails = true; });
        RawClient c;
        ASSERT_GE(c.open(), 0);
        ASSERT_EQ(c.connect(), 0);
        EXPECT_FALSE(c.map()) << "the kernel refuses the shared writable mapping";
        EXPECT_EQ(errno, EPERM);
    }
    {
        configure([](VmsgDeviceScript& s) { s.sendErrno = EINTR; });
        RawClient c;
        ASSERT_TRUE(c.start());
        c.guestBound()[0] = 0xEE;
        EXPECT_EQ(c.exchange(hex(kLocale)), -1);
        EXPECT_EQ(errno, EINTR);
        EXPECT_EQ(c.guestBound()[0], 0xEE) << "a failed exchange writes no reply";
        const VmsgDeviceExchange e = vmsgDeviceExchanges().at(0);
        EXPECT_EQ(e.sendErrno, EINTR);
        EXPECT_EQ(e.text, "hcallOnLocaleChangedRpc(\"en-US\") -> !failed: errno 4");
    }
}

TEST_F(VmsgDevice, Connect_WhenLayoutWrapsOrIsHuge_HandsOutTheWordsButServesNothing) {
    configure([](VmsgDeviceScript& s) {
        s.guestBoundOffset = 0xFFFFF000;
        s.guestBoundCapacity = 0x2000;  // 32-bit sum wraps to 0x1000
    });
    RawClient c;
    ASSERT_GE(c.open(), 0);
    ASSERT_EQ(c.connect(), 0);
    EXPECT_EQ(c.args().guestBoundOffset, 0xFFFFF000u);
    EXPECT_EQ(c.args().maxGuestBoundSize, 0x2000u);
    EXPECT_EQ(ioctl(c.fd(), VMSG_IOC_SEND_RECEIVE), -1);
    EXPECT_EQ(errno, EFAULT) << "the host has no buffer behind such a layout";
}

TEST_F(VmsgDevice, Reply_ShortGarbageAndRaw_ReplaceTheProperReply) {
    configure([](VmsgDeviceScript& s) {
        s.guestBoundCapacity = 64;
        s.replyMode = VmsgDeviceReplyMode::Short;
        s.shortReplyBytes = 2;
        s.results[12] = 0x04030201;
    });
    RawClient c;
    ASSERT_TRUE(c.start());
    std::memset(c.guestBound(), 0xEE, 64);
    ASSERT_EQ(c.exchange(hex(kLocale)), 0);
    EXPECT_EQ(c.reply(4), hex("0102EEEE")) << "the rest keeps what the buffer held";
    EXPECT_EQ(vmsgDeviceExchanges().at(0).text,
              "hcallOnLocaleChangedRpc(\"en-US\") -> !short reply: 2 of 4 bytes");

    VmsgDeviceScript s = vmsgDeviceScript();
    s.replyMode = VmsgDeviceReplyMode::Garbage;
    vmsgDeviceConfigure(s);
    ASSERT_EQ(c.exchange(hex(kLocale)), 0);
    const std::vector<uint8_t> garbage = c.reply(64);
    EXPECT_NE(garbage, std::vector<uint8_t>(64, 0xEE)) << "the whole buffer is overwritten";
    EXPECT_EQ(vmsgDeviceExchanges().at(1).reply, garbage);

    s.replyMode = VmsgDeviceReplyMode::Raw;
    s.rawReply = hex("AABB");
    vmsgDeviceConfigure(s);
    ASSERT_EQ(c.exchange(hex(kLocale)), 0);
    EXPECT_EQ(c.reply(2), hex("AABB"));
}

// Holds the first exchange inside the host until the gate opens.
class HeldExchange {
  public:
    HeldExchange() {
        vmsgDeviceSetHostHook([this](uint32_t) {
            if (mCalls.fetch_add(1) == 0) {
                mEntered.set_value();
                mGate.wait();
            }
        });
    }
    ~HeldExchange() { open(); }
    void waitEntered() { mEntered.get_future().wait(); }
    void open() {
        std::call_once(mOpened, [this] { mRelease.set_value(); });
    }

  private:
    std::atomic<int> mCalls{0};
    std::promise<void> mEntered;
    std::promise<void> mRelease;
    std::shared_future<void> mGate = mRelease.get_future().share();
    std::once_flag mOpened;
};

TEST_F(VmsgDevice, Overlap_WhenSecondExchangeEntersDuringFirst_IsCounted) {
    RawClient c;
    ASSERT_TRUE(c.start());
    std::memcpy(c.hostBound(), hex(kLocale).data(), hex(kLocale).size());
    HeldExchange held;
    std::thread first([&] { EXPECT_EQ(ioctl(c.fd(), VMSG_IOC_SEND_RECEIVE), 0); });
    held.waitEntered();
    EXPECT_EQ(vmsgDeviceOverlapCount(), 0u) << "one exchange in flight is no overlap";
    EXPECT_EQ(ioctl(c.fd(), VMSG_IOC_SEND_RECEIVE), 0);
    held.open();
    first.join();
    EXPECT_EQ(vmsgDeviceOverlapCount(), 1u) << "the second exchange entered during the first";
}

TEST_F(VmsgDevice, Overlap_WhenThreadsTakeTurns_NoneIsReported) {
    RawClient c;
    ASSERT_TRUE(c.start());
    std::mutex turn;
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t) {
        threads.emplace_back([&] {
            for (int i = 0; i < 25; ++i) {
                std::lock_guard<std::mutex> lock(turn);
                EXPECT_EQ(c.exchange(hex(kLocale)), 0);
            }
        });
    }
    EXPECT_TRUE(vmsgDeviceWaitForExchanges(100, kWaitToleranceMs))
        << "the waiter wakes when the last exchange is recorded";
    for (std::thread& t : threads) t.join();
    EXPECT_EQ(vmsgDeviceOverlapCount(), 0u);
    EXPECT_EQ(vmsgDeviceExchanges().size(), 100u);
    EXPECT_FALSE(vmsgDeviceWaitForExchanges(101, 0)) << "no 101st exchange ever comes";
}

TEST_F(VmsgDevice, Close_WhenDeviceDescriptorCloses_ItsNumberPassesThroughAgain) {
    RawClient c;
    ASSERT_TRUE(c.start());
    const int fd = c.releaseFd();  // the mapping stays, as after the client's own close
    EXPECT_EQ(vmsgDeviceOpenCount(), 1u);
    EXPECT_EQ(close(fd), 0);
    EXPECT_EQ(vmsgDeviceOpenCount(), 0u);
    EXPECT_EQ(vmsgDeviceEvents().back().kind, VmsgDeviceEventKind::Close);

    int fds[2];
    ASSERT_EQ(pipe(fds), 0);
    ASSERT_TRUE(fds[0] == fd || fds[1] == fd) << "the lowest free number is reused";
    ASSERT_EQ(write(fds[1], "ab", 2), 2);
    int pending = -1;
    EXPECT_EQ(ioctl(fds[0], FIONREAD, &pending), 0) << "the reused number is not the device";
    EXPECT_EQ(pending, 2);
    close(fds[0]);
    close(fds[1]);
}

std::string readFile(const std::string& path) {
    std::ifstream in(path);
    return std::string(std::istreambuf_iterator<char>(in), {});
}

// Sends standard error to a file for the life of the object.
class StderrCapture {
  public:
    StderrCapture() : mPath(::testing::TempDir() + "vmsg_stderr_" + std::to_string(getpid())) {
        const int fd = ::open(mPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
        mSaved = dup(STDERR_FILENO);
        dup2(fd, STDERR_FILENO);
        close(fd);
    }
    ~StderrCapture() {
        restore();
        unlink(mPath.c_str());
    }
    std::string text() {
        restore();
        return readFile(mPath);
    }

  private:
    void restore() {
        if (mSaved < 0) return;
        dup2(mSaved, STDERR_FILENO);
        close(mSaved);
        mSaved = -1;
    }
    std::string mPath;
    int mSaved = -1;
};

TEST_F(VmsgDevice, Output_WhenTraceAndPrintAreSet_WriteOneLinePerExchange) {
    const std::string trace = ::testing::TempDir() + "vmsg_trace_" + std::to_string(getpid());
    unlink(trace.c_str());
    VmsgDeviceScript s;
    s.tracePath = trace;
    s.printCalls = true;
    s.results[12] = 3;
    vmsgDeviceConfigure(s);
    RawClient c;
    ASSERT_TRUE(c.start());
    StderrCapture capture;
    ASSERT_EQ(c.exchange(hex(kLocale)), 0);
    vmsgDeviceSetHostHook([&](uint32_t) { c.hostBound()[0] = 0x11; });
    ASSERT_EQ(c.exchange(hex("10000000 08000000")), 0);
    EXPECT_EQ(vmsgDeviceOverlapCount(), 1u);
    EXPECT_TRUE(vmsgDeviceExchanges().at(1).overlapped);
    vmsgDeviceReset();  // closes the trace

    EXPECT_EQ(capture.text(),
              "hcallOnLocaleChangedRpc(\"en-US\") -> 3\n"
              "vmsg-device: overlapping exchange: hcallStartImportFilesRpc() -> 0\n"
              "hcallStartImportFilesRpc() -> 0\n")
        << "a request rewritten while the host serves it is reported";
    EXPECT_EQ(readFile(trace),
              "req=0c0000001200000006000000656e2d555300 reply=03000000 "
              "hcallOnLocaleChangedRpc(\"en-US\") -> 3\n"
              "req=1000000008000000 reply=00000000 hcallStartImportFilesRpc() -> 0 !overlap\n");
    unlink(trace.c_str());
}

TEST(VmsgDeviceEnv, ScriptFromEnvironment_ReadsEveryVariableAndIgnoresBadOnes) {
    const std::pair<const char*, const char*> vars[] = {
        {"VMSG_DEVICE_CAPACITY", "0x200"},     {"VMSG_DEVICE_GUEST_CAPACITY", "300"},
        {"VMSG_DEVICE_RESULTS", "12=-5,24=0"}, {"VMSG_DEVICE_LAUNCH_ALLOWED", "0"},
        {"VMSG_DEVICE_DELAY_US", "250"},       {"VMSG_DEVICE_FAIL", "send:5"},
        {"VMSG_DEVICE_REPLY", "raw:01 02"},    {"VMSG_DEVICE_PRINT", "1"},
        {"VMSG_DEVICE_PROPS", "k=v"},          {"VMSG_DEVICE_TIME", "18446744073709551615"},
        {"VMSG_DEVICE_SPARE", "-1"},  // out of range: ignored
    };
    for (const auto& v : vars) setenv(v.first, v.second, 1);
    const VmsgDeviceScript s = vmsgdev::scriptFromEnvironment();
    for (const auto& v : vars) unsetenv(v.first);

    EXPECT_EQ(s.hostBoundCapacity, 0x200u);
    EXPECT_EQ(s.guestBoundCapacity, 300u) << "the specific variable wins over the common one";
    EXPECT_EQ(s.results, (std::map<uint32_t, int32_t>{{12, -5}, {24, 0}}));
    EXPECT_FALSE(s.launchAllowed);
    EXPECT_EQ(s.delayUs, 250u);
    EXPECT_EQ(s.sendErrno, 5);
    EXPECT_EQ(s.replyMode, VmsgDeviceReplyMode::Raw);
    EXPECT_EQ(s.rawReply, hex("0102"));
    EXPECT_TRUE(s.printCalls);
    EXPECT_EQ(s.propsText, "k=v");
    EXPECT_EQ(s.timeValue, UINT64_MAX);
    EXPECT_EQ(s.spare, 0u);

    std::map<uint32_t, int32_t> results;
    EXPECT_FALSE(vmsgdev::parseResults("12", results));
    EXPECT_FALSE(vmsgdev::parseResults("12=1,", results));
    EXPECT_FALSE(vmsgdev::parseResults("x=1", results));
}

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define VMSG_SANITIZED 1
#else
#define VMSG_SANITIZED 0
#endif

// Runs a stock program with the shared form of the model preloaded.
int runPreloaded(const char* program, const char* arg, const char* fail) {
    const pid_t pid = fork();
    if (pid == 0) {
        setenv("LD_PRELOAD", VMSG_DEVICE_LIBRARY, 1);
        if (fail) setenv("VMSG_DEVICE_FAIL", fail, 1);
        const int devnull = ::open("/dev/null", O_WRONLY);
        dup2(devnull, STDERR_FILENO);
        execlp(program, program, arg, static_cast<char*>(nullptr));
        _exit(127);
    }
    int status = 0;
    waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

TEST(VmsgDevicePreload, SharedLibrary_WhenPreloaded_MakesTheDeviceOpenable) {
    if (VMSG_SANITIZED) GTEST_SKIP() << "a sanitized library cannot be preloaded into cat";
    EXPECT_EQ(runPreloaded("cat", VMSG_DEVICE_PATH, nullptr), 0)
        << "cat reads the empty device instead of failing to find it";
    EXPECT_NE(runPreloaded("cat", VMSG_DEVICE_PATH, "open"), 0)
        << "VMSG_DEVICE_FAIL=open makes the open fail";
}

}  // namespace
