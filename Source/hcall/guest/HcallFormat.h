// The entry and exit log formats of every operation, derived at compile time
// from its parameter kinds: "%s(%s, %d, %p)\n" and
// "returning [%d] from %s(%s, %d, %p)\n" for hcallGetPropsRpc.
#pragma once

#include "hcall/guest/HcallCatalogue.h"

namespace hcall {

struct FormatText {
    char text[112];
};

// `bounded` prints filled buffers with an explicit precision, for data that
// may lack its terminating NUL.
constexpr const char* conversionOf(Kind kind, bool bounded) {
    switch (kind) {
        case Str:
            return "%s";
        case Buf:
            return bounded ? "%.*s" : "%s";
        case I32:
        case Bool:
            return "%d";
        case OutI32:
        case OutU64:
            return "%p";
    }
    return "";
}

constexpr FormatText makeFormat(const OpInfo& op, bool exit, bool bounded) {
    FormatText format{};
    int n = 0;
    auto put = [&format, &n](const char* s) {
        while (*s) format.text[n++] = *s++;
    };
    if (exit) put("returning [%d] from ");
    put("%s(");
    for (int i = 0; i < op.numParams; ++i) {
        if (i > 0) put(", ");
        put(conversionOf(op.params[i], bounded));
    }
    put(")\n");
    return format;
}

template <uint32_t Code>
struct Formats {
    static constexpr FormatText entry = makeFormat(kOps[Code - 1], false, false);
    static constexpr FormatText exit = makeFormat(kOps[Code - 1], true, false);
    static constexpr FormatText boundedEntry = makeFormat(kOps[Code - 1], false, true);
    static constexpr FormatText boundedExit = makeFormat(kOps[Code - 1], true, true);
};

}  // namespace hcall
