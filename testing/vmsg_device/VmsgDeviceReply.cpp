#include "VmsgDeviceReply.h"

#include <algorithm>
#include <cstring>

namespace vmsgdev {
namespace {

// Writes little-endian fields one after another, dropping whatever falls
// past the limit: a short reply is the proper one cut off.
class ReplyWriter {
  public:
    ReplyWriter(uint8_t* out, uint32_t limit) : mOut(out), mLimit(limit) {}

    void bytes(const void* data, size_t len) {
        const size_t room = mPos < mLimit ? mLimit - mPos : 0;
        if (room != 0 && len != 0) std::memcpy(mOut + mPos, data, std::min(len, room));
        mPos += len;
    }
    void zeros(size_t len) {
        const size_t room = mPos < mLimit ? mLimit - mPos : 0;
        if (room != 0) std::memset(mOut + mPos, 0, std::min(len, room));
        mPos += len;
    }
    void u32(uint32_t v) {
        const uint8_t le[4] = {uint8_t(v), uint8_t(v >> 8), uint8_t(v >> 16), uint8_t(v >> 24)};
        bytes(le, sizeof le);
    }
    void u64(uint64_t v) {
        u32(uint32_t(v));
        u32(uint32_t(v >> 32));
    }
    // A buffer gets the text, then NUL padding; a text as long as the buffer
    // or longer is cut and arrives unterminated.
    void text(const std::string& s, uint32_t capacity) {
        const size_t n = std::min<size_t>(s.size(), capacity);
        bytes(s.data(), n);
        zeros(capacity - n);
    }
    uint32_t written() const { return uint32_t(std::min<size_t>(mPos, mLimit)); }

  private:
    uint8_t* mOut;
    size_t mLimit;
    size_t mPos = 0;
};

int32_t resultFor(const VmsgDeviceScript& s, const hcall::OpInfo& op, bool failed) {
    if (failed) return op.result == hcall::Flag ? 0 : s.failureResult;
    const auto it = s.results.find(op.code);
    if (it != s.results.end()) return it->second;
    if (op.result == hcall::Flag) return s.launchAllowed ? 1 : 0;
    return s.defaultResult;
}

void writeScripted(const VmsgDeviceScript& s, const HcallDecoded& d, bool failed, ReplyWriter& w) {
    if (!d.wellFormed) {
        w.u32(uint32_t(s.malformedResult));
        return;
    }
    for (int i = 0; i < d.numFilled; ++i) {
        const HcallFilled& f = d.filled[i];
        if (f.kind == hcall::OutI32) w.u32(uint32_t(s.propsValue));
        if (f.kind == hcall::OutU64) w.u64(s.timeValue);
        if (f.kind == hcall::Buf) w.text(d.opCode == 1 ? s.propsText : s.timeText, f.size);
    }
    w.u32(uint32_t(resultFor(s, *d.op, failed)));
}

uint32_t writeGarbage(uint8_t* out, uint32_t capacity, uint64_t seed) {
    uint64_t x = seed * 0x9E3779B97F4A7C15ULL + 0x2545F4914F6CDD1DULL;
    for (uint32_t i = 0; i < capacity; ++i) {
        x ^= x << 13;
        x ^= x >> 7;
        x ^= x << 17;
        out[i] = uint8_t(x >> 32);
    }
    return capacity;
}

}  // namespace

uint32_t writeReply(const VmsgDeviceScript& script, const HcallDecoded& request, uint8_t* out,
                    uint32_t capacity, uint64_t seed, bool failed) {
    switch (script.replyMode) {
        case VmsgDeviceReplyMode::Garbage:
            return writeGarbage(out, capacity, seed);
        case VmsgDeviceReplyMode::Raw: {
            ReplyWriter w(out, capacity);
            w.bytes(script.rawReply.data(), script.rawReply.size());
            return w.written();
        }
        case VmsgDeviceReplyMode::Short:
        case VmsgDeviceReplyMode::Scripted:
            break;
    }
    const bool cut = script.replyMode == VmsgDeviceReplyMode::Short;
    ReplyWriter w(out, cut ? std::min(capacity, script.shortReplyBytes) : capacity);
    writeScripted(script, request, failed, w);
    return w.written();
}

}  // namespace vmsgdev
