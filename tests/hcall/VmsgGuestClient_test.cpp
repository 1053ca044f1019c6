// The message-device client against the device model: the connection as the
// device sees it, the shared mapping, the trace and error lines, and every
// failure the client recovers from.

#include <fcntl.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>
#include <functional>
#include <string>

#include "DeviceSession.h"
#include "LogRecorder.h"
#include "vmsg/guest/VmsgGuest.h"

namespace {

constexpr char kSource[] = "Source/vmsg/guest/VmsgGuest";
constexpr char kConnect[] = "bool VmsgGuestClient::connect(VmsgServiceId)";
constexpr char kDisconnect[] = "void VmsgGuestClient::disconnect()";
constexpr char kGetHostBoundBuffer[] = "void *VmsgGuestClient::getHostBoundBuffer(uint32_t)";
constexpr char kProcessRequest[] = "void *VmsgGuestClient::processRequest(void *, uint32_t)";
constexpr VmsgServiceId kHcal = 0x6C616368;

std::string calledFor(const LoggedLine& line, const std::string& name) {
    return line.function + ":" + std::to_string(line.line) + " called for " + name + "\n";
}

class VmsgGuestClientTest : public ::testing::Test {
  protected:
    void SetUp() override { vmsgDeviceReset(); }
    void TearDown() override {
        if (client.mFd >= 0) client.disconnect();
        vmsgDeviceReset();
    }
    void configure(const VmsgDeviceScript& script) { vmsgDeviceConfigure(script); }
    std::vector<LoggedLine> errors() const {
        std::vector<LoggedLine> found;
        for (const LoggedLine& line : log.lines(XLOG_MODULE_VMSG))
            if (line.level == XLOG_LEVEL_E) found.push_back(line);
        return found;
    }

