// A failed expectation stops a fuzz run as a crash, so libFuzzer keeps the input.
#pragma once

#include <cstdint>
#include <cstdio>
#include <cstdlib>

namespace fuzz {

inline void expect(bool ok, const char* what) {
    if (ok) return;
    std::fprintf(stderr, "fuzz expectation failed: %s\n", what);
    std::abort();
}

inline uint32_t le32(const uint8_t* p) {
    return uint32_t(p[0]) | uint32_t(p[1]) << 8 | uint32_t(p[2]) << 16 | uint32_t(p[3]) << 24;
}

}  // namespace fuzz
