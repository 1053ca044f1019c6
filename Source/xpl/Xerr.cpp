#include "xpl/Xerr.h"

#include <cstdio>
#include <cstring>

const char* g_xerr_str_table[XERR_STR_TABLE_SIZE];
int32_t g_xerr_xlat_table[XERR_XLAT_TABLE_SIZE];

namespace {

struct NamedCode {
    xerr_t code;
    const char* name;
};

constexpr NamedCode kNamedCodes[] = {
#define XERR_NAME_ROW(name, value) {value, "XERR_" #name},
    XERR_NAMED_CODES(XERR_NAME_ROW)
#undef XERR_NAME_ROW
};

// 133 Linux error numbers less the two that Linux leaves unnamed.
static_assert(sizeof(kNamedCodes) / sizeof(kNamedCodes[0]) == 131,
              "every Linux error number from 1 to 133 except 41 and 58 has a name");

constexpr bool namedCodesFitTables() {
    // A loop, not std::all_of: the algorithms are constexpr only from C++20.
    // NOLINTNEXTLINE(readability-use-anyofallof)
    for (const NamedCode& row : kNamedCodes) {
        if (row.code <= 0 || row.code >= XERR_XLAT_TABLE_SIZE || row.code == 41 || row.code == 58) {
            return false;
        }
    }
    return true;
}
static_assert(namedCodesFitTables(), "named codes index both tables");
static_assert(XERR_XLAT_TABLE_SIZE <= XERR_STR_TABLE_SIZE, "every native number has a name slot");

}  // namespace

xerr_t xerrLibInit() {
    g_xerr_str_table[XERR_SUCCESS] = "XERR_SUCCESS";
    for (const NamedCode& row : kNamedCodes) {
        g_xerr_str_table[row.code] = row.name;
        g_xerr_xlat_table[row.code] = row.code;
    }
    return XERR_SUCCESS;
}

xerr_t xerrFromNative(int native) {
    // Negative numbers and numbers past the table have no slot; zero slots
    // (0, 41, 58, or tables not yet filled) have no translation either.
    if (native < 0 || native >= XERR_XLAT_TABLE_SIZE || g_xerr_xlat_table[native] == 0) {
        return native + XERR_NATIVE_BASE;
    }
    return g_xerr_xlat_table[native];
}

std::string xerrStr(xerr_t err) {
    if (err == XERR_FAILURE) return "XERR_FAILURE";
    if (err >= 0 && err < XERR_STR_TABLE_SIZE && g_xerr_str_table[err] != nullptr) {
        return g_xerr_str_table[err];
    }
    char text[160];
    if (err <= XERR_NATIVE_BASE) {
        (void)std::snprintf(text, sizeof(text), "NOTDEFINED: %d", err);
    } else {
        // The GNU strerror_r never shares a buffer with other threads.
        char nativeText[128];
        const char* reason = strerror_r(err - XERR_NATIVE_BASE, nativeText, sizeof(nativeText));
        (void)std::snprintf(text, sizeof(text), "NOTDEFINED: %d %s", err, reason);
    }
    return text;
}
