// Any host-call operation with argument values drawn from the input (strings
// of any bytes but NUL, any ints and bools, buffer lengths around zero)
// against the device model, under a layout and a reply chosen by the input:
// the proper reply, a cut one, noise over the whole guest-bound buffer, raw
// bytes, or a failed exchange. Checked against rules written here: the
// request against an encoding of the wire rules, and what the guest hands
// back against the bytes in the guest-bound buffer. The guest must stay
// inside its buffers and the caller's storage.
#include <errno.h>
#include <fuzzer/FuzzedDataProvider.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "FuzzCheck.h"
#include "VmsgDeviceModel.h"
#include "support/HcallInvoke.h"
#include "support/LogRecorder.h"

namespace {

using fuzz::expect;

// What a filled i32 * and u64 * hold before the call, so that a call the
// host did not answer can be seen to leave them alone.
constexpr int32_t kUntouchedI32 = 0x5A5A5A5A;
constexpr uint64_t kUntouchedU64 = 0x5A5A5A5A5A5A5A5AULL;

struct Arg {
    hcall::Kind kind = hcall::I32;
    std::string text;   // Str: cut at its first NUL, so c_str() holds all of it
    int32_t value = 0;  // I32; after a Buf it is that buffer's length
    bool flag = false;
    std::unique_ptr<char[]> buffer;  // Buf: exactly its size, so ASan sees any access past it
    std::string before;              // Buf: what it held before the call
    int32_t outI32 = kUntouchedI32;
    uint64_t outU64 = kUntouchedU64;
};

// A drawn call; hands its arguments to hcalltest::invokeExported.
struct Call {
    const hcall::OpInfo* op = nullptr;
    Arg args[hcall::kMaxParams];

