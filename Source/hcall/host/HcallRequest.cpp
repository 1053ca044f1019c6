// Reading a request against the wire rules, field by field, stopping at the
// first rule it breaks.
#include <cstring>

#include "hcall/host/HcallBytes.h"
#include "hcall/host/HcallHost.h"

namespace {

using hcall::le32;

// Walks the parameter fields of a request whose header holds.
class FieldReader {
  public:
    FieldReader(HcallRequest& request, const uint8_t* bytes)
        : mRequest(request), mBytes(bytes), mEnd(request.totalLength) {}

    void read() {
        const hcall::OpInfo& op = *mRequest.op;
        for (int i = 0; i < op.numParams && mRequest.ok(); ++i) readOne(op.params[i], i);
        if (mRequest.ok() && mPos != mEnd) refuse(HcallFault::TrailingBytes, mPos, mPos, mEnd);
        for (int i = 0; i + 1 < op.numParams && mRequest.ok(); ++i)
            if (op.params[i] == hcall::Buf) checkBuffer(mRequest.params[i], mRequest.params[i + 1]);
    }

  private:
    void refuse(HcallFault fault, uint32_t at, uint64_t value, uint64_t bound = 0) {
        mRequest.fault = fault;
        mRequest.faultOffset = at;
        mRequest.faultValue = value;
        mRequest.faultBound = bound;
    }

    void readOne(hcall::Kind kind, int index) {
        HcallValue& value = mRequest.params[index];
        value.kind = kind;
        const uint32_t at = mPos;
        if (mEnd - mPos < hcall::kFieldSize) return refuse(HcallFault::FieldPastEnd, at, at, mEnd);
        const uint32_t word = le32(mBytes + mPos);
        mPos += hcall::kFieldSize;
        value.i32 = int32_t(word);
        switch (kind) {
            case hcall::Str:
                return readString(value, at, word);
            case hcall::Bool:
                value.flag = word == 1;
                if (word > 1) refuse(HcallFault::BadBool, at, word);
                return;
            case hcall::I32:
                return;
            case hcall::Buf:
                value.i32 = 0;
                value.size = word;
                return;
            case hcall::OutI32:
            case hcall::OutU64:
                value.i32 = 0;
                value.size = hcall::filledSize(kind, 0);
                if (word != value.size) refuse(HcallFault::BadFilledSize, at, word, value.size);
                return;
        }
    }

    void readString(HcallValue& value, uint32_t at, uint32_t count) {
        const char* text = reinterpret_cast<const char*>(mBytes + mPos);
        value.i32 = 0;
        if (count == 0) {
            refuse(HcallFault::EmptyString, at, count);
        } else if (count > mEnd - mPos) {
            refuse(HcallFault::StringPastEnd, at, count, mEnd);
        } else if (text[count - 1] != 0) {
            refuse(HcallFault::Unterminated, at, count);
        } else if (std::memchr(text, 0, count - 1) != nullptr) {
            refuse(HcallFault::InnerNul, at, count);
        } else {
            value.text = std::string_view(text, count - 1);
            mPos += count;
        }
    }

    // A buffer's capacity travels twice, as its own field and as the length
    // parameter after it; the host trusts neither alone.
    void checkBuffer(const HcallValue& buffer, const HcallValue& length) {
        if (int32_t(buffer.size) < 0) {
            refuse(HcallFault::NegativeBuffer, 0, buffer.size);
        } else if (uint32_t(length.i32) != buffer.size) {
            refuse(HcallFault::BufferMismatch, 0, buffer.size, uint32_t(length.i32));
        }
    }

    HcallRequest& mRequest;
    const uint8_t* mBytes;
    uint32_t mEnd;
    uint32_t mPos = hcall::kHeaderSize;
};

void checkHeader(HcallRequest& r, size_t length, HcallLimits limits) {
    auto refuse = [&r](HcallFault fault, uint64_t value, uint64_t bound) {
        r.fault = fault;
        r.faultValue = value;
        r.faultBound = bound;
    };
    if (length < hcall::kHeaderSize) {
        refuse(HcallFault::ShortHeader, length, hcall::kHeaderSize);
    } else if (r.op == nullptr) {
        refuse(HcallFault::UnknownCode, r.opCode, hcall::kNumOps);
    } else if (r.totalLength < hcall::kHeaderSize) {
        refuse(HcallFault::ShortTotalLength, r.totalLength, hcall::kHeaderSize);
    } else if (limits.hostBoundCapacity != 0 && r.totalLength > limits.hostBoundCapacity) {
        refuse(HcallFault::OverHostCapacity, r.totalLength, limits.hostBoundCapacity);
    } else if (r.totalLength > length) {
        refuse(HcallFault::PastReceived, r.totalLength, length);
    }
}

}  // namespace

HcallRequest hcallParseRequest(const uint8_t* bytes, size_t length, HcallLimits limits) {
    HcallRequest r;
    if (length >= 4) r.opCode = le32(bytes);
    if (length >= hcall::kHeaderSize) r.totalLength = le32(bytes + 4);
    r.op = hcall::findOp(r.opCode);
    checkHeader(r, length, limits);
    if (r.ok()) FieldReader(r, bytes).read();
    if (!r.ok()) return r;

    uint64_t replySize = hcall::kResultSize;
    for (int i = 0; i < r.op->numParams; ++i) replySize += r.params[i].size;
    if (limits.guestBoundCapacity != 0 && replySize > limits.guestBoundCapacity) {
        r.fault = HcallFault::OverGuestCapacity;
        r.faultValue = replySize;
        r.faultBound = limits.guestBoundCapacity;
    } else {
        r.replySize = uint32_t(replySize);
    }
    return r;
}
