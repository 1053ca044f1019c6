// Any host call with arguments drawn from the input against the device model,
// under a layout and a reply the input chooses (proper, cut, noise, raw, or a
// failed exchange): the request follows the wire rules, the guest hands back
// the guest-bound buffer's bytes, and it stays inside its buffers and the
// caller's storage. A failed expectation aborts, so libFuzzer keeps the input.
#include <errno.h>
#include <fuzzer/FuzzedDataProvider.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "hcall/DeviceSession.h"
#include "support/HcallInvoke.h"
#include "support/LogRecorder.h"

namespace {

void expect(bool ok, const char* what) {
    if (ok) return;
    std::fprintf(stderr, "fuzz expectation failed: %s\n", what);
    std::abort();
}

// What a filled i32 * and u64 * hold before the call, to show a call the host
// did not answer leaves them alone.
constexpr int32_t kUntouchedI32 = 0x5A5A5A5A;
constexpr uint64_t kUntouchedU64 = 0x5A5A5A5A5A5A5A5AULL;

struct Arg {
    hcall::Kind kind = hcall::I32;
    std::string text;   // Str: no NUL inside, so c_str() holds all of it
    int32_t value = 0;  // I32; after a Buf it is that buffer's length
    bool flag = false;
    std::unique_ptr<char[]> buffer;  // Buf: exactly its size, so ASan sees any access past it
    std::string before;              // Buf: what it held before the call
    int32_t outI32 = kUntouchedI32;
    uint64_t outU64 = kUntouchedU64;
    const void* filled = nullptr;  // Buf, OutI32, OutU64: where the reply's data goes
    uint32_t size = 0;             // and how many bytes of it
};

// A drawn call, handing its arguments to hcalltest::invokeExported.
struct Call {
    const hcall::OpInfo* op = nullptr;
    Arg args[hcall::kMaxParams];

    template <hcall::Kind K>
    auto get(size_t i) {
        Arg& a = args[i];
        if constexpr (K == hcall::Str) return a.text.c_str();
        if constexpr (K == hcall::I32) return a.value;
        if constexpr (K == hcall::Bool) return a.flag;
        if constexpr (K == hcall::Buf) return a.buffer.get();
        if constexpr (K == hcall::OutI32) return &a.outI32;
        if constexpr (K == hcall::OutU64) return &a.outU64;
    }
};

void drawCall(FuzzedDataProvider& in, Call& call) {
    call.op = hcall::findOp(in.ConsumeIntegralInRange<uint32_t>(1, hcall::kNumOps));
    const hcall::OpInfo& op = *call.op;
    for (int i = 0; i < op.numParams; ++i) {
        Arg& a = call.args[i];
        a.kind = op.params[i];
        if (a.kind == hcall::Str) a.text = in.ConsumeRandomLengthString(300).c_str();
        if (a.kind == hcall::Bool) a.flag = in.ConsumeBool();
        if (a.kind == hcall::I32)
            a.value = i > 0 && op.params[i - 1] == hcall::Buf
                          ? in.ConsumeIntegralInRange<int32_t>(-2, 200)  // the buffer's length
                          : in.ConsumeIntegral<int32_t>();
        if (a.kind == hcall::OutI32) a.filled = &a.outI32, a.size = 4;
        if (a.kind == hcall::OutU64) a.filled = &a.outU64, a.size = 8;
    }
    for (int i = 0; i < op.numParams; ++i) {  // every length follows its buffer
        Arg& a = call.args[i];
        if (a.kind != hcall::Buf) continue;
        const size_t size = size_t(std::max(call.args[i + 1].value, 0));
        a.before = in.ConsumeBytesAsString(size);
        a.before.resize(size, '\0');
        a.buffer.reset(new char[size]);
        std::copy(a.before.begin(), a.before.end(), a.buffer.get());
        a.filled = a.buffer.get(), a.size = uint32_t(size);
    }
}

void put32(std::vector<uint8_t>& out, uint32_t v) {
    for (int i = 0; i < 4; ++i) out.push_back(uint8_t(v >> (8 * i)));
}

// The request as the wire rules lay it out; no reply fits a negative length.
std::vector<uint8_t> referenceRequest(const Call& call, uint64_t& replySize) {
    std::vector<uint8_t> out;
    put32(out, call.op->code);
    put32(out, 0);  // totalLength, below
    replySize = 4;
    for (int i = 0; i < call.op->numParams; ++i) {
        const Arg& a = call.args[i];
        const int32_t n = a.kind == hcall::Buf ? call.args[i + 1].value : int32_t(a.size);
        put32(out, a.kind == hcall::Str    ? uint32_t(a.text.size() + 1)
                   : a.kind == hcall::I32  ? uint32_t(a.value)
                   : a.kind == hcall::Bool ? a.flag
                                           : uint32_t(n));
        if (a.kind == hcall::Str)
            out.insert(out.end(), a.text.c_str(), a.text.c_str() + a.text.size() + 1);
        replySize += n < 0 ? 1ULL << 40 : uint64_t(a.size);
    }
    for (int i = 0; i < 4; ++i) out[4 + i] = uint8_t(out.size() >> (8 * i));
    return out;
}

VmsgDeviceScript drawScript(FuzzedDataProvider& in) {
    VmsgDeviceScript s;
    const int layout = in.ConsumeIntegralInRange<int>(0, 2);
    // Room for any call; tight, so that requests and replies meet their limits;
    // or any placement, overlapping buffers included.
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
    drawCall(in, call);
    uint64_t replySize = 0;
    const std::vector<uint8_t> request = referenceRequest(call, replySize);
    const VmsgGuestClient& c = g_hcall.client;
    const bool fits =
        connected && request.size() <= c.mMaxHostBoundSize && replySize <= c.mMaxGuestBoundSize;
    const size_t before = vmsgDeviceExchanges().size();
    const int64_t result = hcalltest::invokeExported(call.op->code, call);
    const std::vector<VmsgDeviceExchange> after = vmsgDeviceExchanges();
    expect(after.size() == before + fits, "a call within the limits makes one exchange, else none");
    if (fits) {
        expect(after.back().request == request, "the request bytes follow the wire rules");
        expect(after.back().wellFormed, "the host reads the request as well formed");
    }
    // Unasked or unanswered: -1 (the launch query: true), the caller's storage as it was.
    if (!fits || after.back().sendErrno != 0) {
        expect(result == (call.op->result == hcall::Flag ? 1 : -1), "unanswered returns -1");
        for (const Arg& a : call.args)
            expect(std::equal(a.before.begin(), a.before.end(), a.buffer.get()) &&
                       a.outI32 == kUntouchedI32 && a.outU64 == kUntouchedU64,
                   "an unanswered call leaves the caller's storage alone");
        return;
    }
    // Filled data in parameter order, then the result: whatever the guest-bound
    // buffer holds, which may be what earlier replies left.
    const auto* reply = static_cast<const uint8_t*>(c.mGuestBoundBuf);
    size_t pos = 0;
    for (const Arg& a : call.args) {
        expect(a.size == 0 || std::memcmp(a.filled, reply + pos, a.size) == 0,
               "filled data is the reply's");
        pos += a.size;
    }
    int32_t last;
    std::memcpy(&last, reply + pos, 4);
    expect(result == (call.op->result == hcall::Flag ? reply[pos] != 0 : last),
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