    template <hcall::Kind K>
    auto get(size_t i) {
        Arg& a = args[i];
        if constexpr (K == hcall::Str) {
            return a.text.c_str();
        } else if constexpr (K == hcall::I32) {
            return a.value;
        } else if constexpr (K == hcall::Bool) {
            return a.flag;
        } else if constexpr (K == hcall::Buf) {
            return a.buffer.get();
        } else if constexpr (K == hcall::OutI32) {
            return &a.outI32;
        } else {
            return &a.outU64;
        }
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
    }
    for (int i = 0; i < op.numParams; ++i) {  // the catalogue puts every length after its buffer
        Arg& a = call.args[i];
        if (a.kind != hcall::Buf) continue;
        const size_t size = size_t(std::max(call.args[i + 1].value, 0));
        a.before = in.ConsumeBytesAsString(size);
        a.before.resize(size, '\0');
        a.buffer.reset(new char[size]);
        std::copy(a.before.begin(), a.before.end(), a.buffer.get());
    }
}

void put32(std::vector<uint8_t>& out, uint32_t v) {
    for (int i = 0; i < 4; ++i) out.push_back(uint8_t(v >> (8 * i)));
}

// The request as the wire rules lay it out, and the size of its reply.
std::vector<uint8_t> referenceRequest(const Call& call, uint64_t& replySize, bool& lengthsValid) {
    std::vector<uint8_t> out(8);
    replySize = 4;
    lengthsValid = true;
    for (int i = 0; i < call.op->numParams; ++i) {
        const Arg& a = call.args[i];
        if (a.kind == hcall::Str) {
            put32(out, uint32_t(a.text.size() + 1));
            out.insert(out.end(), a.text.c_str(), a.text.c_str() + a.text.size() + 1);
        }
        if (a.kind == hcall::I32) put32(out, uint32_t(a.value));
        if (a.kind == hcall::Bool) put32(out, a.flag ? 1 : 0);
        if (a.kind == hcall::Buf) {
            const int32_t length = call.args[i + 1].value;
            put32(out, uint32_t(length));
            lengthsValid = lengthsValid && length >= 0;
            replySize += uint64_t(std::max(length, 0));
        }
        if (a.kind == hcall::OutI32 || a.kind == hcall::OutU64) {
            const uint32_t size = a.kind == hcall::OutI32 ? 4 : 8;
            put32(out, size);
            replySize += size;
        }
    }
    std::vector<uint8_t> header;
    put32(header, call.op->code);
    put32(header, uint32_t(out.size()));
    std::copy(header.begin(), header.end(), out.begin());
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
            break;
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

// Host-call exit lines ("returning [%d] from ...") written since the last clear.
std::vector<std::string> exitLines() {
    std::vector<std::string> found;
    for (const std::string& text : gLog->texts(XLOG_MODULE_HCALL))
        if (text.rfind("returning [", 0) == 0) found.push_back(text);
    return found;
}

// The host was not asked or did not answer: -1 (the launch query: true), no
// exit line, and the caller's storage as it was.
void expectUnanswered(const Call& call, int64_t result) {
    expect(result == (call.op->result == hcall::Flag ? 1 : -1), "an unanswered call returns -1");
    expect(exitLines().empty(), "an unanswered call writes no exit line");
    for (int i = 0; i < call.op->numParams; ++i) {
        const Arg& a = call.args[i];
        expect(a.kind != hcall::Buf || std::equal(a.before.begin(), a.before.end(), a.buffer.get()),
               "an unanswered call leaves the buffer alone");
        expect(a.outI32 == kUntouchedI32 && a.outU64 == kUntouchedU64,
               "an unanswered call leaves the i32 * and u64 * alone");
    }
}

void callOnce(FuzzedDataProvider& in, bool connected) {
    Call call;
    drawCall(in, call);
    uint64_t replySize = 0;
    bool lengthsValid = false;
    const std::vector<uint8_t> request = referenceRequest(call, replySize, lengthsValid);
    const VmsgGuestClient& c = g_hcall.client;
    const bool fits = connected && lengthsValid && request.size() <= c.mMaxHostBoundSize &&
                      replySize <= c.mMaxGuestBoundSize;
    const size_t before = vmsgDeviceExchanges().size();
    gLog->clear();
    const int64_t result = hcalltest::invokeExported(call.op->code, call);
    const std::vector<VmsgDeviceExchange> after = vmsgDeviceExchanges();

    if (!fits) {
        expect(after.size() == before, "a call over a limit reaches no host");
        return expectUnanswered(call, result);
    }
    expect(after.size() == before + 1, "an accepted call makes one exchange");
    const VmsgDeviceExchange& x = after.back();
    expect(x.request == request, "the request bytes follow the wire rules");
    expect(x.wellFormed, "the host reads the request as well formed");
    if (x.sendErrno != 0) return expectUnanswered(call, result);

    // Later calls meet what earlier replies left: the reply is whatever the
    // guest-bound buffer holds.
    const auto* reply = static_cast<const uint8_t*>(c.mGuestBoundBuf);
    expect(x.reply.empty() || std::memcmp(x.reply.data(), reply, x.reply.size()) == 0,
           "the guest-bound buffer holds what the host wrote");
    size_t pos = 0;
    for (int i = 0; i < call.op->numParams; ++i) {
        const Arg& a = call.args[i];
        const void* got = a.kind == hcall::Buf      ? static_cast<const void*>(a.buffer.get())
                          : a.kind == hcall::OutI32 ? static_cast<const void*>(&a.outI32)
                                                    : &a.outU64;
        const size_t size = a.kind == hcall::Buf      ? a.before.size()
                            : a.kind == hcall::OutI32 ? 4
                                                      : 8;
        if (a.kind != hcall::Buf && a.kind != hcall::OutI32 && a.kind != hcall::OutU64) continue;
        expect(size == 0 || std::memcmp(got, reply + pos, size) == 0,
               "filled data is exactly its size of reply bytes, in parameter order");
        pos += size;
    }
    // The exit line shows the result; for the launch query, its byte's value.
    int32_t shown = int32_t(fuzz::le32(reply + pos));
    if (call.op->result == hcall::Flag) {
        expect(result == (reply[pos] != 0), "the launch answer is its field's first byte");
        shown = reply[pos];
    } else {
        expect(result == shown, "the result is the reply's last word");
    }
    const std::string lead =
        "returning [" + std::to_string(shown) + "] from " + call.op->name + "(";
    const std::vector<std::string> exits = exitLines();
    expect(exits.size() == 1 && exits[0].rfind(lead, 0) == 0, "one exit line, showing the reply");
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    gLog = new LogRecorder();  // every line formatted in full, so ASan sees what each reads
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    FuzzedDataProvider in(data, size);
    const VmsgDeviceScript script = drawScript(in);
    if (g_hcall.client.mFd >= 0) g_hcall.client.disconnect();
    vmsgDeviceReset();
    vmsgDeviceConfigure(script);
    const bool connected = hcallLibInitGuest() == XERR_SUCCESS;
    for (int calls = 0; calls < 3 && in.remaining_bytes() > 0; ++calls) callOnce(in, connected);
    return 0;
}
