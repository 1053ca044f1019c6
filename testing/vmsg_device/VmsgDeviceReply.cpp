// The scripted host's reply, or the broken one the script asks for instead.
#include <algorithm>
#include <cstring>
#include <random>
#include <vector>

#include "VmsgDeviceInternal.h"

namespace vmsgdev {
namespace {

// The script as a host: a result per operation, the filled data of
// operations 1 and 5.
class ScriptedHost : public HcallHandler {
  public:
    ScriptedHost(const VmsgDeviceScript& script, bool failed) : mScript(script), mFailed(failed) {}

    int32_t unhandled(const hcall::OpInfo& op) override {
        const bool flag = op.result == hcall::Flag;
        if (mFailed) return flag ? 0 : mScript.failureResult;
        const auto it = mScript.results.find(op.code);
        if (it != mScript.results.end()) return it->second;
        return flag ? int32_t(mScript.launchAllowed) : mScript.defaultResult;
    }
    int32_t hcallGetPropsRpc(char* buffer, int32_t length, int32_t* value) override {
        fill(buffer, length, mScript.propsText);
        *value = mScript.propsValue;
        return unhandled(hcall::kOps[hcall::kOp_hcallGetPropsRpc - 1]);
    }
    int32_t hcallGetTimeInfoRpc(uint64_t* time, char* buffer, int32_t length) override {
        *time = mScript.timeValue;
        fill(buffer, length, mScript.timeText);
        return unhandled(hcall::kOps[hcall::kOp_hcallGetTimeInfoRpc - 1]);
    }

  private:
    // A text as long as the buffer or longer arrives cut and unterminated.
    static void fill(char* buffer, int32_t length, const std::string& text) {
        std::memcpy(buffer, text.data(), std::min<size_t>(text.size(), size_t(length)));
    }

    const VmsgDeviceScript& mScript;
    bool mFailed;
};

uint32_t writeGarbage(uint8_t* out, uint32_t capacity, uint64_t seed) {
    std::mt19937_64 noise(seed);
    for (uint32_t i = 0; i < capacity; ++i) out[i] = uint8_t(noise() >> 56);
    return capacity;
}

}  // namespace

uint32_t writeReply(const VmsgDeviceScript& script, const uint8_t* request, uint32_t length,
                    HcallLimits limits, uint8_t* out, uint32_t capacity, uint64_t seed,
                    bool failed) {
    ScriptedHost host(script, failed);
    switch (script.replyMode) {
        case VmsgDeviceReplyMode::Garbage:
            return writeGarbage(out, capacity, seed);
        case VmsgDeviceReplyMode::Raw: {
            const size_t n = std::min<size_t>(script.rawReply.size(), capacity);
            if (n != 0) std::memcpy(out, script.rawReply.data(), n);
            return uint32_t(n);
        }
        case VmsgDeviceReplyMode::Short: {
            // The proper reply cut off: what lies past the cut stays as it was.
            std::vector<uint8_t> full(capacity);
            const size_t n = std::min<size_t>(
                hcallDispatch(host, request, length, full.data(), capacity, limits),
                script.shortReplyBytes);
            if (n != 0) std::memcpy(out, full.data(), n);
            return uint32_t(n);
        }
        case VmsgDeviceReplyMode::Scripted:
            break;
    }
    return uint32_t(hcallDispatch(host, request, length, out, capacity, limits));
}

}  // namespace vmsgdev
