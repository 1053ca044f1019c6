// Splitting and level specifications against references written from their
// rules. The first byte picks the subject: odd splits (the next byte's low
// three bits give the number of delimiter bytes that follow, the rest is the
// text), even applies the rest as a level specification.
#include <algorithm>
#include <string>
#include <vector>

#include "FuzzCheck.h"
#include "FuzzLogger.h"
#include "xpl/Xlog.h"
#include "xpl/Xstr.h"

namespace {

using fuzz::expect;

std::string trimmed(const std::string& s) {
    static const std::string kSpace(" \t\n\v\f\r");
    const size_t first = s.find_first_not_of(kSpace);
    if (first == std::string::npos) return "";
    return s.substr(first, s.find_last_not_of(kSpace) - first + 1);
}

// Cut at every delimiter; drop the empty pieces, except the last piece, which
// is always kept; trim what remains.
std::vector<std::string> referenceSplit(const std::string& s, const std::string& delims) {
    std::vector<std::string> pieces(1);
    for (const char c : s) {
        if (delims.find(c) != std::string::npos) {
            pieces.emplace_back();
        } else {
            pieces.back() += c;
        }
    }
    std::vector<std::string> fields;
    for (size_t i = 0; i < pieces.size(); ++i)
        if (!pieces[i].empty() || i + 1 == pieces.size()) fields.push_back(trimmed(pieces[i]));
    return fields;
}

const char* const kTags[] = {
#define FUZZ_TAG(tag) #tag,
    XLOG_MODULES(FUZZ_TAG)
#undef FUZZ_TAG
};
static_assert(sizeof(kTags) / sizeof(kTags[0]) == XLOG_NUM_MODULES, "one tag per module");

// Tokens at blanks, parts at colons; a token applies when it has two parts
// and the level part starts with one of E W I D V; the first that does not
// stops the rest with XERR_INVAL.
xerr_t referenceLevels(const std::string& spec, int* levels) {
    static const std::string kLetters("EWIDV");
    for (const std::string& token : referenceSplit(spec, " ")) {
        const std::vector<std::string> parts = referenceSplit(token, ":");
        if (parts.size() != 2 || parts[1].empty()) return XERR_INVAL;
        const size_t level = kLetters.find(parts[1][0]);
        if (level == std::string::npos) return XERR_INVAL;
        for (int m = 0; m < XLOG_NUM_MODULES; ++m)
            if (parts[0] == "*" || parts[0] == kTags[m]) levels[m] = int(level);
    }
    return XERR_SUCCESS;
}

void fuzzSplit(const uint8_t* data, size_t size) {
    const size_t n = size == 0 ? 0 : std::min<size_t>(data[0] & 7, size - 1);
    const std::string delims(reinterpret_cast<const char*>(data) + (size ? 1 : 0), n);
    const size_t start = (size ? 1 : 0) + n;
    const std::string text(reinterpret_cast<const char*>(data) + start, size - start);
    expect(xstrSplit(text, delims) == referenceSplit(text, delims), "xstrSplit follows its rules");
}

void fuzzLevels(const uint8_t* data, size_t size) {
    // A known, uneven start, so that every change shows.
    int want[XLOG_NUM_MODULES];
    for (int m = 0; m < XLOG_NUM_MODULES; ++m) g_xlog->modules[m].level = want[m] = m % 5;
    const std::string spec(reinterpret_cast<const char*>(data), size);
    const xerr_t wantResult = referenceLevels(spec, want);
    expect(xlogSetLevels(spec) == wantResult, "xlogSetLevels answers as the rules say");
    for (int m = 0; m < XLOG_NUM_MODULES; ++m)
        expect(g_xlog->modules[m].level == want[m], "the levels are the ones the rules set");
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    // The default start-up fills the level letters and the module tags; then
    // every line is formatted but goes nowhere.
    xlogLibInit(nullptr, "", "");
    fuzz::installFormattingLogger();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size == 0) return 0;
    if (data[0] & 1) {
        fuzzSplit(data + 1, size - 1);
    } else {
        fuzzLevels(data + 1, size - 1);
    }
    return 0;
}
