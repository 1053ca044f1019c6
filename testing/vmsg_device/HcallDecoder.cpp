#include "HcallDecoder.h"

#include <cinttypes>
#include <cstdarg>
#include <cstdio>
#include <cstring>

namespace {

__attribute__((format(printf, 1, 2))) std::string format(const char* fmt, ...) {
    char line[256];
    va_list ap;
    va_start(ap, fmt);
    vsnprintf(line, sizeof line, fmt, ap);
    va_end(ap);
    return line;
}

uint32_t le32(const uint8_t* p) {
    return uint32_t(p[0]) | uint32_t(p[1]) << 8 | uint32_t(p[2]) << 16 | uint32_t(p[3]) << 24;
}

uint64_t le64(const uint8_t* p) { return le32(p) | uint64_t(le32(p + 4)) << 32; }

bool isFilled(hcall::Kind kind) { return hcall::filledSize(kind, 1) != 0; }

// One parameter as read from the request.
struct Arg {
    hcall::Kind kind = hcall::I32;
    uint32_t word = 0;  // the field's first word: value, count or filled size
    std::string text;   // rendered value, or the placeholder of a filled parameter
};

// Walks the parameter fields of a request whose header was already checked.
// Renders text only when asked, so that checking alone allocates nothing.
class RequestReader {
  public:
    RequestReader(const hcall::OpInfo& op, const uint8_t* request, uint32_t totalLength,
                  bool render)
        : mOp(op), mData(request), mEnd(totalLength), mRender(render) {}

    // Reads every field; on the first fault sets problem and stops.
    bool read(Arg* args, std::string& problem) {
        for (int i = 0; i < mOp.numParams; ++i) {
            args[i].kind = mOp.params[i];
            if (!readOne(args[i], problem)) return false;
        }
        if (mPos != mEnd) {
            problem = format("totalLength %u but the fields end at %u", mEnd, mPos);
            return false;
        }
        return checkBufferLengths(args, problem);
    }

  private:
    bool readOne(Arg& arg, std::string& problem) {
        const uint32_t at = mPos;
        if (mEnd - mPos < hcall::kFieldSize) {
            problem = format("parameter at offset %u runs past totalLength %u", at, mEnd);
            return false;
        }
        arg.word = le32(mData + mPos);
        mPos += hcall::kFieldSize;
        switch (arg.kind) {
            case hcall::Str:
                return readString(at, arg, problem);
            case hcall::I32:
                if (mRender) arg.text = format("%" PRId32, int32_t(arg.word));
                return true;
            case hcall::Bool:
                if (arg.word > 1) {
                    problem = format("bool field at offset %u holds 0x%08x", at, arg.word);
                    return false;
                }
                if (mRender) arg.text = arg.word ? "true" : "false";
                return true;
            case hcall::Buf:
                if (mRender) arg.text = format("char[%u]", arg.word);
                return true;
            case hcall::OutI32:
            case hcall::OutU64:
                return readOutSize(at, arg, problem);
        }
        problem = "catalogue kind unknown to the decoder";
        return false;
    }

    bool readString(uint32_t at, Arg& arg, std::string& problem) {
        const uint8_t* bytes = mData + mPos;
        const uint32_t count = arg.word;
        if (count == 0) {
            problem = format("string count 0 at offset %u leaves no room for the NUL", at);
        } else if (count > mEnd - mPos) {
            problem =
                format("string count %u at offset %u runs past totalLength %u", count, at, mEnd);
        } else if (bytes[count - 1] != 0) {
            problem = format("string at offset %u lacks its terminating NUL", at);
        } else if (std::memchr(bytes, 0, count - 1) != nullptr) {
            problem = format("string at offset %u holds a NUL before its end", at);
        } else {
            if (mRender) arg.text = hcallQuote(bytes, count - 1);
            mPos += count;
            return true;
        }
        return false;
    }

