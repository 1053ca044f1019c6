// A worker thread that cannot be created: xthrPoolInit reports the error, the
// workers already started keep running, and a later xthrPoolFini waits only
// for them. The system's thread limit is stood in for at pthread_create.

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <string>

#include "support/Gate.h"
#include "threading/ThreadCreateFault.h"
#include "xpl/Xlog.h"
#include "xpl/XthrPool.h"

namespace {

std::string gXthrLines;

int logEverything(int, int) { return 1; }

void keepXthrLines(int, int module, const char*, const char*, int, const char* format, ...) {
    if (module != XLOG_MODULE_XTHR) return;
    char text[256];
    va_list args;
    va_start(args, format);
    std::vsnprintf(text, sizeof(text), format, args);
    va_end(args);
    gXthrLines += text;
}

// Regression: xthrPoolFini waited for every worker asked for, started or not,
// and so never returned.
TEST(XthrPoolThreadFailure, Init_WhenCreationFailsPartWay_ReportsErrorAndFiniWaitsOnlyForStarted) {
    ThreadPool pool;
    std::atomic<int> runs{0};
    const XlogLogger logger = {logEverything, keepXthrLines};
    xlogLibInit(&logger, "", "");
    {
        ThreadCreateFault fault(/*succeedFirst=*/2);
        EXPECT_EQ(xthrPoolInit(&pool, 4), XERR_AGAIN) << "the creation error is the result";
    }
    EXPECT_EQ(gXthrLines, "xthrPoolInit: started 2 of 4 workers, error 11\n")
        << "native_init ignores the result, so the line is all that tells of it";
    EXPECT_EQ(pool.numThreads, 4) << "the count asked for is still recorded";
    EXPECT_EQ(pool.numActive, 2) << "only the two workers that exist are waited for";

    // Both started workers are live: each holds a task until the other runs.
    Gate firstRunning;
    Gate secondRunning;
    xthrPoolAddTask(&pool, [&] {
        firstRunning.open();
        if (secondRunning.wait()) ++runs;
    });
    xthrPoolAddTask(&pool, [&] {
        secondRunning.open();
        if (firstRunning.wait()) ++runs;
    });
    xthrPoolFini(&pool);
    EXPECT_EQ(runs, 2) << "the started workers run tasks side by side";
    EXPECT_EQ(pool.numActive, 0);
}

}  // namespace
