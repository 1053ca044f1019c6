// Any host call with drawn arguments, under a drawn layout and reply (proper, cut, noise, raw
// or failed): the request follows the wire rules, the guest hands back the guest-bound bytes
// and stays inside its buffers. A failed expectation aborts, so libFuzzer keeps the input.
#include <errno.h>
#include <fuzzer/FuzzedDataProvider.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "FuzzCheck.h"
#include "hcall/DeviceSession.h"
#include "support/HcallInvoke.h"
#include "support/LogRecorder.h"

namespace {

using fuzz::expect;

struct Arg {
    std::string text;   // Str: no NUL inside, so c_str() holds all of it
    int32_t value = 0;  // I32; after a Buf it is that buffer's length
    bool flag = false;
    std::unique_ptr<char[]> buffer;  // Buf: exactly its size, so ASan sees any access past it
    std::string before;              // Buf: what it held before the call
    int32_t outI32 = 0x5A5A5A5A;     // filled ones start so, to show an unanswered call left them
    uint64_t outU64 = 0x5A5A5A5A5A5A5A5AULL;
    const void* filled = nullptr;  // Buf, OutI32, OutU64: where the reply's data goes
    uint32_t size = 0;             // and how many bytes of it
    uint32_t word = 0;             // the parameter's first word in the request
};

struct Call {
    const hcall::OpInfo* op = nullptr;
    Arg args[hcall::kMaxParams];