    bool readOutSize(uint32_t at, Arg& arg, std::string& problem) {
        const uint32_t expected = hcall::filledSize(arg.kind, 0);
        const char* type = arg.kind == hcall::OutI32 ? "i32*" : "u64*";
        if (arg.word != expected) {
            problem =
                format("%s size field at offset %u is %u, not %u", type, at, arg.word, expected);
            return false;
        }
        if (mRender) arg.text = type;
        return true;
    }

    // A filled buffer's capacity travels twice: as its own field and as the
    // i32 length parameter right after it (the catalogue guarantees one).
    // The host trusts neither alone.
    bool checkBufferLengths(const Arg* args, std::string& problem) const {
        for (int i = 0; i + 1 < mOp.numParams; ++i) {
            if (args[i].kind != hcall::Buf) continue;
            if (int32_t(args[i].word) < 0) {
                problem = format("buffer length %" PRId32 " is negative", int32_t(args[i].word));
                return false;
            }
            if (args[i + 1].word != args[i].word) {
                problem = format("buffer capacity %u differs from its length parameter %" PRId32,
                                 args[i].word, int32_t(args[i + 1].word));
                return false;
            }
        }
        return true;
    }

    const hcall::OpInfo& mOp;
    const uint8_t* mData;
    uint32_t mEnd;
    bool mRender;
    uint32_t mPos = hcall::kHeaderSize;
};

std::string checkHeader(const HcallDecoded& d, size_t requestLen, uint32_t hostBoundCapacity) {
    if (requestLen < hcall::kHeaderSize)
        return format("request of %zu bytes is shorter than the header", requestLen);
    if (d.op == nullptr) return format("unknown operation code %u", d.opCode);
    if (d.totalLength < hcall::kHeaderSize)
        return format("totalLength %u is shorter than the header", d.totalLength);
    if (hostBoundCapacity != 0 && d.totalLength > hostBoundCapacity)
        return format("totalLength %u exceeds the host-bound capacity %u", d.totalLength,
                      hostBoundCapacity);
    if (d.totalLength > requestLen)
        return format("totalLength %u runs past the %zu bytes received", d.totalLength, requestLen);
    return {};
}

HcallDecoded decode(const uint8_t* request, size_t requestLen, uint32_t hostBoundCapacity,
                    uint32_t guestBoundCapacity, Arg* args, bool render) {
    HcallDecoded d;
    if (requestLen >= 4) d.opCode = le32(request);
    if (requestLen >= hcall::kHeaderSize) d.totalLength = le32(request + 4);
    d.op = hcall::findOp(d.opCode);
    d.problem = checkHeader(d, requestLen, hostBoundCapacity);
    if (d.problem.empty())
        RequestReader(*d.op, request, d.totalLength, render).read(args, d.problem);
    if (!d.problem.empty()) return d;

    uint64_t replySize = hcall::kResultSize;
    for (int i = 0; i < d.op->numParams; ++i) {
        if (!isFilled(args[i].kind)) continue;
        const uint32_t size = hcall::filledSize(args[i].kind, args[i].word);
        d.filled[d.numFilled++] = HcallFilled{args[i].kind, size};
        replySize += size;
    }
    if (guestBoundCapacity != 0 && replySize > guestBoundCapacity) {
        d.problem = format("reply of %" PRIu64 " bytes exceeds the guest-bound capacity %u",
                           replySize, guestBoundCapacity);
        d.numFilled = 0;
        return d;
    }
    d.wellFormed = true;
    d.replySize = uint32_t(replySize);
    return d;
}

// Puts the filled data into the arguments' text and renders the result.
std::string readReply(const HcallDecoded& d, Arg* args, const uint8_t* reply, size_t replyLen) {
    size_t pos = 0;
    for (int i = 0; i < d.op->numParams; ++i) {
        Arg& arg = args[i];
        if (!isFilled(arg.kind)) continue;
        const uint32_t size = hcall::filledSize(arg.kind, arg.word);
        if (replyLen - pos < size) break;
        const uint8_t* data = reply + pos;
        if (arg.kind == hcall::OutI32) {
            arg.text += format("=%" PRId32, int32_t(le32(data)));
        } else if (arg.kind == hcall::OutU64) {
            arg.text += format("=%" PRIu64, le64(data));
        } else {
            const void* nul = std::memchr(data, 0, size);
            const size_t shown = nul ? size_t(static_cast<const uint8_t*>(nul) - data) : size;
            arg.text += "=" + hcallQuote(data, shown) + (nul ? "" : "(unterminated)");
        }
        pos += size;
    }
    if (replyLen < d.replySize)
        return format(" -> !short reply: %zu of %u bytes", replyLen, d.replySize);
    const uint32_t result = le32(reply + d.replySize - hcall::kResultSize);
    if (d.op->result == hcall::Flag) return (result & 0xFF) ? " -> true" : " -> false";
    return format(" -> %" PRId32, int32_t(result));
}

}  // namespace

