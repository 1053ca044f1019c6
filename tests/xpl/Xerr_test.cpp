// Result codes against the C library's own error names.
#include "xpl/Xerr.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

namespace {

// "XERR_" and the C library's name less its E; empty where Linux has none.
std::string linuxName(int n) {
    const char* name = n >= 1 && n <= 133 ? strerrorname_np(n) : nullptr;
    return name != nullptr ? std::string("XERR_") + (name + 1) : std::string();
}

TEST(Xerr, EveryNumber_IsNamedAndTranslatedAsLinuxNamesIt) {
    ASSERT_EQ(xerrLibInit(), XERR_SUCCESS);
    ASSERT_EQ(xerrLibInit(), XERR_SUCCESS) << "a second run writes the same values";
    for (int n = -3; n <= XERR_STR_TABLE_SIZE; ++n) {
        SCOPED_TRACE(n);
        const std::string name = n == 0 ? "XERR_SUCCESS" : n == -1 ? "XERR_FAILURE" : linuxName(n);
        EXPECT_EQ(xerrFromNative(n), linuxName(n).empty() ? n + 100000 : n);
        EXPECT_EQ(xerrStr(n), name.empty() ? "NOTDEFINED: " + std::to_string(n) : name);
    }
    EXPECT_EQ(xerrStr(100000), "NOTDEFINED: 100000") << "the base itself carries no number";
    EXPECT_EQ(xerrStr(100041), "NOTDEFINED: 100041 " + std::string(strerror(41)));
    EXPECT_EQ(xerrStr(100200), "NOTDEFINED: 100200 " + std::string(strerror(200)));
}

}  // namespace
