// The device model's overlap detection, through the real system calls of this
// process. The library's thread tests and the bridge's soak prove that
// exchanges never overlap by this count, so a model that missed an overlap
// would hide exactly the fault they look for.
#include "vmsg/guest/VmsgDevice.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <atomic>
#include <cstring>
#include <future>
#include <thread>

#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallCatalogue.h"

namespace {

// hcallOnLocaleChangedRpc("en-US")
const uint8_t kLocale[] = {0x0C, 0, 0, 0, 0x12, 0, 0, 0, 6, 0, 0, 0, 'e', 'n', '-', 'U', 'S', 0};

// One connected descriptor with its mapping, the request already written.
class Connected {
  public:
    Connected() {
        mFd = open(VMSG_DEVICE_PATH, O_RDWR);
        VmsgConnectArgs args{hcall::kServiceId, 0, 0, 0, 0};
        if (mFd < 0 || ioctl(mFd, VMSG_IOC_CONNECT, &args) != 0) return;
        mLength = size_t(args.guestBoundOffset) + args.maxGuestBoundSize;
        void* map = mmap(nullptr, mLength, PROT_READ | PROT_WRITE, MAP_SHARED, mFd, 0);
        if (map == MAP_FAILED) return;
        mMap = static_cast<uint8_t*>(map);
        std::memcpy(mMap, kLocale, sizeof kLocale);
    }
    ~Connected() {
        if (mMap != nullptr) munmap(mMap, mLength);
        if (mFd >= 0) close(mFd);
    }
    bool ok() const { return mMap != nullptr; }
    int exchange() { return ioctl(mFd, VMSG_IOC_SEND_RECEIVE); }
    uint8_t* hostBound() { return mMap; }

  private:
    int mFd = -1;
    uint8_t* mMap = nullptr;
    size_t mLength = 0;
};

class VmsgDeviceOverlap : public ::testing::Test {
  protected:
    void SetUp() override { vmsgDeviceReset(); }
    void TearDown() override {
        vmsgDeviceSetHostHook({});
        vmsgDeviceReset();
    }
};

TEST_F(VmsgDeviceOverlap, SecondExchange_EnteringWhileTheFirstIsServed_IsCounted) {
    Connected c;
    ASSERT_TRUE(c.ok());
    std::promise<void> entered, release;
    std::shared_future<void> gate = release.get_future().share();
    std::atomic<int> calls{0};  // each exchange runs its own copy of the hook
    vmsgDeviceSetHostHook([&](uint32_t) {
        if (calls++ != 0) return;
        entered.set_value();
        gate.wait();
    });
    std::thread held([&] { EXPECT_EQ(c.exchange(), 0); });
    entered.get_future().wait();
    EXPECT_EQ(vmsgDeviceOverlapCount(), 0u) << "one exchange in flight is no overlap";
    EXPECT_EQ(c.exchange(), 0);
    release.set_value();
    held.join();
    EXPECT_EQ(vmsgDeviceOverlapCount(), 1u) << "the second exchange entered during the first";
    EXPECT_EQ(c.exchange(), 0);
    EXPECT_EQ(vmsgDeviceOverlapCount(), 1u) << "exchanges one after another do not overlap";
}

TEST_F(VmsgDeviceOverlap, Request_RewrittenWhileServed_IsCountedAndRecorded) {
    Connected c;
    ASSERT_TRUE(c.ok());
    vmsgDeviceSetHostHook([&c](uint32_t) { c.hostBound()[12] = 'E'; });
    EXPECT_EQ(c.exchange(), 0);
    EXPECT_EQ(vmsgDeviceOverlapCount(), 1u);
    ASSERT_EQ(vmsgDeviceExchanges().size(), 1u);
    EXPECT_TRUE(vmsgDeviceExchanges()[0].overlapped);
    EXPECT_EQ(vmsgDeviceExchanges()[0].text, "hcallOnLocaleChangedRpc(\"en-US\") -> 0")
        << "the host answers the request as it took it";
}

}  // namespace