std::string hcallQuote(const uint8_t* bytes, size_t len) {
    std::string out = "\"";
    for (size_t i = 0; i < len; ++i) {
        const uint8_t c = bytes[i];
        if (c == '"' || c == '\\') {
            out += '\\';
            out += char(c);
        } else if (c == '\n') {
            out += "\\n";
        } else if (c == '\r') {
            out += "\\r";
        } else if (c == '\t') {
            out += "\\t";
        } else if (c < 0x20 || c >= 0x7F) {
            out += format("\\x%02x", c);
        } else {
            out += char(c);
        }
    }
    return out + "\"";
}

std::string hcallHex(const uint8_t* bytes, size_t len) {
    static const char kDigits[] = "0123456789abcdef";
    std::string out;
    out.reserve(len * 2);
    for (size_t i = 0; i < len; ++i) {
        out += kDigits[bytes[i] >> 4];
        out += kDigits[bytes[i] & 0xF];
    }
    return out;
}

HcallDecoded hcallCheck(const uint8_t* request, size_t requestLen, uint32_t hostBoundCapacity,
                        uint32_t guestBoundCapacity) {
    Arg args[hcall::kMaxParams];
    return decode(request, requestLen, hostBoundCapacity, guestBoundCapacity, args, false);
}

HcallDecoded hcallDecode(const uint8_t* request, size_t requestLen, const uint8_t* reply,
                         size_t replyLen, uint32_t hostBoundCapacity, uint32_t guestBoundCapacity) {
    Arg args[hcall::kMaxParams];
    HcallDecoded d = decode(request, requestLen, hostBoundCapacity, guestBoundCapacity, args, true);
    if (!d.wellFormed) {
        const std::string name = d.op ? d.op->name : format("op %u", d.opCode);
        d.text = "!malformed " + name + ": " + d.problem;
        return d;
    }
    std::string answer;
    if (reply != nullptr) answer = readReply(d, args, reply, replyLen);
    d.text = d.op->name;
    d.text += '(';
    for (int i = 0; i < d.op->numParams; ++i) d.text += (i ? ", " : "") + args[i].text;
    d.text += ')';
    d.text += answer;
    return d;
}

bool hcallParseHex(const std::string& text, std::vector<uint8_t>& bytes) {
    bytes.clear();
    int high = -1;
    for (const char c : text) {
        const int digit = c >= '0' && c <= '9'   ? c - '0'
                          : c >= 'a' && c <= 'f' ? c - 'a' + 10
                          : c >= 'A' && c <= 'F' ? c - 'A' + 10
                                                 : -1;
        if (digit < 0) {
            if ((c != ' ' && c != '\t' && c != ',') || high >= 0) return false;
        } else if (high < 0) {
            high = digit;
        } else {
            bytes.push_back(uint8_t(high << 4 | digit));
            high = -1;
        }
    }
    return high < 0;
}