    template <hcall::Kind K>
    auto get(size_t i) {
        if constexpr (K == hcall::Str) return args[i].text.c_str();
        if constexpr (K == hcall::I32) return args[i].value;
        if constexpr (K == hcall::Bool) return args[i].flag;
        if constexpr (K == hcall::Buf) return args[i].buffer.get();
        if constexpr (K == hcall::OutI32) return &args[i].outI32;
        if constexpr (K == hcall::OutU64) return &args[i].outU64;
    }
};

// Draws the call and lays out its request; no reply fits a negative buffer length.
std::vector<uint8_t> drawCall(FuzzedDataProvider& in, Call& call, uint64_t& replySize) {
    const hcall::OpInfo& op =
        *(call.op = hcall::findOp(in.ConsumeIntegralInRange<uint32_t>(1, hcall::kNumOps)));
    for (int i = 0; i < op.numParams; ++i) {
        Arg& a = call.args[i];
        if (op.params[i] == hcall::Str) a.text = in.ConsumeRandomLengthString(300).c_str();
        if (op.params[i] == hcall::Str) a.word = uint32_t(a.text.size() + 1);
        if (op.params[i] == hcall::Bool) a.word = a.flag = in.ConsumeBool();
        if (op.params[i] == hcall::I32)
            a.word = uint32_t(a.value = i > 0 && op.params[i - 1] == hcall::Buf
                                            ? in.ConsumeIntegralInRange<int32_t>(-2, 200)
                                            : in.ConsumeIntegral<int32_t>());
        if (op.params[i] == hcall::OutI32) a.filled = &a.outI32, a.word = a.size = 4;
        if (op.params[i] == hcall::OutU64) a.filled = &a.outU64, a.word = a.size = 8;
    }
    std::vector<uint8_t> out(8);
    replySize = 4;
    for (int i = 0; i < op.numParams; ++i) {
        Arg& a = call.args[i];
        if (op.params[i] == hcall::Buf) {  // every length follows its buffer
            a.word = uint32_t(call.args[i + 1].value);
            a.before = in.ConsumeBytesAsString(std::max(int32_t(a.word), 0));
            a.before.resize(a.size = std::max(int32_t(a.word), 0), '\0');
            a.buffer.reset(new char[a.size]);
            std::copy(a.before.begin(), a.before.end(), a.buffer.get());
            a.filled = a.buffer.get();
            replySize += int32_t(a.word) < 0 ? 1ULL << 40 : 0;
        }
        for (int b = 0; b < 4; ++b) out.push_back(uint8_t(a.word >> (8 * b)));
        if (op.params[i] == hcall::Str)
            out.insert(out.end(), a.text.c_str(), a.text.c_str() + a.word);
        replySize += a.size;
    }
    for (int b = 0; b < 4; ++b) out[b] = uint8_t(op.code >> (8 * b));
    for (int b = 0; b < 4; ++b) out[4 + b] = uint8_t(out.size() >> (8 * b));
    return out;
}

VmsgDeviceScript drawScript(FuzzedDataProvider& in) {
    VmsgDeviceScript s;
    // Room for any call; tight, to meet the limits; or any placement, even overlapping.
    const int layout = in.ConsumeIntegralInRange<int>(0, 2);
    const uint32_t most = layout == 0 ? 4096 : layout == 1 ? 400 : 8192;
    s.hostBoundCapacity = layout == 0 ? most : in.ConsumeIntegralInRange<uint32_t>(0, most);
    s.guestBoundCapacity = layout == 0 ? most : in.ConsumeIntegralInRange<uint32_t>(0, most);
    if (layout == 2) s.guestBoundOffset = in.ConsumeIntegralInRange<uint32_t>(0, 12288);
    s.replyMode = static_cast<VmsgDeviceReplyMode>(in.ConsumeIntegralInRange<int>(0, 3));
    s.shortReplyBytes = in.ConsumeIntegralInRange<uint32_t>(0, 80);
    s.rawReply = in.ConsumeBytes<uint8_t>(in.ConsumeIntegralInRange<size_t>(0, 96));
    s.defaultResult = in.ConsumeIntegral<int32_t>();
    s.launchAllowed = in.ConsumeBool();
    s.propsText = in.ConsumeRandomLengthString(48);
    s.propsValue = in.ConsumeIntegral<int32_t>();
    s.timeValue = in.ConsumeIntegral<uint64_t>();
    s.timeText = in.ConsumeRandomLengthString(48);
    if (in.ConsumeIntegralInRange<int>(0, 15) == 0) s.sendErrno = EIO;
    return s;
}

void callOnce(FuzzedDataProvider& in, bool connected) {
    Call call;
    uint64_t replySize = 0;
    const std::vector<uint8_t> request = drawCall(in, call, replySize);
    const VmsgGuestClient& c = g_hcall.client;
    const bool fits =
        connected && request.size() <= c.mMaxHostBoundSize && replySize <= c.mMaxGuestBoundSize;
    const size_t before = vmsgDeviceExchanges().size();
    const int64_t result = hcalltest::invokeExported(call.op->code, call);
    const std::vector<VmsgDeviceExchange> after = vmsgDeviceExchanges();
    expect(after.size() == before + fits, "a call within the limits makes one exchange, else none");
    expect(!fits || (after.back().request == request && after.back().wellFormed),
           "the request bytes follow the wire rules");
    // Unasked or unanswered: -1 (the launch query: true), the caller's storage as it was.
    if (!fits || after.back().sendErrno != 0) {
        expect(result == (call.op->result == hcall::Flag ? 1 : -1), "unanswered returns -1");
        for (const Arg& a : call.args)
            expect(std::equal(a.before.begin(), a.before.end(), a.buffer.get()) &&
                       a.outI32 == Arg().outI32 && a.outU64 == Arg().outU64,
                   "an unanswered call leaves the caller's storage alone");
        return;
    }
    // Filled data, then the result: whatever the guest-bound buffer holds, even stale.
    const auto* reply = static_cast<const uint8_t*>(c.mGuestBoundBuf);
    for (const Arg& a : call.args) {
        expect(a.size == 0 || std::memcmp(a.filled, reply, a.size) == 0,
               "filled data is the reply's");
        reply += a.size;
    }
    int32_t last;
    std::memcpy(&last, reply, 4);
    expect(result == (call.op->result == hcall::Flag ? reply[0] != 0 : last),
           "the result is the reply's last field");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static LogRecorder log;  // formats every line in full, so ASan sees what each reads
    log.clear();
    FuzzedDataProvider in(data, size);
    const bool connected = HcallSession::start(drawScript(in));
    for (int calls = 0; calls < 3 && in.remaining_bytes() > 0; ++calls) callOnce(in, connected);
    return 0;
}
