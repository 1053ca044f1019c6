// Requests of every operation with any argument values (strings of any bytes
// but NUL, any ints and bools, buffer lengths around zero), decoded back by
// the host and compared: the bytes against an encoding written from the wire
// rules, the decoded call against the arguments, and the scripted reply
// against what the guest hands back.
#include <cinttypes>
#include <vector>

#include "FuzzCalls.h"
#include "FuzzLogger.h"
#include "hcall/host/HcallHost.h"

namespace {

using fuzz::expect;

void put32(std::vector<uint8_t>& out, uint32_t v) {
    for (int i = 0; i < 4; ++i) out.push_back(uint8_t(v >> (8 * i)));
}

std::vector<uint8_t> referenceRequest(const fuzz::Call& call) {
    std::vector<uint8_t> out;
    put32(out, call.op->code);
    put32(out, uint32_t(fuzz::expectedSizes(call).request));
    for (int i = 0; i < call.op->numParams; ++i) {
        const fuzz::Arg& a = call.args[i];
        switch (a.kind) {
            case hcall::Str:
                put32(out, uint32_t(a.text.size() + 1));
                out.insert(out.end(), a.text.begin(), a.text.end());
                out.push_back(0);
                break;
            case hcall::I32:
                put32(out, uint32_t(a.value));
                break;
            case hcall::Bool:
                put32(out, a.flag ? 1 : 0);
                break;
            case hcall::Buf:
                put32(out, uint32_t(call.args[i + 1].value));
                break;
            case hcall::OutI32:
                put32(out, 4);
                break;
            case hcall::OutU64:
                put32(out, 8);
                break;
        }
    }
    return out;
}

// The call as the host half renders it.
std::string referenceText(const fuzz::Call& call) {
    std::string text = std::string(call.op->name) + "(";
    for (int i = 0; i < call.op->numParams; ++i) {
        const fuzz::Arg& a = call.args[i];
        if (i != 0) text += ", ";
        if (a.kind == hcall::Str)
            text += hcallQuote(reinterpret_cast<const uint8_t*>(a.text.data()), a.text.size());
        if (a.kind == hcall::I32) text += std::to_string(a.value);
        if (a.kind == hcall::Bool) text += a.flag ? "true" : "false";
        if (a.kind == hcall::Buf) text += "char[" + std::to_string(call.args[i + 1].value) + "]";
        if (a.kind == hcall::OutI32) text += "i32*";
        if (a.kind == hcall::OutU64) text += "u64*";
    }
    return text + ")";
}

VmsgDeviceScript drawScript(FuzzedDataProvider& in, uint32_t code) {
    VmsgDeviceScript s;
    if (in.ConsumeBool()) {  // tight capacities, so that sizes meet their limits
        s.hostBoundCapacity = in.ConsumeIntegralInRange<uint32_t>(8, 400);
        s.guestBoundCapacity = in.ConsumeIntegralInRange<uint32_t>(4, 400);
    }
    if (in.ConsumeBool()) s.results[code] = in.ConsumeIntegral<int32_t>();
    s.defaultResult = in.ConsumeIntegral<int32_t>();
    s.launchAllowed = in.ConsumeBool();
    s.propsText = in.ConsumeRandomLengthString(48);
    s.propsValue = in.ConsumeIntegral<int32_t>();
    s.timeValue = in.ConsumeIntegral<uint64_t>();
    s.timeText = in.ConsumeRandomLengthString(48);
    return s;
}

// A filled buffer as the scripted host fills it: the text, NUL-padded or cut.
std::string scriptedBuffer(const std::string& text, size_t size) {
    std::string out = text.substr(0, size);
    out.resize(size, '\0');
    return out;
}

void checkReply(const VmsgDeviceScript& s, const fuzz::Call& call, int64_t result) {
    for (int i = 0; i < call.op->numParams; ++i) {
        const fuzz::Arg& a = call.args[i];
        if (a.kind == hcall::Buf) {
            const std::string want = scriptedBuffer(call.op->code == 1 ? s.propsText : s.timeText,
                                                    a.bufferBefore.size());
            expect(std::memcmp(a.buffer.get(), want.data(), want.size()) == 0,
                   "the buffer holds the host's text");
        }
        if (a.kind == hcall::OutI32) expect(a.outI32 == s.propsValue, "the i32 * holds the host's");
        if (a.kind == hcall::OutU64) expect(a.outU64 == s.timeValue, "the u64 * holds the host's");
    }
    const auto listed = s.results.find(call.op->code);
    int64_t want = call.op->result == hcall::Flag ? int64_t(s.launchAllowed) : s.defaultResult;
    if (listed != s.results.end())
        want = call.op->result == hcall::Flag ? int64_t(listed->second != 0) : listed->second;
    expect(result == want, "the guest returns the host's result");
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    fuzz::installFormattingLogger();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    FuzzedDataProvider in(data, size);
    const uint32_t code = in.ConsumeIntegralInRange<uint32_t>(1, hcall::kNumOps);
    const VmsgDeviceScript script = drawScript(in, code);
    const bool connected = fuzz::connectFresh(script);
    expect(connected, "the default layout connects");
    fuzz::Call call;
    fuzz::drawCall(in, code, call, 1024, 300);
    const int64_t result = fuzz::invoke(call);
    const std::vector<VmsgDeviceExchange> exchanges = vmsgDeviceExchanges();

    if (!fuzz::fits(call, connected)) {
        expect(exchanges.empty(), "a request over a capacity is not sent");
        fuzz::expectUntouched(call, result);
        return 0;
    }
    expect(exchanges.size() == 1, "one call, one exchange");
    const VmsgDeviceExchange& x = exchanges[0];
    expect(x.request == referenceRequest(call), "the request bytes follow the wire rules");
    const HcallRequest r = hcallParseRequest(x.request.data(), x.request.size(),
                                             {script.hostBoundCapacity, script.guestBoundCapacity});
    expect(r.ok() && r.opCode == call.op->code, "the host reads the request as sent");
    expect(r.replySize == fuzz::expectedSizes(call).reply, "the host expects the reply's size");
    expect(hcallCallText(r) == referenceText(call), "the values read are the ones passed");
    checkReply(script, call, result);
    return 0;
}
