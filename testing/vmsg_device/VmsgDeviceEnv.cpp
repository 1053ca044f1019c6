// The start-up script of a preloaded device, read from the VMSG_DEVICE_*
// environment variables that README.md lists. Numbers are decimal or
// 0x-prefixed hex; an unreadable value is reported and ignored.
#include <errno.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "VmsgDeviceInternal.h"
#include "hcall/host/HcallHost.h"

namespace vmsgdev {
namespace {

bool parseNumber(const std::string& text, long long lo, long long hi, long long& value) {
    if (text.empty()) return false;
    errno = 0;
    char* end = nullptr;
    const long long v = std::strtoll(text.c_str(), &end, 0);
    if (errno != 0 || *end != '\0' || v < lo || v > hi) return false;
    value = v;
    return true;
}

void complain(const char* name, const char* value) {
    std::fprintf(stderr, "vmsg-device: ignoring %s=%s\n", name, value);
}

// Reads one variable into a field through a parser; unset leaves the field.
template <typename Parse>
void readVar(const char* name, Parse parse) {
    const char* value = std::getenv(name);
    if (value != nullptr && !parse(std::string(value))) complain(name, value);
}

template <typename T>
void readNumber(const char* name, T& field, long long lo, long long hi) {
    readVar(name, [&](const std::string& text) {
        long long v = 0;
        if (!parseNumber(text, lo, hi, v)) return false;
        field = T(v);
        return true;
    });
}

void readU32(const char* name, uint32_t& field) { readNumber(name, field, 0, 0xFFFFFFFFLL); }
void readI32(const char* name, int32_t& field) { readNumber(name, field, INT32_MIN, INT32_MAX); }

void readText(const char* name, std::string& field) {
    readVar(name, [&](const std::string& text) {
        field = text;
        return true;
    });
}

bool parseFail(const std::string& text, VmsgDeviceScript& s) {
    const size_t colon = text.find(':');
    const std::string what = text.substr(0, colon);
    long long err = 0;
    if (colon != std::string::npos && !parseNumber(text.substr(colon + 1), 1, 4095, err))
        return false;
    if (what == "open") {
        s.openErrno = err ? int(err) : ENOENT;
    } else if (what == "connect") {
        s.connectErrno = err ? int(err) : EIO;
    } else if (what == "send") {
        s.sendErrno = err ? int(err) : EIO;
    } else if (what == "mmap" && colon == std::string::npos) {
        s.mmapFails = true;
    } else {
        return false;
    }
    return true;
}

bool parseReply(const std::string& text, VmsgDeviceScript& s) {
    long long n = 0;
    if (text == "garbage") {
        s.replyMode = VmsgDeviceReplyMode::Garbage;
    } else if (text.rfind("short:", 0) == 0 && parseNumber(text.substr(6), 0, 0xFFFFFFFFLL, n)) {
        s.replyMode = VmsgDeviceReplyMode::Short;
        s.shortReplyBytes = uint32_t(n);
    } else if (text.rfind("raw:", 0) == 0 && hcallParseHex(text.substr(4), s.rawReply)) {
        s.replyMode = VmsgDeviceReplyMode::Raw;
    } else {
        return false;
    }
    return true;
}

bool parseSwitch(const std::string& text, bool& field) {
    if (text != "0" && text != "1") return false;
    field = text == "1";
    return true;
}

bool parseResults(const std::string& text, std::map<uint32_t, int32_t>& results) {
    size_t start = 0;
    while (start <= text.size()) {
        const size_t comma = std::min(text.find(',', start), text.size());
        const std::string item = text.substr(start, comma - start);
        const size_t eq = item.find('=');
        long long code = 0, result = 0;
        if (eq == std::string::npos || !parseNumber(item.substr(0, eq), 1, 0xFFFFFFFFLL, code) ||
            !parseNumber(item.substr(eq + 1), INT32_MIN, 0xFFFFFFFFLL, result))
            return false;
        results[uint32_t(code)] = int32_t(uint32_t(result));
        start = comma + 1;
    }
    return true;
}

}  // namespace

VmsgDeviceScript scriptFromEnvironment() {
    VmsgDeviceScript s;
    uint32_t capacity = 0;
    readU32("VMSG_DEVICE_CAPACITY", capacity);
    if (capacity != 0) s.hostBoundCapacity = s.guestBoundCapacity = capacity;
    readU32("VMSG_DEVICE_HOST_CAPACITY", s.hostBoundCapacity);
    readU32("VMSG_DEVICE_GUEST_CAPACITY", s.guestBoundCapacity);
    readU32("VMSG_DEVICE_GUEST_OFFSET", s.guestBoundOffset);
    readU32("VMSG_DEVICE_SPARE", s.spare);
    readVar("VMSG_DEVICE_RESULTS",
            [&](const std::string& text) { return parseResults(text, s.results); });
    readI32("VMSG_DEVICE_DEFAULT_RESULT", s.defaultResult);
    readVar("VMSG_DEVICE_LAUNCH_ALLOWED",
            [&](const std::string& text) { return parseSwitch(text, s.launchAllowed); });
    readText("VMSG_DEVICE_PROPS", s.propsText);
    readI32("VMSG_DEVICE_PROPS_VALUE", s.propsValue);
    readVar("VMSG_DEVICE_TIME", [&](const std::string& text) {
        errno = 0;
        char* end = nullptr;
        s.timeValue = std::strtoull(text.c_str(), &end, 0);
        return !text.empty() && errno == 0 && *end == '\0';
    });
    readText("VMSG_DEVICE_TIME_TEXT", s.timeText);
    readU32("VMSG_DEVICE_DELAY_US", s.delayUs);
    readU32("VMSG_DEVICE_DELAY_JITTER_US", s.delayJitterUs);
    readNumber("VMSG_DEVICE_FAIL_PER_MILLE", s.failurePerMille, 0, 1000);
    readI32("VMSG_DEVICE_FAIL_RESULT", s.failureResult);
    readNumber("VMSG_DEVICE_SEND_FAIL_PER_MILLE", s.sendFailurePerMille, 0, 1000);
    readNumber("VMSG_DEVICE_SEED", s.randomSeed, 0, INT64_MAX);
    readVar("VMSG_DEVICE_FAIL", [&](const std::string& text) { return parseFail(text, s); });
    readVar("VMSG_DEVICE_REPLY", [&](const std::string& text) { return parseReply(text, s); });
    readText("VMSG_DEVICE_TRACE", s.tracePath);
    readVar("VMSG_DEVICE_PRINT",
            [&](const std::string& text) { return parseSwitch(text, s.printCalls); });
    readVar("VMSG_DEVICE_RECORD",
            [&](const std::string& text) { return parseSwitch(text, s.record); });
    return s;
}

}  // namespace vmsgdev
