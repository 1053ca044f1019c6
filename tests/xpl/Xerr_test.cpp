// Result codes against the C library's own error names.
#include "xpl/Xerr.h"

#include <gtest/gtest.h>

#include <cstring>

namespace {

TEST(Xerr, EveryNumber_IsNamedAndTranslatedAsLinuxNamesIt) {
    ASSERT_EQ(xerrLibInit() + xerrLibInit(), XERR_SUCCESS) << "a second run writes the same";
    for (int n = -3; n <= XERR_STR_TABLE_SIZE; ++n) {
        // "XERR_" and the C library's name less its E; empty where Linux has none.
        const char* known = n >= 1 && n <= 133 ? strerrorname_np(n) : nullptr;
        const std::string name = n == 0    ? "XERR_SUCCESS"
                                 : n == -1 ? "XERR_FAILURE"
                                 : known   ? std::string("XERR_") + (known + 1)
                                           : "NOTDEFINED: " + std::to_string(n);
        EXPECT_EQ(xerrFromNative(n), known ? n : n + 100000) << n;
        EXPECT_EQ(xerrStr(n), name) << n;
    }
    EXPECT_EQ(xerrStr(100000), "NOTDEFINED: 100000") << "the base itself carries no number";
    EXPECT_EQ(xerrStr(100041), "NOTDEFINED: 100041 " + std::string(strerror(41)));
    EXPECT_EQ(xerrStr(100200), "NOTDEFINED: 100200 " + std::string(strerror(200)));
}

}  // namespace
