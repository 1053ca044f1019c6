// String helpers: C-array helpers under plain names, std::string helpers.
#pragma once

#include <cstdarg>
#include <cstddef>
#include <string>
#include <vector>

#include "xpl/XplExport.h"

extern "C" {
XPL_EXPORT char* xstr_dup(const char* s);
XPL_EXPORT char* xstr_cpy(char* dst, const char* src);
XPL_EXPORT char* xstr_ncpy(char* dst, const char* src, size_t n);
XPL_EXPORT int xstr_icmp(const char* a, const char* b);
XPL_EXPORT int xstr_nicmp(const char* a, const char* b, size_t n);
XPL_EXPORT int xstr_sscanf(const char* s, const char* fmt, ...)
    __attribute__((format(scanf, 2, 3)));
XPL_EXPORT int xstr_snprintf(char* buf, size_t size, const char* fmt, ...)
    __attribute__((format(printf, 3, 4)));
XPL_EXPORT int xstr_vsnprintf(char* buf, size_t size, const char* fmt, va_list args)
    __attribute__((format(printf, 3, 0)));
}

XPL_EXPORT std::string xstrPrintf(const char* fmt, ...) __attribute__((format(printf, 1, 2)));
XPL_EXPORT std::string xstrTrim(const std::string& s);
XPL_EXPORT std::string xstrToLower(const std::string& s);
XPL_EXPORT std::string xstrToUpper(const std::string& s);
XPL_EXPORT bool xstrEqualsIgnoreCase(const std::string& a, const std::string& b);
XPL_EXPORT bool xstrStartsWith(const std::string& s, const std::string& prefix);
XPL_EXPORT bool xstrStartsWithIgnoreCase(const std::string& s, const std::string& prefix);
XPL_EXPORT bool xstrEndsWith(const std::string& s, const std::string& suffix);
XPL_EXPORT bool xstrEndsWithIgnoreCase(const std::string& s, const std::string& suffix);
XPL_EXPORT bool xstrContains(const std::string& s, const std::string& sub);
XPL_EXPORT bool xstrContainsIgnoreCase(const std::string& s, const std::string& sub);
XPL_EXPORT std::vector<std::string> xstrSplit(const std::string& s, const std::string& delims);
