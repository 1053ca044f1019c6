// Any host-call operation called with argument values drawn from fuzz input,
// against the device model. The values are kept, so a target can check what
// went out and what came back.
#pragma once

#include <fuzzer/FuzzedDataProvider.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <string>
#include <utility>

#include "FuzzCheck.h"
#include "VmsgDeviceModel.h"
#include "hcall/guest/HcallCall.h"
#include "hcall/guest/HcallEnc.h"
#include "support/HcallInvoke.h"

namespace fuzz {

// What a filled i32 * and u64 * hold before the call, so a refused call can
// be seen to leave them alone.
constexpr int32_t kUntouchedI32 = 0x5A5A5A5A;
constexpr uint64_t kUntouchedU64 = 0x5A5A5A5A5A5A5A5AULL;

struct Arg {
    hcall::Kind kind = hcall::I32;
    std::string text;   // Str: cut at its first NUL, so c_str() holds all of it
    int32_t value = 0;  // I32; after a Buf it is that buffer's length
    bool flag = false;  // Bool
    // Buf: exactly max(length, 0) bytes, so ASan sees any access past them.
    std::unique_ptr<char[]> buffer;
    std::string bufferBefore;
    int32_t outI32 = kUntouchedI32;
    uint64_t outU64 = kUntouchedU64;
};

struct Call {
    const hcall::OpInfo* op = nullptr;
    Arg args[hcall::kMaxParams];
};

// Buffer lengths run from -2 (refused) to maxBuffer; strings up to maxString.
inline void drawCall(FuzzedDataProvider& in, uint32_t code, Call& call, size_t maxString,
                     int32_t maxBuffer) {
    call.op = hcall::findOp(code);
    const hcall::OpInfo& op = *call.op;
    for (int i = 0; i < op.numParams; ++i) {
        Arg& a = call.args[i];
        a.kind = op.params[i];
        if (a.kind == hcall::Str) a.text = in.ConsumeRandomLengthString(maxString).c_str();
        if (a.kind == hcall::Bool) a.flag = in.ConsumeBool();
        if (a.kind == hcall::I32) {
            const bool isLength = i > 0 && op.params[i - 1] == hcall::Buf;
            a.value = isLength ? in.ConsumeIntegralInRange<int32_t>(-2, maxBuffer)
                               : in.ConsumeIntegral<int32_t>();
        }
    }
    for (int i = 0; i < op.numParams; ++i) {
        Arg& a = call.args[i];
        if (a.kind != hcall::Buf) continue;
        // The catalogue puts every buffer's length right after it.
        const size_t size = size_t(std::max(call.args[i + 1].value, 0));
        a.bufferBefore = in.ConsumeBytesAsString(size);
        a.bufferBefore.resize(size, '\0');
        a.buffer.reset(new char[size]);
        if (size != 0) std::memcpy(a.buffer.get(), a.bufferBefore.data(), size);
    }
}

template <hcall::Kind K>
auto pass(Arg& a) {
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

// The arguments of a drawn call as the operation takes them.
struct CallArgs {
    Arg* args;
    template <hcall::Kind K>
    auto get(size_t i) {
        return pass<K>(args[i]);
    }
};

// Calls the exported operation; a bool result comes back as 0 or 1.
inline int64_t invoke(Call& call) {
    CallArgs args{call.args};
    return hcalltest::invokeExported(call.op->code, args);
}

// What the call answers when the host is not asked or does not answer.
inline int64_t refusedResult(const Call& call) { return call.op->result == hcall::Flag ? 1 : -1; }

// The request and reply sizes from the wire rules, in 64 bits.
struct Sizes {
    uint64_t request = hcall::kHeaderSize;
    uint64_t reply = hcall::kResultSize;
    bool lengthsValid = true;
};

inline Sizes expectedSizes(const Call& call) {
    Sizes z;
    for (int i = 0; i < call.op->numParams; ++i) {
        const Arg& a = call.args[i];
        z.request += 4 + (a.kind == hcall::Str ? a.text.size() + 1 : 0);
        if (a.kind == hcall::Buf) {
            z.lengthsValid = z.lengthsValid && call.args[i + 1].value >= 0;
            z.reply += uint64_t(std::max(call.args[i + 1].value, 0));
        }
        z.reply += a.kind == hcall::OutI32 ? 4 : a.kind == hcall::OutU64 ? 8 : 0;
    }
    return z;
}

// Whether the connection takes the call at all.
inline bool fits(const Call& call, bool connected) {
    const Sizes z = expectedSizes(call);
    const VmsgGuestClient& c = g_hcall.client;
    return connected && z.lengthsValid && z.request <= c.mMaxHostBoundSize &&
           z.reply <= c.mMaxGuestBoundSize;
}

// The host was not asked or did not answer: the caller's storage is as it was.
inline void expectUntouched(const Call& call, int64_t result) {
    expect(result == refusedResult(call), "a call the host did not answer returns -1 (true)");
    for (int i = 0; i < call.op->numParams; ++i) {
        const Arg& a = call.args[i];
        if (a.kind == hcall::Buf)
            expect(std::memcmp(a.buffer.get(), a.bufferBefore.data(), a.bufferBefore.size()) == 0,
                   "an unanswered call leaves the buffer alone");
        expect(a.outI32 == kUntouchedI32 && a.outU64 == kUntouchedU64,
               "an unanswered call leaves the i32 * and u64 * alone");
    }
}

// g_hcall connected afresh to the device model under `script`.
inline bool connectFresh(const VmsgDeviceScript& script) {
    if (g_hcall.client.mFd >= 0) g_hcall.client.disconnect();
    vmsgDeviceReset();
    vmsgDeviceConfigure(script);
    return hcallLibInitGuest() == XERR_SUCCESS;
}

}  // namespace fuzz