    LogRecorder log;
    VmsgGuestClient client;
};

TEST_F(VmsgGuestClientTest, Connect_WhenDeviceAnswers_OpensConnectsAndMapsAsTheDeviceSays) {
    VmsgDeviceScript script;
    script.hostBoundCapacity = 4096;
    script.guestBoundCapacity = 2048;
    script.spare = 0xA5A5A5A5;
    script.guestBoundOffset = 8192;
    configure(script);

    ASSERT_TRUE(client.connect(kHcal));

    EXPECT_GE(client.mFd, 0);
    EXPECT_EQ(client.mMaxHostBoundSize, 4096u);
    EXPECT_EQ(client.mMaxGuestBoundSize, 2048u);
    EXPECT_EQ(client.mSpare, 0xA5A5A5A5u) << "the spare word is kept as the device returned it";
    EXPECT_EQ(client.mGuestBoundOffset, 8192u);
    EXPECT_EQ(static_cast<char*>(client.mGuestBoundBuf),
              static_cast<char*>(client.mHostBoundBuf) + 8192);
    EXPECT_EQ(client.mServiceName, "hcal");

    std::vector<VmsgDeviceEvent> events = vmsgDeviceEvents();
    ASSERT_EQ(events.size(), 2u);
    EXPECT_EQ(events[0].kind, VmsgDeviceEventKind::Open);
    EXPECT_EQ(events[0].openFlags, O_RDWR) << "opened read-write and with no other flag";
    EXPECT_EQ(events[1].kind, VmsgDeviceEventKind::Connect);
    EXPECT_EQ(events[1].request, 0xC0147601UL);
    const std::array<uint8_t, 20> expectedIn = {0x68, 0x63, 0x61, 0x6C};
    EXPECT_EQ(events[1].connectIn, expectedIn) << "service id, then 16 zero bytes";

    std::vector<LoggedLine> lines = log.lines(XLOG_MODULE_VMSG);
    ASSERT_EQ(lines.size(), 2u);
    for (const LoggedLine& line : lines) {
        EXPECT_EQ(line.level, XLOG_LEVEL_I);
        EXPECT_EQ(line.file, kSource);
        EXPECT_EQ(line.function, kConnect);
    }
    EXPECT_EQ(lines[0].text, calledFor(lines[0], "")) << "the name is not yet known";
    EXPECT_EQ(lines[1].text, std::string(kConnect) + ":" + std::to_string(lines[1].line) +
                                 " mMaxHostBoundSize 4096, mMaxGuestBoundSize 2048 service hcal");
}

TEST_F(VmsgGuestClientTest, ProcessRequest_WhenConnected_SharesBothBuffersWithTheHost) {
    VmsgDeviceScript script;
    script.results[7] = 0x12345678;
    configure(script);
    ASSERT_TRUE(client.connect(kHcal));

    const std::vector<uint8_t> request = bytes({7, 0, 0, 0, 12, 0, 0, 0, 1, 0, 0, 0});
    uint8_t* buffer = static_cast<uint8_t*>(client.getHostBoundBuffer(12));
    ASSERT_EQ(buffer, client.mHostBoundBuf);
    std::memcpy(buffer, request.data(), request.size());
    int dummy = 0;
    void* reply = client.processRequest(&dummy, 12);

    EXPECT_EQ(reply, client.mGuestBoundBuf) << "whatever request pointer is passed";
    EXPECT_EQ(onlyExchange().request, request) << "the host reads the mapping the guest wrote";
    int32_t result = 0;
    std::memcpy(&result, reply, 4);
    EXPECT_EQ(result, 0x12345678) << "the guest reads the reply the host wrote";
}

TEST_F(VmsgGuestClientTest, Exchange_AtCapacityBoundaries_AcceptsUpToCapacity) {
    VmsgDeviceScript script;
    script.hostBoundCapacity = 256;
    configure(script);
    ASSERT_TRUE(client.connect(kHcal));
    log.clear();

    EXPECT_EQ(client.getHostBoundBuffer(0), client.mHostBoundBuf);
    EXPECT_EQ(client.getHostBoundBuffer(255), client.mHostBoundBuf);
    EXPECT_EQ(client.getHostBoundBuffer(256), client.mHostBoundBuf);
    EXPECT_EQ(client.getHostBoundBuffer(257), nullptr);
    EXPECT_EQ(client.processRequest(client.mHostBoundBuf, 257), nullptr);
    EXPECT_EQ(countEvents(VmsgDeviceEventKind::SendReceive), 0u) << "nothing is sent";

    std::vector<LoggedLine> lines = errors();
    ASSERT_EQ(lines.size(), 1u) << "processRequest refuses without a line of its own";
    EXPECT_EQ(lines[0].function, kGetHostBoundBuffer);
    EXPECT_EQ(lines[0].text, std::string(kGetHostBoundBuffer) + ":" +
                                 std::to_string(lines[0].line) + " len 257, mMaxHostBoundSize 256");
    EXPECT_EQ(calledFor(log.lines(XLOG_MODULE_VMSG)[0], "hcal"),
              log.lines(XLOG_MODULE_VMSG)[0].text);
}

TEST_F(VmsgGuestClientTest, GetHostBoundBuffer_BeforeConnect_RefusesEveryRequest) {
    EXPECT_EQ(client.mFd, -1);
    EXPECT_EQ(client.mMaxHostBoundSize, 0u);
    EXPECT_EQ(client.mHostBoundBuf, nullptr);
    EXPECT_EQ(client.mServiceName, "");
    EXPECT_EQ(client.getHostBoundBuffer(1), nullptr);
    EXPECT_EQ(client.getHostBoundBuffer(0), nullptr) << "there is no buffer to hand out";
    EXPECT_EQ(client.processRequest(nullptr, 0), nullptr);
    EXPECT_EQ(vmsgDeviceEvents().size(), 0u) << "nothing reaches a device that was never opened";
    ASSERT_FALSE(errors().empty());
    EXPECT_EQ(errors()[0].text, std::string(kGetHostBoundBuffer) + ":" +
                                    std::to_string(errors()[0].line) +
                                    " len 1, mMaxHostBoundSize 0");
}

TEST_F(VmsgGuestClientTest, Disconnect_WhenConnected_ReleasesDeviceAndKeepsTheRecord) {
    ASSERT_TRUE(client.connect(kHcal));
    const VmsgGuestClient& c = client;
    void* host = c.mHostBoundBuf;
    uint32_t capacity = c.mMaxHostBoundSize;
    vmsgDeviceReset();
    log.clear();

    client.disconnect();

    std::vector<VmsgDeviceEvent> events = vmsgDeviceEvents();
    ASSERT_EQ(events.size(), 2u);
    EXPECT_EQ(events[0].kind, VmsgDeviceEventKind::Disconnect);
    EXPECT_EQ(events[0].request, 0x7602UL);
    EXPECT_EQ(events[1].kind, VmsgDeviceEventKind::Close);
    EXPECT_EQ(vmsgDeviceOpenCount(), 0u);
    EXPECT_EQ(client.mFd, -1);
    EXPECT_EQ(client.mHostBoundBuf, host) << "pointers keep their values";
    EXPECT_EQ(client.mMaxHostBoundSize, capacity) << "sizes keep their values";
    EXPECT_EQ(client.mServiceName, "hcal");
    ASSERT_EQ(log.lines(XLOG_MODULE_VMSG).size(), 1u);
    EXPECT_EQ(log.lines(XLOG_MODULE_VMSG)[0].text,
              calledFor(log.lines(XLOG_MODULE_VMSG)[0], "hcal"));
    EXPECT_EQ(log.lines(XLOG_MODULE_VMSG)[0].function, kDisconnect);

    // Regression: capacities outlive a disconnect, so an exchange was let
    // through onto an unmapped buffer and a closed descriptor.
    vmsgDeviceReset();
    EXPECT_EQ(client.getHostBoundBuffer(16), nullptr);
    EXPECT_EQ(client.processRequest(nullptr, 16), nullptr);
    client.disconnect();
    EXPECT_EQ(vmsgDeviceEvents().size(), 0u) << "nothing more reaches the device";
}

// The connection failures, one row each: the error line, and the client left
// unconnected with no descriptor behind. The last two rows guard regressions:
// a mapping length that wrapped in 32 bits mapped a sliver, and a host-bound
// capacity beyond the mapping let requests run past its end; neither layout
// reaches mmap, so neither may say that mmap failed.
TEST_F(VmsgGuestClientTest, Connect_WhenAStepFails_ReportsAndStaysUnconnected) {
    struct Row {
        const char* what;
        std::function<void(VmsgDeviceScript&)> fault;
        VmsgServiceId id;
        std::string line;  // after "<signature>: service "
    };
    const std::string e = ", errno ";
    const std::string layout = "impossible buffer layout: mMaxHostBoundSize ";
    const Row rows[] = {
        {"open", [](VmsgDeviceScript& s) { s.openErrno = ENOENT; }, kHcal,
         "hcal: open failed for /dev/kivvmsg"},
        {"connect", [](VmsgDeviceScript& s) { s.connectErrno = EIO; }, kHcal,
         "hcal: connection ioctl failed: ret -1, errno 5"},
        {"unknown service", [](VmsgDeviceScript&) {}, 0x64636261,
         "abcd: connection ioctl failed: ret -1" + e + std::to_string(ECONNREFUSED)},
        {"empty name", [](VmsgDeviceScript&) {}, 0x6C616300,
         ": connection ioctl failed: ret -1" + e + std::to_string(ECONNREFUSED)},
        {"mmap",
         [](VmsgDeviceScript& s) {
             s.guestBoundOffset = 4096;
             s.guestBoundCapacity = 4096;
             s.mmapFails = true;
         },
         kHcal, "hcal: mmap() failed: size 8192" + e + std::to_string(EPERM)},
        {"wrapping length",
         [](VmsgDeviceScript& s) {
             s.guestBoundOffset = 0xFFFFF000;
             s.guestBoundCapacity = 0x2000;
         },
         kHcal, "hcal: " + layout + "4096, mMaxGuestBoundSize 8192, mGuestBoundOffset 4294963200"},
        {"host-bound beyond mapping",
         [](VmsgDeviceScript& s) {
             s.hostBoundCapacity = 65536;
             s.guestBoundOffset = 256;
             s.guestBoundCapacity = 256;
         },
         kHcal, "hcal: " + layout + "65536, mMaxGuestBoundSize 256, mGuestBoundOffset 256"},
    };
    for (const Row& row : rows) {
        VmsgGuestClient fresh;
        VmsgDeviceScript script;
        script.hostBoundCapacity = 4096;
        row.fault(script);
        vmsgDeviceReset();
        configure(script);
        log.clear();

        EXPECT_FALSE(fresh.connect(row.id)) << row.what;
        EXPECT_EQ(fresh.mFd, -1) << row.what;
        EXPECT_EQ(vmsgDeviceOpenCount(), 0u) << row.what << ": the device is closed again";
        ASSERT_EQ(errors().size(), 1u) << row.what;
        EXPECT_EQ(errors()[0].text, std::string(kConnect) + ": service " + row.line) << row.what;
        EXPECT_EQ(errors()[0].file, kSource);
        EXPECT_EQ(fresh.getHostBoundBuffer(16), nullptr)
            << row.what << ": capacities left by a failed connect do not make it connected";
    }
}

TEST_F(VmsgGuestClientTest, Connect_AfterFailure_KeepsNewNameAndOutWords) {
    EXPECT_FALSE(client.connect(0x64636261));
    VmsgDeviceScript script;
    script.mmapFails = true;
    script.hostBoundCapacity = 1234;
    configure(script);
    log.clear();

    EXPECT_FALSE(client.connect(kHcal));
    EXPECT_EQ(log.texts(XLOG_MODULE_VMSG)[0], calledFor(log.lines(XLOG_MODULE_VMSG)[0], "abcd"))
        << "the trace names the service of the earlier call";
    EXPECT_EQ(client.mServiceName, "hcal");
    EXPECT_EQ(client.mMaxHostBoundSize, 1234u) << "out-words of a successful CONNECT stay";
}

TEST_F(VmsgGuestClientTest, ProcessRequest_WhenSendReceiveFails_ReportsAndReturnsNull) {
    VmsgDeviceScript script;
    script.sendErrno = EIO;
    configure(script);
    ASSERT_TRUE(client.connect(kHcal));
    const std::vector<uint8_t> request = bytes({29, 0, 0, 0, 8, 0, 0, 0});
    std::memcpy(client.getHostBoundBuffer(8), request.data(), request.size());

    EXPECT_EQ(client.processRequest(client.mHostBoundBuf, 8), nullptr);
    EXPECT_GE(client.mFd, 0) << "a failed exchange changes nothing in the record";
    ASSERT_EQ(errors().size(), 1u);
    EXPECT_EQ(errors()[0].text, std::string(kProcessRequest) +
                                    ": service hcal: SEND_RECEIVE ioctl failed: ret -1, errno 5");
    EXPECT_EQ(errors()[0].function, kProcessRequest);
}

}  // namespace
