// Splitting and level specifications against references written from their
// rules. The first byte picks the subject: odd splits (the next byte's low
// three bits give the number of delimiter bytes that follow, the rest is the
// text), even applies the rest as a level specification.
#include <algorithm>
#include <cstring>
#include <string>
#include <vector>

#include "FuzzCheck.h"
#include "support/LogRecorder.h"
#include "xpl/Xlog.h"
#include "xpl/Xstr.h"

namespace {

// Cut at every delimiter; drop the empty pieces but the last; trim the rest.
std::vector<std::string> referenceSplit(const std::string& s, const std::string& delims) {
    std::vector<std::string> pieces(1), fields;
    for (const char c : s)
        delims.find(c) == std::string::npos ? pieces.back() += c : pieces.emplace_back();
    for (size_t i = 0; i < pieces.size(); ++i) {
        const size_t first = pieces[i].find_first_not_of(" \t\n\v\f\r");
        const size_t last = pieces[i].find_last_not_of(" \t\n\v\f\r");
        if (!pieces[i].empty() || i + 1 == pieces.size())
            fields.push_back(
                first == std::string::npos ? "" : pieces[i].substr(first, last - first + 1));
    }
    return fields;
}

// Tokens at blanks, parts at colons; a token applies when it has two parts
// and the level part starts with one of E W I D V; the first that does not
// stops the rest with XERR_INVAL.
xerr_t referenceLevels(const std::string& text, int* levels) {
    static const char kLetters[] = "EWIDV";
    for (const std::string& token : referenceSplit(text, " ")) {
        const std::vector<std::string> parts = referenceSplit(token, ":");
        if (parts.size() != 2 || parts[1].empty() || parts[1][0] == '\0') return XERR_INVAL;
        const char* letter = std::strchr(kLetters, parts[1][0]);
        if (letter == nullptr) return XERR_INVAL;
        for (int m = 0; m < XLOG_NUM_MODULES; ++m)
            if (parts[0] == "*" || parts[0] == g_xlog->modules[m].tag)
                levels[m] = int(letter - kLetters);
    }
    return XERR_SUCCESS;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    // The default start fills the level letters and module tags; the recorder
    // formats every line in full, then drops it.
    static LogRecorder* log = (xlogLibInit(nullptr, "", ""), new LogRecorder());
    log->clear();
    if (size < 2) return 0;
    const std::string input(reinterpret_cast<const char*>(data) + 1, size - 1);
    if (data[0] & 1) {
        const size_t n = std::min<size_t>(input[0] & 7, input.size() - 1);
        const std::string delims = input.substr(1, n), text = input.substr(1 + n);
        fuzz::expect(xstrSplit(text, delims) == referenceSplit(text, delims), "xstrSplit's rules");
        return 0;
    }
    int want[XLOG_NUM_MODULES];  // a known, uneven start, so that every change shows
    for (int m = 0; m < XLOG_NUM_MODULES; ++m) g_xlog->modules[m].level = want[m] = m % 5;
    fuzz::expect(xlogSetLevels(input) == referenceLevels(input, want), "xlogSetLevels' result");
    fuzz::expect(std::equal(want, want + XLOG_NUM_MODULES, g_xlog->modules,
                            [](int level, const XlogModule& m) { return level == m.level; }),
                 "the levels the rules set");
    return 0;
}
