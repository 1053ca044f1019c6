#include "xpl/Xstr.h"

#include <cstdio>
#include <cstring>

#include "xpl/Xmem.h"

namespace {

// Folding changes the ASCII letters only; every other byte keeps its signed
// char value, so bytes 0x80 to 0xFF order before every ASCII character and
// before the end of the other string, whatever the C library's locale says.
int foldLower(char c) {
    auto value = static_cast<signed char>(c);
    return value >= 'A' && value <= 'Z' ? value - 'A' + 'a' : value;
}

int foldUpper(char c) {
    auto value = static_cast<signed char>(c);
    return value >= 'a' && value <= 'z' ? value - 'a' + 'A' : value;
}

// The POSIX locale's white space, independent of the process locale.
bool isSpace(char c) { return c == ' ' || (c >= '\t' && c <= '\r'); }

std::string mapBytes(const std::string& s, int (*fold)(char)) {
    std::string out(s);
    for (char& c : out) c = static_cast<char>(fold(c));
    return out;
}

}  // namespace

extern "C" {

char* xstr_dup(const char* s) {
    size_t size = std::strlen(s) + 1;
    char* copy = static_cast<char*>(xmem_alloc(size));
    if (copy != nullptr) std::memcpy(copy, s, size);
    return copy;
}

char* xstr_cpy(char* dst, const char* src) { return std::strcpy(dst, src); }

char* xstr_ncpy(char* dst, const char* src, size_t n) { return std::strncpy(dst, src, n); }

int xstr_icmp(const char* a, const char* b) {
    for (;; ++a, ++b) {
        int ca = foldLower(*a);
        int cb = foldLower(*b);
        if (ca != cb || ca == 0) return ca - cb;
    }
}

int xstr_nicmp(const char* a, const char* b, size_t n) {
    for (; n > 0; --n, ++a, ++b) {
        int ca = foldLower(*a);
        int cb = foldLower(*b);
        if (ca != cb || ca == 0) return ca - cb;
    }
    return 0;
}

int xstr_sscanf(const char* s, const char* fmt, ...) {
    va_list args;
    va_start(args, fmt);
    int result = std::vsscanf(s, fmt, args);
    va_end(args);
    return result;
}

int xstr_snprintf(char* buf, size_t size, const char* fmt, ...) {
    va_list args;
    va_start(args, fmt);
    int result = std::vsnprintf(buf, size, fmt, args);
    va_end(args);
    return result;
}

int xstr_vsnprintf(char* buf, size_t size, const char* fmt, va_list args) {
    return std::vsnprintf(buf, size, fmt, args);
}

}  // extern "C"

std::string xstrPrintf(const char* fmt, ...) {
    va_list args;
    va_start(args, fmt);
    va_list measureArgs;
    va_copy(measureArgs, args);
    int length = std::vsnprintf(nullptr, 0, fmt, measureArgs);
    va_end(measureArgs);
    std::string out;
    // A negative length is an encoding error: the result stays empty rather
    // than sizing a string from it.
    if (length > 0) {
        out.resize(static_cast<size_t>(length));
        // The terminator lands on the string's own terminating slot.
        (void)std::vsnprintf(out.data(), out.size() + 1, fmt, args);
    }
    va_end(args);
    return out;
}

std::string xstrTrim(const std::string& s) {
    size_t begin = 0;
    size_t end = s.size();
    while (begin < end && isSpace(s[begin])) ++begin;
    while (end > begin && isSpace(s[end - 1])) --end;
    return s.substr(begin, end - begin);
}

std::string xstrToLower(const std::string& s) { return mapBytes(s, foldLower); }

std::string xstrToUpper(const std::string& s) { return mapBytes(s, foldUpper); }

bool xstrEqualsIgnoreCase(const std::string& a, const std::string& b) {
    return xstr_icmp(a.c_str(), b.c_str()) == 0;
}

bool xstrStartsWith(const std::string& s, const std::string& prefix) {
    return std::strncmp(s.c_str(), prefix.c_str(), prefix.size()) == 0;
}

bool xstrStartsWithIgnoreCase(const std::string& s, const std::string& prefix) {
    return xstr_nicmp(s.c_str(), prefix.c_str(), prefix.size()) == 0;
}

bool xstrEndsWith(const std::string& s, const std::string& suffix) {
    if (s.size() < suffix.size()) return false;
    return std::strcmp(s.c_str() + (s.size() - suffix.size()), suffix.c_str()) == 0;
}

bool xstrEndsWithIgnoreCase(const std::string& s, const std::string& suffix) {
    if (s.size() < suffix.size()) return false;
    return xstr_icmp(s.c_str() + (s.size() - suffix.size()), suffix.c_str()) == 0;
}

bool xstrContains(const std::string& s, const std::string& sub) {
    return s.find(sub) != std::string::npos;
}

bool xstrContainsIgnoreCase(const std::string& s, const std::string& sub) {
    return xstrToLower(s).find(xstrToLower(sub)) != std::string::npos;
}

std::vector<std::string> xstrSplit(const std::string& s, const std::string& delims) {
    std::vector<std::string> fields;
    size_t pos = 0;
    for (;;) {
        size_t hit =
            pos >= s.size() || delims.empty() ? std::string::npos : s.find_first_of(delims, pos);
        if (hit == pos) {
            // An empty field between two delimiters is dropped.
            ++pos;
            continue;
        }
        size_t length = hit == std::string::npos ? std::string::npos : hit - pos;
        // The text after the last delimiter is kept even when empty, so the
        // result is never an empty vector.
        fields.push_back(xstrTrim(s.substr(pos, length)));
        if (hit == std::string::npos) break;
        pos = hit + 1;
    }
    return fields;
}
