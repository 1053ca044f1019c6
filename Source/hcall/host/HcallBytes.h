// Little-endian words at any alignment, as the wire lays them.
#pragma once

#include <cstdint>

namespace hcall {

inline uint32_t le32(const uint8_t* p) {
    return uint32_t(p[0]) | uint32_t(p[1]) << 8 | uint32_t(p[2]) << 16 | uint32_t(p[3]) << 24;
}

inline uint64_t le64(const uint8_t* p) { return le32(p) | uint64_t(le32(p + 4)) << 32; }

inline void putLe32(uint8_t* p, uint32_t v) {
    for (int i = 0; i < 4; ++i) p[i] = uint8_t(v >> (8 * i));
}

inline void putLe64(uint8_t* p, uint64_t v) {
    putLe32(p, uint32_t(v));
    putLe32(p + 4, uint32_t(v >> 32));
}

}  // namespace hcall
