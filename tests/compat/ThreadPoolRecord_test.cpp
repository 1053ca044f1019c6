// The pool record as a caller declares it, without the library's header; every
// operation on value-initialised pools on the stack and the heap (where reading
// past the record meets AddressSanitizer).
#include <gtest/gtest.h>

#include <csignal>
#include <cstdarg>
#include <cstring>
#include <deque>
#include <functional>
#include <memory>
#include <thread>

#include "support/Gate.h"
#include "xpl/Xerr.h"
#include "xpl/Xlog.h"

struct ThreadPool {
    std::mutex mutex;
    std::condition_variable taskCond;
    std::deque<std::function<void()>> tasks;
    int32_t numThreads, stop, numActive;
    std::condition_variable doneCond;
};

xerr_t xthrPoolInit(ThreadPool* pool, int numThreads);
xerr_t xthrPoolAddTask(ThreadPool* pool, std::function<void()> task);
void xthrPoolFini(ThreadPool* pool);
void xthrPoolThreadEntry(ThreadPool* pool);

// The body leaves the pool finished or never started: no worker may outlive
// a record its caller simply destroys.
static void onStackAndHeap(const std::function<void(ThreadPool&)>& body) {
    ThreadPool pool{};
    body(pool);
    SCOPED_TRACE("on the heap");
    body(*std::make_unique<ThreadPool>());
}

TEST(ThreadPoolRecord, OneWorker_RunsTasksInOrderAndFiniDrainsTheQueue) {
    onStackAndHeap([](ThreadPool& pool) {
        EventLog events;
        Gate added, release;
        xthrPoolAddTask(&pool, [&] {
            xthrPoolAddTask(&pool, [&] { events.record("added by 0"); });
            added.open();
            release.wait();
            events.record("0");
        });
        std::vector<std::string> expected = {"0"};
        for (int i = 1; i < 20; ++i) {
            expected.push_back(std::to_string(i));
            xthrPoolAddTask(&pool, [&, i] { events.record(std::to_string(i)); });
        }
        expected.push_back("added by 0");
        ASSERT_EQ(xthrPoolInit(&pool, 1), XERR_SUCCESS);
        ASSERT_TRUE(added.wait());
        std::thread finisher([&] { xthrPoolFini(&pool); });
        for (bool stopping = false; !stopping; std::this_thread::yield()) {
            std::lock_guard<std::mutex> lock(pool.mutex);
            stopping = pool.stop != 0;
        }
        release.open();
        finisher.join();
        EXPECT_EQ(events.events(), expected);
        EXPECT_EQ(pool.numActive, 0);
        xthrPoolFini(&pool);  // finds no worker and returns at once
    });
}

TEST(ThreadPoolRecord, Init_WhenCountZeroOrNegative_KeepsTasksForThreadEntry) {
    for (int count : {0, -1}) {
        SCOPED_TRACE(count);
        onStackAndHeap([count](ThreadPool& pool) {
            EventLog events;
            EXPECT_EQ(xthrPoolAddTask(&pool, [&] { events.record("first"); }), XERR_SUCCESS);
            xthrPoolAddTask(&pool, std::function<void()>());
            xthrPoolAddTask(&pool, [&] { events.record("second"); });
            EXPECT_EQ(xthrPoolInit(&pool, count), XERR_SUCCESS);
            EXPECT_EQ(std::pair(pool.numThreads, pool.numActive), std::pair(count, count));
            xthrPoolFini(&pool);
            EXPECT_EQ(std::pair(pool.stop, pool.tasks.size()), std::pair(1, size_t{3}));
            xthrPoolThreadEntry(&pool);
            EXPECT_EQ(events.events(), (std::vector<std::string>{"first", "second"}));
        });
    }
}

TEST(ThreadPoolRecord, Init_WhenSeveralWorkers_RunsTasksSideBySide) {
    onStackAndHeap([](ThreadPool& pool) {
        Gate warm, second;
        ASSERT_EQ(xthrPoolInit(&pool, 2), XERR_SUCCESS);
        xthrPoolAddTask(&pool, [&] { warm.open(); });
        ASSERT_TRUE(warm.wait());
        // Each task must wake a waiting worker: only a second opens the first's gate.
        xthrPoolAddTask(&pool, [&] { second.wait(); });
        xthrPoolAddTask(&pool, [&] { second.open(); });
        EXPECT_TRUE(second.wait()) << "the tasks waited for xthrPoolFini";
        xthrPoolFini(&pool);
    });
}

static ThreadPool* const gFatalPool = new ThreadPool();
static void printToStderr(int level, int module, const char* file, const char*, int line,
                          const char* format, ...) {
    const bool lockFree = gFatalPool->mutex.try_lock();
    if (lockFree) gFatalPool->mutex.unlock();
    char text[256];
    va_list args;
    va_start(args, format);
    std::vsnprintf(text, sizeof(text), format, args);
    va_end(args);
    const bool ownLine = std::strstr(text, (":" + std::to_string(line) + " ").c_str()) != nullptr;
    std::fprintf(stderr, "level=%d module=%d file=%s lock=%s line=%s msg=%s|\n", level, module,
                 file, lockFree ? "free" : "held", ownLine ? "same" : "other", text);
}

static void addAfterFini() {
    static const XlogLogger logger = {[](int, int) { return 1; }, printToStderr};
    xlogLibInit(&logger, "", "*:I");
    xthrPoolInit(gFatalPool, 1);
    xthrPoolFini(gFatalPool);
    xthrPoolAddTask(gFatalPool, [] {});
}

TEST(ThreadPoolRecordDeathTest, AddTask_AfterFini_PrintsFatalLineWithoutLockAndEndsProcess) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_EXIT(addAfterFini(), testing::KilledBySignal(SIGTRAP),
                "level=0 module=43 file=Source/xpl/XthrPool lock=free line=same "
                "msg=FATAL: DEBUG BREAK: Source/xpl/XthrPool:[0-9]+ xthrPoolAddTask\\(\\)\\|");
}
