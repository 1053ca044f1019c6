// The start-up script of a preloaded device, read from the VMSG_DEVICE_*
// environment variables that README.md lists. Numbers are decimal or
// 0x-prefixed hex; an unreadable value is reported and ignored.
#include <errno.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "VmsgDeviceInternal.h"

namespace vmsgdev {
namespace {

// A whole number within [lo, hi], unsigned 64-bit when hi says so.
bool parseNumber(const std::string& text, long long lo, unsigned long long hi,
                 unsigned long long& value) {
    errno = 0;
    char* end = nullptr;
    const bool negative = text.find('-') != std::string::npos;
    value = negative ? (unsigned long long)std::strtoll(text.c_str(), &end, 0)
                     : std::strtoull(text.c_str(), &end, 0);
    return !text.empty() && errno == 0 && *end == '\0' &&
           (negative ? (long long)value >= lo : value <= hi);
}

template <typename T>
bool parse(const std::string& text, T& field, long long lo, unsigned long long hi) {
    unsigned long long v = 0;
    if (!parseNumber(text, lo, hi, v)) return false;
    field = T(v);
    return true;
}
bool parse(const std::string& text, uint32_t& field) { return parse(text, field, 0, UINT32_MAX); }
bool parse(const std::string& text, uint64_t& field) { return parse(text, field, 0, UINT64_MAX); }
bool parse(const std::string& text, int32_t& field) {
    return parse(text, field, INT32_MIN, INT32_MAX);
}
bool parse(const std::string& text, std::string& field) {
    field = text;
    return true;
}
bool parse(const std::string& text, bool& field) {
    if (text != "0" && text != "1") return false;
    field = text == "1";
    return true;
}

// "12=-5,24=0": a result per operation code.
bool parse(const std::string& text, std::map<uint32_t, int32_t>& results) {
    for (size_t start = 0; start <= text.size();) {
        const size_t comma = std::min(text.find(',', start), text.size());
        const std::string item = text.substr(start, comma - start);
        const size_t eq = item.find('=');
        uint32_t code = 0, result = 0;
        if (eq == std::string::npos || !parse(item.substr(0, eq), code, 1, UINT32_MAX) ||
            !parse(item.substr(eq + 1), result, INT32_MIN, UINT32_MAX))
            return false;
        results[code] = int32_t(result);
        start = comma + 1;
    }
    return true;
}

// open|connect|mmap|send[:errno]
bool parseFault(const std::string& text, VmsgDeviceScript& s) {
    const size_t colon = text.find(':');
    const std::string what = text.substr(0, colon);
    int err = 0;
    if (colon != std::string::npos && !parse(text.substr(colon + 1), err, 1, 4095)) return false;
    if (what == "open") s.openErrno = err ? err : ENOENT;
    if (what == "connect") s.connectErrno = err ? err : EIO;
    if (what == "send") s.sendErrno = err ? err : EIO;
    if (what == "mmap") s.mmapFails = colon == std::string::npos;
    return what == "open" || what == "connect" || what == "send" || s.mmapFails;
}

// short:N|garbage|raw:HEX
bool parseReply(const std::string& text, VmsgDeviceScript& s) {
    if (text == "garbage") {
        s.replyMode = VmsgDeviceReplyMode::Garbage;
    } else if (text.rfind("short:", 0) == 0 && parse(text.substr(6), s.shortReplyBytes)) {
        s.replyMode = VmsgDeviceReplyMode::Short;
    } else if (text.rfind("raw:", 0) == 0 && hcallParseHex(text.substr(4), s.rawReply)) {
        s.replyMode = VmsgDeviceReplyMode::Raw;
    }
    return s.replyMode != VmsgDeviceReplyMode::Scripted;
}

// Reads one variable through a parser; an unset variable leaves the script.
template <typename Parse>
void readWith(const char* name, Parse parse) {
    const char* value = std::getenv(name);
    if (value != nullptr && !parse(std::string(value)))
        std::fprintf(stderr, "vmsg-device: ignoring %s=%s\n", name, value);
}

template <typename T>
void read(const char* name, T& field) {
    readWith(name, [&field](const std::string& text) { return parse(text, field); });
}

void readPerMille(const char* name, uint32_t& field) {
    readWith(name, [&field](const std::string& text) { return parse(text, field, 0, 1000); });
}

}  // namespace

VmsgDeviceScript scriptFromEnvironment() {
    VmsgDeviceScript s;
    uint32_t capacity = 0;
    read("VMSG_DEVICE_CAPACITY", capacity);
    if (capacity != 0) s.hostBoundCapacity = s.guestBoundCapacity = capacity;
    read("VMSG_DEVICE_HOST_CAPACITY", s.hostBoundCapacity);
    read("VMSG_DEVICE_GUEST_CAPACITY", s.guestBoundCapacity);
    read("VMSG_DEVICE_GUEST_OFFSET", s.guestBoundOffset);
    read("VMSG_DEVICE_SPARE", s.spare);
    read("VMSG_DEVICE_RESULTS", s.results);
    read("VMSG_DEVICE_DEFAULT_RESULT", s.defaultResult);
    read("VMSG_DEVICE_LAUNCH_ALLOWED", s.launchAllowed);
    read("VMSG_DEVICE_PROPS", s.propsText);
    read("VMSG_DEVICE_PROPS_VALUE", s.propsValue);
    read("VMSG_DEVICE_TIME", s.timeValue);
    read("VMSG_DEVICE_TIME_TEXT", s.timeText);
    read("VMSG_DEVICE_DELAY_US", s.delayUs);
    read("VMSG_DEVICE_DELAY_JITTER_US", s.delayJitterUs);
    readPerMille("VMSG_DEVICE_FAIL_PER_MILLE", s.failurePerMille);
    read("VMSG_DEVICE_FAIL_RESULT", s.failureResult);
    readPerMille("VMSG_DEVICE_SEND_FAIL_PER_MILLE", s.sendFailurePerMille);
    read("VMSG_DEVICE_SEED", s.randomSeed);
    readWith("VMSG_DEVICE_FAIL", [&s](const std::string& text) { return parseFault(text, s); });
    readWith("VMSG_DEVICE_REPLY", [&s](const std::string& text) { return parseReply(text, s); });
    read("VMSG_DEVICE_TRACE", s.tracePath);
    read("VMSG_DEVICE_PRINT", s.printCalls);
    read("VMSG_DEVICE_RECORD", s.record);
    return s;
}

}  // namespace vmsgdev
