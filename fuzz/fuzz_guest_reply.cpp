// The guest reading whatever the host answers. The device model serves a
// layout and a reply chosen by the input (the proper reply, a cut one, noise
// over the whole guest-bound buffer, or raw bytes) to every operation, the
// filled buffers and the launch query among them. The guest must stay inside
// its buffers and return exactly what the guest-bound buffer holds.
#include <errno.h>

#include <vector>

#include "FuzzCalls.h"
#include "FuzzLogger.h"

namespace {

using fuzz::expect;

VmsgDeviceScript drawScript(FuzzedDataProvider& in) {
    VmsgDeviceScript s;
    switch (in.ConsumeIntegralInRange<int>(0, 2)) {
        case 0:  // room for any call the input can make
            s.hostBoundCapacity = s.guestBoundCapacity = 4096;
            break;
        case 1:  // tight: requests and replies meet their limits
            s.hostBoundCapacity = in.ConsumeIntegralInRange<uint32_t>(0, 160);
            s.guestBoundCapacity = in.ConsumeIntegralInRange<uint32_t>(0, 160);
            break;
        default:  // any placement, overlapping buffers included
            s.hostBoundCapacity = in.ConsumeIntegralInRange<uint32_t>(0, 8192);
            s.guestBoundCapacity = in.ConsumeIntegralInRange<uint32_t>(0, 8192);
            s.guestBoundOffset = in.ConsumeIntegralInRange<uint32_t>(0, 12288);
            s.spare = in.ConsumeIntegral<uint32_t>();
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

// What the device model wrote, as its own script says.
void checkDevice(const VmsgDeviceScript& s, const VmsgDeviceExchange& x) {
    const uint32_t cap = s.guestBoundCapacity;
    if (s.replyMode == VmsgDeviceReplyMode::Raw) {
        const size_t n = std::min<size_t>(s.rawReply.size(), cap);
        expect(
            x.reply.size() == n && std::equal(x.reply.begin(), x.reply.end(), s.rawReply.begin()),
            "a raw reply is the scripted bytes, cut to the guest-bound capacity");
    }
    if (s.replyMode == VmsgDeviceReplyMode::Garbage)
        expect(x.reply.size() == cap, "noise fills the whole guest-bound buffer");
    if (s.replyMode == VmsgDeviceReplyMode::Short)
        expect(x.reply.size() <= s.shortReplyBytes, "a short reply stays within its cut");
    expect(x.wellFormed, "the guest's request is well formed");
}

// One call, and what the guest returned against what lies in the reply.
void callOnce(FuzzedDataProvider& in, const VmsgDeviceScript& s, bool connected) {
    fuzz::Call call;
    fuzz::drawCall(in, in.ConsumeIntegralInRange<uint32_t>(1, hcall::kNumOps), call, 64, 96);
    const size_t before = vmsgDeviceExchanges().size();
    const int exitLinesBefore = fuzz::g_exitLines;
    const int64_t result = fuzz::invoke(call);
    const bool exitLine = fuzz::g_exitLines == exitLinesBefore + 1;
    const std::vector<VmsgDeviceExchange> after = vmsgDeviceExchanges();

    if (!fuzz::fits(call, connected)) {
        expect(after.size() == before, "a refused call reaches no host");
        expect(fuzz::g_exitLines == exitLinesBefore, "a refused call writes no exit line");
        fuzz::expectUntouched(call, result);
        return;
    }
    expect(after.size() == before + 1, "an accepted call makes one exchange");
    const VmsgDeviceExchange& x = after.back();
    if (x.sendErrno != 0) {
        expect(fuzz::g_exitLines == exitLinesBefore, "a failed exchange writes no exit line");
        fuzz::expectUntouched(call, result);
        return;
    }
    checkDevice(s, x);
    const auto* reply = static_cast<const uint8_t*>(g_hcall.client.mGuestBoundBuf);
    expect(x.reply.empty() || std::memcmp(x.reply.data(), reply, x.reply.size()) == 0,
           "the guest-bound buffer holds what the host wrote");

    size_t pos = 0;
    for (int i = 0; i < call.op->numParams; ++i) {
        const fuzz::Arg& a = call.args[i];
        if (a.kind == hcall::Buf) {
            const size_t size = a.bufferBefore.size();
            expect(size == 0 || std::memcmp(a.buffer.get(), reply + pos, size) == 0,
                   "a filled buffer gets exactly its capacity of reply bytes");
            pos += size;
        } else if (a.kind == hcall::OutI32) {
            expect(std::memcmp(&a.outI32, reply + pos, 4) == 0, "the i32 * gets its 4 bytes");
            pos += 4;
        } else if (a.kind == hcall::OutU64) {
            expect(std::memcmp(&a.outU64, reply + pos, 8) == 0, "the u64 * gets its 8 bytes");
            pos += 8;
        }
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
    expect(exitLine && fuzz::g_lastExitLine.compare(0, lead.size(), lead) == 0,
           "one exit line, showing what the reply says");
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    fuzz::installFormattingLogger();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    FuzzedDataProvider in(data, size);
    const VmsgDeviceScript script = drawScript(in);
    const bool connected = fuzz::connectFresh(script);
    // Later calls meet what earlier replies left in the guest-bound buffer.
    for (int calls = 0; calls < 3 && in.remaining_bytes() > 0; ++calls)
        callOnce(in, script, connected);
    return 0;
}
