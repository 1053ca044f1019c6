// Any host-call operation with arguments drawn from the input (strings of any
// bytes but NUL, any ints and bools, buffer lengths around zero) against the
// device model, under a layout and a reply the input chooses: proper, cut,
// noise over the guest-bound buffer, raw bytes, or a failed exchange. The
// request must follow the wire rules, what the guest hands back must be the
// guest-bound buffer's bytes, and the guest must stay inside its buffers and
// the caller's storage.
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
    const hcall::OpInfo& op =
        *(call.op = hcall::findOp(in.ConsumeIntegralInRange<uint32_t>(1, hcall::kNumOps)));
    for (int i = 0; i < op.numParams; ++i) {
        Arg& a = call.args[i];
        a.kind = op.params[i];
        if (a.kind == hcall::Str) a.text = in.ConsumeRandomLengthString(300).c_str();
        if (a.kind == hcall::Bool) a.flag = in.ConsumeBool();
        if (a.kind == hcall::I32)
            a.value = i > 0 && op.params[i - 1] == hcall::Buf
                          ? in.ConsumeIntegralInRange<int32_t>(-2, 200)  // the buffer's length
                          : in.ConsumeIntegral<int32_t>();
    }
    for (int i = 0; i < op.numParams; ++i) {  // every length follows its buffer
        Arg& a = call.args[i];
        if (a.kind != hcall::Buf) continue;
        a.before = in.ConsumeBytesAsString(size_t(std::max(call.args[i + 1].value, 0)));
        a.before.resize(size_t(std::max(call.args[i + 1].value, 0)), '\0');
        a.buffer.reset(new char[a.before.size()]);
        std::copy(a.before.begin(), a.before.end(), a.buffer.get());
    }
}

void put32(std::vector<uint8_t>& out, uint32_t v) {
    for (int i = 0; i < 4; ++i) out.push_back(uint8_t(v >> (8 * i)));
}

// The request as the wire rules lay it out; no reply fits a negative length.
std::vector<uint8_t> referenceRequest(const Call& call, uint64_t& replySize) {
    std::vector<uint8_t> out;
    put32(out, call.op->code);
    put32(out, 0);
    replySize = 4;
    bool negative = false;
    for (int i = 0; i < call.op->numParams; ++i) {
        const Arg& a = call.args[i];
        const int32_t length = a.kind == hcall::Buf ? call.args[i + 1].value : 0;
        const uint32_t sizes[] = {
            uint32_t(a.text.size() + 1), uint32_t(a.value), a.flag, uint32_t(length), 4, 8};
        put32(out, sizes[a.kind]);
        if (a.kind == hcall::Str) out.insert(out.end(), a.text.c_str(), a.text.c_str() + sizes[0]);
        if (a.kind >= hcall::Buf)
            replySize += a.kind == hcall::Buf ? uint64_t(length) : sizes[a.kind];
        negative = negative || length < 0;
    }
    if (negative) replySize = UINT64_MAX;
    for (int i = 0; i < 4; ++i) out[4 + i] = uint8_t(out.size() >> (8 * i));
    return out;
}

VmsgDeviceScript drawScript(FuzzedDataProvider& in) {
    VmsgDeviceScript s;
    switch (in.ConsumeIntegralInRange<int>(0, 2)) {
        case 0:  // room for any call the input can make
            s.hostBoundCapacity = s.guestBoundCapacity = 4096;
            break;
        case 1:  // tight: requests and replies meet their limits
            s.hostBoundCapacity = in.ConsumeIntegralInRange<uint32_t>(0, 400);
            s.guestBoundCapacity = in.ConsumeIntegralInRange<uint32_t>(0, 400);
            break;
        default:  // any placement, overlapping buffers included
            s.hostBoundCapacity = in.ConsumeIntegralInRange<uint32_t>(0, 8192);
            s.guestBoundCapacity = in.ConsumeIntegralInRange<uint32_t>(0, 8192);
            s.guestBoundOffset = in.ConsumeIntegralInRange<uint32_t>(0, 12288);
    }
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

LogRecorder* gLog = nullptr;

// Host-call exit lines since the last clear.
std::vector<std::string> exitLines() {
    std::vector<std::string> found;
    for (const std::string& text : gLog->texts(XLOG_MODULE_HCALL))
        if (text.rfind("returning [", 0) == 0) found.push_back(text);
    return found;
}

// Unasked or unanswered: -1 (the launch query: true), no exit line, and the
// caller's storage as it was.
void expectUnanswered(const Call& call, int64_t result) {
    expect(result == (call.op->result == hcall::Flag ? 1 : -1), "an unanswered call returns -1");
    expect(exitLines().empty(), "an unanswered call writes no exit line");
    for (const Arg& a : call.args)
        expect((a.kind != hcall::Buf ||
                std::equal(a.before.begin(), a.before.end(), a.buffer.get())) &&
                   a.outI32 == kUntouchedI32 && a.outU64 == kUntouchedU64,
               "an unanswered call leaves the caller's storage alone");
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
    gLog->clear();
    const int64_t result = hcalltest::invokeExported(call.op->code, call);
    const std::vector<VmsgDeviceExchange> after = vmsgDeviceExchanges();
    expect(after.size() == before + fits, "a call within the limits makes one exchange, else none");
    if (fits) {
        expect(after.back().request == request, "the request bytes follow the wire rules");
        expect(after.back().wellFormed, "the host reads the request as well formed");
    }
    if (!fits || after.back().sendErrno != 0) return expectUnanswered(call, result);

    // Filled data in parameter order, then the result: whatever the guest-bound
    // buffer holds, which may be what earlier replies left.
    const auto* reply = static_cast<const uint8_t*>(c.mGuestBoundBuf);
    size_t pos = 0;
    for (const Arg& a : call.args) {
        if (a.kind < hcall::Buf) continue;
        const void* got = a.kind == hcall::Buf      ? static_cast<const void*>(a.buffer.get())
                          : a.kind == hcall::OutI32 ? static_cast<const void*>(&a.outI32)
                                                    : &a.outU64;
        const size_t size = a.kind == hcall::Buf      ? a.before.size()
                            : a.kind == hcall::OutI32 ? 4
                                                      : 8;
        expect(size == 0 || std::memcmp(got, reply + pos, size) == 0, "filled data is the reply's");
        pos += size;
    }
    int32_t shown = int32_t(fuzz::le32(reply + pos));
    if (call.op->result == hcall::Flag) shown = reply[pos];
    expect(result == (call.op->result == hcall::Flag ? shown != 0 : shown),
           "the result is the reply's last field");
    const std::string lead = "returning [" + std::to_string(shown) + "] from " + call.op->name;
    const std::vector<std::string> exits = exitLines();
    expect(exits.size() == 1 && exits[0].rfind(lead + "(", 0) == 0,
           "one exit line, showing the reply");
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    gLog = new LogRecorder();  // every line formatted in full, so ASan sees what each reads
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    FuzzedDataProvider in(data, size);
    const bool connected = HcallSession::start(drawScript(in));
    for (int calls = 0; calls < 3 && in.remaining_bytes() > 0; ++calls) callOnce(in, connected);
    return 0;
}
