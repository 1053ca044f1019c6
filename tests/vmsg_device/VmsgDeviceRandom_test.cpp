// The model's random host: occasional failures and pauses drawn from a seeded
// generator, and the served count a long run paces itself on.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "HcallDecoder.h"
#include "VmsgDeviceInternal.h"
#include "VmsgDeviceModel.h"
#include "vmsg/guest/VmsgDevice.h"

namespace {

// hcallOnLocaleChangedRpc("en-US") and hcallIsAppLaunchAllowedRpc("p").
const uint8_t kLocale[] = {0x0C, 0, 0, 0, 0x12, 0, 0, 0, 6, 0, 0, 0, 'e', 'n', '-', 'U', 'S', 0};
const uint8_t kLaunch[] = {0x18, 0, 0, 0, 0x0E, 0, 0, 0, 2, 0, 0, 0, 'p', 0};

// One connected descriptor with its mapping; what each exchange came to.
class Connected {
  public:
    Connected() {
        mFd = open(VMSG_DEVICE_PATH, O_RDWR);
        VmsgConnectArgs args{hcall::kServiceId, 0, 0, 0, 0};
        if (mFd < 0 || ioctl(mFd, VMSG_IOC_CONNECT, &args) != 0) return;
        mOffset = args.guestBoundOffset;
        mLength = size_t(args.guestBoundOffset) + args.maxGuestBoundSize;
        void* map = mmap(nullptr, mLength, PROT_READ | PROT_WRITE, MAP_SHARED, mFd, 0);
        if (map != MAP_FAILED) mMap = static_cast<uint8_t*>(map);
    }
    ~Connected() {
        if (mMap != nullptr) munmap(mMap, mLength);
        if (mFd >= 0) close(mFd);
    }
    bool ok() const { return mMap != nullptr; }

    // "E<errno>" for a failed SEND_RECEIVE, else the result word in decimal.
    std::string exchange(const uint8_t* request, size_t len) {
        std::memcpy(mMap, request, len);
        if (ioctl(mFd, VMSG_IOC_SEND_RECEIVE) != 0) return "E" + std::to_string(errno);
        int32_t result = 0;
        std::memcpy(&result, mMap + mOffset, sizeof result);
        return std::to_string(result);
    }

  private:
    int mFd = -1;
    uint8_t* mMap = nullptr;
    size_t mLength = 0;
    uint32_t mOffset = 0;
};

std::vector<std::string> run(Connected& c, int count, const VmsgDeviceScript& script) {
    vmsgDeviceReset();
    vmsgDeviceConfigure(script);
    std::vector<std::string> outcomes;
    for (int i = 0; i < count; ++i) outcomes.push_back(c.exchange(kLocale, sizeof kLocale));
    return outcomes;
}

TEST(VmsgDeviceRandom, Failures_WithASeed_FollowTheSharesAndRepeatExactly) {
    Connected c;
    ASSERT_TRUE(c.ok());
    VmsgDeviceScript script;
    script.failurePerMille = 200;
    script.failureResult = -7;
    script.sendFailurePerMille = 100;
    script.delayJitterUs = 20;
    script.randomSeed = 42;
    constexpr int kCount = 2000;
    const std::vector<std::string> first = run(c, kCount, script);

    int failed = 0, refused = 0, other = 0;
    for (const std::string& o : first) {
        if (o == "-7")
            ++failed;
        else if (o == "E" + std::to_string(EIO))
            ++refused;
        else if (o != "0")
            ++other;
    }
    // Binomial spreads are about 17 and 13 here; the bands are ten of them wide.
    EXPECT_NEAR(failed, kCount * 0.9 * 0.2, 170)
        << "about a fifth of what is sent answers the failure";
    EXPECT_NEAR(refused, kCount * 0.1, 130) << "about a tenth fails SEND_RECEIVE";
    EXPECT_EQ(other, 0) << "nothing but the result, the failure or EIO";
    EXPECT_EQ(vmsgDeviceServedCount(), uint64_t(kCount));

    script.record = false;
    EXPECT_EQ(run(c, kCount, script), first) << "the same seed gives the same run, recorded or not";
    EXPECT_EQ(vmsgDeviceServedCount(), uint64_t(kCount)) << "counted without any record";
    EXPECT_TRUE(vmsgDeviceWaitForServed(kCount, 0));
    EXPECT_FALSE(vmsgDeviceWaitForServed(kCount + 1, 1)) << "no more than were served";
    EXPECT_TRUE(vmsgDeviceExchanges().empty());

    script.randomSeed = 43;
    EXPECT_NE(run(c, kCount, script), first) << "another seed, another run";
    vmsgDeviceReset();
    EXPECT_EQ(vmsgDeviceServedCount(), 0u) << "a reset starts the count again";
}

TEST(VmsgDeviceRandom, Failure_OfAFlagOperation_AnswersFalse) {
    Connected c;
    ASSERT_TRUE(c.ok());
    vmsgDeviceReset();
    VmsgDeviceScript script;
    script.failurePerMille = 1000;
    vmsgDeviceConfigure(script);
    EXPECT_EQ(c.exchange(kLaunch, sizeof kLaunch), "0") << "a failed yes/no question reads as no";
    EXPECT_EQ(c.exchange(kLocale, sizeof kLocale), "5") << "the default failure result is XERR_IO";
    vmsgDeviceReset();
}

TEST(VmsgDeviceRandom, ScriptFromEnvironment_ReadsTheRandomHost) {
    const std::pair<const char*, const char*> vars[] = {
        {"VMSG_DEVICE_DELAY_JITTER_US", "30"}, {"VMSG_DEVICE_FAIL_PER_MILLE", "15"},
        {"VMSG_DEVICE_FAIL_RESULT", "-3"},     {"VMSG_DEVICE_SEND_FAIL_PER_MILLE", "1001"},
        {"VMSG_DEVICE_SEED", "0x1234567890"},
    };
    for (const auto& v : vars) setenv(v.first, v.second, 1);
    const VmsgDeviceScript s = vmsgdev::scriptFromEnvironment();
    for (const auto& v : vars) unsetenv(v.first);
    EXPECT_EQ(s.delayJitterUs, 30u);
    EXPECT_EQ(s.failurePerMille, 15u);
    EXPECT_EQ(s.failureResult, -3);
    EXPECT_EQ(s.sendFailurePerMille, 0u) << "a share above 1000 is ignored";
    EXPECT_EQ(s.randomSeed, 0x1234567890u);
}

}  // namespace
