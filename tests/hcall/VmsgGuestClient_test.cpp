// The message-device client against the device model: the connection as the
// device sees it, the shared mapping, its lines, and every failure it survives.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>

#include <cerrno>
#include <string>

#include "DeviceSession.h"
#include "support/LogRecorder.h"
#include "vmsg/guest/VmsgGuest.h"

namespace {

constexpr char kConnect[] = "bool VmsgGuestClient::connect(VmsgServiceId)";
constexpr VmsgServiceId kHcal = 0x6C616368;

// "<function>:<line> <text>", as the lines that lead with "%s:%d" read.
std::string at(const LoggedLine& line, const std::string& text) {
    return line.function + ":" + std::to_string(line.line) + " " + text;
}

TEST(VmsgGuestClient, ConnectThenDisconnect_FollowTheDevice) {
    LogRecorder log;
    VmsgGuestClient c;
    VmsgDeviceScript script;
    script.hostBoundCapacity = 4096;
    script.guestBoundCapacity = 2048;
    script.spare = 0xA5A5A5A5;
    script.guestBoundOffset = 8192;
    vmsgDeviceReset();
    vmsgDeviceConfigure(script);
    ASSERT_TRUE(c.connect(kHcal));
    EXPECT_EQ(std::pair(c.mSpare, c.mGuestBoundOffset), std::pair(0xA5A5A5A5u, 8192u));
    EXPECT_EQ(static_cast<char*>(c.mGuestBoundBuf), static_cast<char*>(c.mHostBoundBuf) + 8192);
    std::vector<VmsgDeviceEvent> events = vmsgDeviceEvents();
    ASSERT_EQ(events.size(), 2u);
    EXPECT_EQ(std::pair(events[0].kind, events[0].openFlags),
              std::pair(VmsgDeviceEventKind::Open, O_RDWR));
    EXPECT_EQ(std::pair(events[1].kind, events[1].request),
              std::pair(VmsgDeviceEventKind::Connect, 0xC0147601UL));
    const std::array<uint8_t, 20> in = {0x68, 0x63, 0x61, 0x6C};
    EXPECT_EQ(events[1].connectIn, in) << "service id, then 16 zero bytes";
    std::vector<LoggedLine> trace = log.lines(XLOG_MODULE_VMSG);
    ASSERT_EQ(trace.size(), 2u);
    for (const LoggedLine& line : trace)
        EXPECT_EQ(levelLetter(line.level) + line.file + " " + line.function,
                  "ISource/vmsg/guest/VmsgGuest " + std::string(kConnect));
    EXPECT_EQ(trace[0].text, at(trace[0], "called for \n")) << "the name is not yet known";
    EXPECT_EQ(trace[1].text,
              at(trace[1], "mMaxHostBoundSize 4096, mMaxGuestBoundSize 2048 service hcal"));

    void* host = c.mHostBoundBuf;
    vmsgDeviceReset();
    log.clear();
    c.disconnect();
    c.disconnect();
    events = vmsgDeviceEvents();
    ASSERT_EQ(events.size(), 2u) << "the second disconnect reaches nothing";
    EXPECT_EQ(std::pair(events[0].kind, events[0].request),
              std::pair(VmsgDeviceEventKind::Disconnect, 0x7602UL));
    EXPECT_EQ(events[1].kind, VmsgDeviceEventKind::Close);
    EXPECT_NE(msync(static_cast<char*>(host) + 8192, 4096, MS_ASYNC), 0) << "all of it unmapped";
    trace = log.lines(XLOG_MODULE_VMSG);
    ASSERT_EQ(trace.size(), 2u) << "each disconnect prints its called-for line";
    EXPECT_EQ(trace[1].function, "void VmsgGuestClient::disconnect()");
    EXPECT_EQ(trace[1].text, at(trace[1], "called for hcal\n"));
}

// Capacity 256. processRequest refuses silently: getHostBoundBuffer has said why.
TEST(VmsgGuestClient, Exchange_OfEachLengthAndState_IsServedOrRefused) {
    enum State { Unconnected, Connected, Disconnected };
    const struct {
        const char* name;
        State state;
        bool process;  // processRequest rather than getHostBoundBuffer
        uint32_t len;
        bool served;
        std::string error;  // after "<signature>:<line> " or "<signature>: service <name>: "
    } rows[] = {
        {"buffer of 0 bytes", Connected, false, 0, true, ""},
        {"request one over capacity", Connected, true, 257, false, ""},
        {"buffer before connect", Unconnected, false, 1, false, "len 1, mMaxHostBoundSize 0"},
        {"empty buffer before connect", Unconnected, false, 0, false, "not connected"},
        // Regression: capacities outlive a disconnect, and let an exchange onto the unmapped
        // buffer.
        {"buffer after disconnect", Disconnected, false, 16, false, "not connected"},
        {"request after disconnect", Disconnected, true, 16, false, ""},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        VmsgGuestClient c;
        vmsgDeviceReset();
        vmsgDeviceConfigure(scriptWith([](VmsgDeviceScript& s) { s.hostBoundCapacity = 256; }));
        ASSERT_TRUE(row.state == Unconnected || c.connect(kHcal));
        if (row.state == Disconnected) c.disconnect();
        LogRecorder log;
        void* got =
            row.process ? c.processRequest(nullptr, row.len) : c.getHostBoundBuffer(row.len);
        const std::vector<LoggedLine> lines = log.lines(XLOG_MODULE_VMSG);  // trace, error
        if (c.mFd >= 0) c.disconnect();
        EXPECT_EQ(got, row.served ? c.mHostBoundBuf : nullptr);
        EXPECT_EQ(vmsgDeviceExchanges().size(), 0u) << "nothing reaches the device";
        ASSERT_EQ(lines.size(), row.error.empty() ? 1u : 2u);
        EXPECT_EQ(lines[0].level, XLOG_LEVEL_I);
        EXPECT_EQ(lines[0].function, row.process
                                         ? "void *VmsgGuestClient::processRequest(void *, uint32_t)"
                                         : "void *VmsgGuestClient::getHostBoundBuffer(uint32_t)");
        EXPECT_EQ(lines[0].text, at(lines[0], "called for " + c.mServiceName + "\n"));
        if (lines.size() < 2) continue;
        const LoggedLine& error = lines[1];
        EXPECT_EQ(std::pair(error.level, error.function),
                  std::pair(+XLOG_LEVEL_E, lines[0].function));
        const std::string service = error.function + ": service " + c.mServiceName + ": ";
        EXPECT_TRUE(error.text == at(error, row.error) || error.text == service + row.error)
            << error.text;
    }
}

// Each failing step after a failed connect to "abcd": its line, no descriptor left, the new
// name and a successful CONNECT's out-words kept. Regressions: a length wrapping in 32 bits
// mapped a sliver, a host-bound capacity past the mapping let requests overrun it.
TEST(VmsgGuestClient, Connect_WhenAStepFails_ReportsAndStaysUnconnected) {
    const std::string refused =
        "connection ioctl failed: ret -1, errno " + std::to_string(ECONNREFUSED);
    const std::string layout = "hcal: impossible buffer layout: mMaxHostBoundSize ";
    const struct {
        const char* name;
        ScriptTweak tweak;
        VmsgServiceId id;
        std::string line;        // after "<signature>: service "
        uint32_t hostBoundSize;  // what the record holds afterwards
    } rows[] = {
        {"open", [](VmsgDeviceScript& s) { s.openErrno = ENOENT; }, kHcal,
         "hcal: open failed for /dev/kivvmsg", 0},
        {"connect", [](VmsgDeviceScript& s) { s.connectErrno = EIO; }, kHcal,
         "hcal: connection ioctl failed: ret -1, errno 5", 0},
        {"unknown service", nullptr, 0x64636261, "abcd: " + refused, 0},
        {"empty name", nullptr, 0x6C616300, ": " + refused, 0},
        {"mmap",
         [](VmsgDeviceScript& s) {
             s.hostBoundCapacity = s.guestBoundOffset = s.guestBoundCapacity = 4096;
             s.mmapFails = true;
         },
         kHcal, "hcal: mmap() failed: size 8192, errno " + std::to_string(EPERM), 4096},
        {"wrapping length",
         [](VmsgDeviceScript& s) {
             s.guestBoundOffset = 0xFFFFF000, s.guestBoundCapacity = 0x2000;
         },
         kHcal, layout + "65536, mMaxGuestBoundSize 8192, mGuestBoundOffset 4294963200", 65536},
        {"host-bound beyond mapping",
         [](VmsgDeviceScript& s) { s.guestBoundOffset = s.guestBoundCapacity = 256; }, kHcal,
         layout + "65536, mMaxGuestBoundSize 256, mGuestBoundOffset 256", 65536},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        VmsgGuestClient c;
        vmsgDeviceReset();
        EXPECT_FALSE(c.connect(0x64636261));
        vmsgDeviceConfigure(scriptWith(row.tweak));  // a host-bound capacity of 65536
        LogRecorder log;
        EXPECT_FALSE(c.connect(row.id));
        EXPECT_EQ(std::tuple(c.mFd, vmsgDeviceOpenCount(), c.mMaxHostBoundSize),
                  std::tuple(-1, 0u, row.hostBoundSize))
            << "the device is closed again";
        EXPECT_EQ(c.mServiceName, row.line.substr(0, row.line.find(':')));
        // The called-for line, the capacities when CONNECT succeeded, the error.
        const std::vector<LoggedLine> lines = log.lines(XLOG_MODULE_VMSG);
        ASSERT_EQ(lines.size(), row.hostBoundSize ? 3u : 2u);
        EXPECT_EQ(lines[0].text, at(lines[0], "called for abcd\n")) << "the earlier call's name";
        EXPECT_EQ(lines[0].level * 10 + lines.back().level, XLOG_LEVEL_I * 10 + XLOG_LEVEL_E);
        EXPECT_EQ(lines.back().text, std::string(kConnect) + ": service " + row.line);
    }
}

}  // namespace
