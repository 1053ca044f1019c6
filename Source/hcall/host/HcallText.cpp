// Requests and replies as the one-line text that traces and tools print.
#include <cinttypes>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "hcall/host/HcallHost.h"

namespace {

__attribute__((format(printf, 1, 2))) std::string format(const char* fmt, ...) {
    char line[160];
    va_list ap;
    va_start(ap, fmt);
    (void)vsnprintf(line, sizeof line, fmt, ap);  // every message fits the line
    va_end(ap);
    return line;
}

std::string quote(std::string_view text) {
    return hcallQuote(reinterpret_cast<const uint8_t*>(text.data()), text.size());
}

std::string valueText(const HcallValue& v) {
    switch (v.kind) {
        case hcall::Str:
            return quote(v.text);
        case hcall::I32:
            return std::to_string(v.i32);
        case hcall::Bool:
            return v.flag ? "true" : "false";
        case hcall::Buf: {
            std::string text = format("char[%" PRIu32 "]", v.size);
            if (!v.answered) return text;
            const size_t nul = v.text.find('\0');
            if (nul == std::string_view::npos) return text + "=" + quote(v.text) + "(unterminated)";
            return text + "=" + quote(v.text.substr(0, nul));
        }
        case hcall::OutI32:
            return v.answered ? format("i32*=%" PRId32, v.i32) : "i32*";
        case hcall::OutU64:
            return v.answered ? format("u64*=%" PRIu64, v.u64) : "u64*";
    }
    return "?";
}

}  // namespace

std::string hcallFaultText(const HcallRequest& r) {
    const uint32_t at = r.faultOffset;
    const uint64_t value = r.faultValue;
    const uint64_t bound = r.faultBound;
    switch (r.fault) {
        case HcallFault::None:
            return {};
        case HcallFault::ShortHeader:
            return format("request of %" PRIu64 " bytes is shorter than the header", value);
        case HcallFault::UnknownCode:
            return format("unknown operation code %" PRIu64, value);
        case HcallFault::ShortTotalLength:
            return format("totalLength %" PRIu64 " is shorter than the header", value);
        case HcallFault::OverHostCapacity:
            return format("totalLength %" PRIu64 " exceeds the host-bound capacity %" PRIu64, value,
                          bound);
        case HcallFault::PastReceived:
            return format("totalLength %" PRIu64 " runs past the %" PRIu64 " bytes received", value,
                          bound);
        case HcallFault::FieldPastEnd:
            return format("parameter at offset %u runs past totalLength %" PRIu64, at, bound);
        case HcallFault::EmptyString:
            return format("string count 0 at offset %u leaves no room for the NUL", at);
        case HcallFault::StringPastEnd:
            return format("string count %" PRIu64 " at offset %u runs past totalLength %" PRIu64,
                          value, at, bound);
        case HcallFault::Unterminated:
            return format("string at offset %u lacks its terminating NUL", at);
        case HcallFault::InnerNul:
            return format("string at offset %u holds a NUL before its end", at);
        case HcallFault::BadBool:
            return format("bool field at offset %u holds 0x%08" PRIx64, at, value);
        case HcallFault::BadFilledSize:
            return format("%s size field at offset %u is %" PRIu64 ", not %" PRIu64,
                          bound == 4 ? "i32*" : "u64*", at, value, bound);
        case HcallFault::TrailingBytes:
            return format("totalLength %" PRIu64 " but the fields end at %u", bound, at);
        case HcallFault::NegativeBuffer:
            return format("buffer length %" PRId32 " is negative", int32_t(value));
        case HcallFault::BufferMismatch:
            return format("buffer capacity %" PRIu64 " differs from its length parameter %" PRId32,
                          value, int32_t(bound));
        case HcallFault::OverGuestCapacity:
            return format("reply of %" PRIu64 " bytes exceeds the guest-bound capacity %" PRIu64,
                          value, bound);
    }
    return "unknown fault";
}

std::string hcallCallText(const HcallRequest& r) {
    if (!r.ok()) {
        const std::string name = r.op ? r.op->name : format("op %" PRIu32, r.opCode);
        return "!malformed " + name + ": " + hcallFaultText(r);
    }
    std::string text = r.op->name;
    text += '(';
    for (int i = 0; i < r.numParams(); ++i) text += (i ? ", " : "") + valueText(r.params[i]);
    return text + ')';
}

std::string hcallExchangeText(const HcallRequest& request, const uint8_t* reply, size_t length) {
    if (!request.ok()) return hcallCallText(request);
    HcallRequest answered = request;
    int32_t result = 0;
    const bool whole = hcallReadReply(answered, reply, length, result);
    std::string text = hcallCallText(answered);
    if (!whole)
        return text +
               format(" -> !short reply: %zu of %" PRIu32 " bytes", length, request.replySize);
    if (request.op->result == hcall::Flag) return text + (result ? " -> true" : " -> false");
    return text + " -> " + std::to_string(result);
}

std::string hcallQuote(const uint8_t* bytes, size_t length) {
    std::string out = "\"";
    for (size_t i = 0; i < length; ++i) {
        const uint8_t c = bytes[i];
        const char* escape = c == '"'    ? "\\\""
                             : c == '\\' ? "\\\\"
                             : c == '\n' ? "\\n"
                             : c == '\r' ? "\\r"
                             : c == '\t' ? "\\t"
                                         : nullptr;
        if (escape != nullptr) {
            out += escape;
        } else if (c < 0x20 || c >= 0x7F) {
            out += format("\\x%02x", c);
        } else {
            out += char(c);
        }
    }
    return out + "\"";
}

std::string hcallHex(const uint8_t* bytes, size_t length) {
    static const char kDigits[] = "0123456789abcdef";
    std::string out;
    out.reserve(length * 2);
    for (size_t i = 0; i < length; ++i) {
        out += kDigits[bytes[i] >> 4];
        out += kDigits[bytes[i] & 0xF];
    }
    return out;
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
