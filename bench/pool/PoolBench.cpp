// Tasks per second through the worker pool with one worker, fed by one and by
// two producer threads, beside boost::asio::thread_pool with one thread doing
// the same work in the same run. Prints table rows (bench/common/BenchRow.h).

#include <atomic>
#include <boost/asio/post.hpp>
#include <boost/asio/thread_pool.hpp>
#include <condition_variable>
#include <functional>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "../common/BenchRow.h"
#include "../common/Interleaved.h"
#include "xpl/XthrPool.h"

namespace {

constexpr int kTasksPerRound = 60000;

// What every task does: a little work on its captured values, so that the
// task object is the size of a typical event task's small captures.
std::atomic<long> gDone{0};
struct Work {
    long* sink;
    int value;
    void operator()() const {
        *sink += value;
        gDone.fetch_add(1, std::memory_order_relaxed);
    }
};
long gSink = 0;  // written by the single worker only

// A task shaped like an event's: a string copied out of the caller, which a
// std::function cannot keep inside itself.
struct EventWork {
    std::string text;
    long* sink;
    void operator()() const {
        *sink += long(text.size());
        gDone.fetch_add(1, std::memory_order_relaxed);
    }
};
const std::string kEventText = "com.example.notes.MainActivity";

// Tells the measuring thread that the worker has run everything queued
// before it.
class Fence {
  public:
    void signal() {
        std::lock_guard<std::mutex> lock(mMutex);
        mDone = true;
        mCond.notify_one();
    }
    void wait() {
        std::unique_lock<std::mutex> lock(mMutex);
        mCond.wait(lock, [this] { return mDone; });
        mDone = false;
    }

  private:
    std::mutex mMutex;
    std::condition_variable mCond;
    bool mDone = false;
};

struct Xthr {
    static XthrPool& pool() {
        // Never finished: its worker lives to the end of the process.
        static XthrPool* p = [] {
            auto* created = new XthrPool();
            xthrPoolInit(created, 1);
            return created;
        }();
        return *p;
    }
    template <typename Task>
    static void post(Task task) {
        xthrPoolAddTask(&pool(), std::move(task));
    }
    static void fence(Fence& f) {
        xthrPoolAddTask(&pool(), [&f] { f.signal(); });
    }
};

struct Asio {
    static boost::asio::thread_pool& pool() {
        static auto* p = new boost::asio::thread_pool(1);
        return *p;
    }
    template <typename Task>
    static void post(Task task) {
        boost::asio::post(pool(), std::move(task));
    }
    static void fence(Fence& f) {
        boost::asio::post(pool(), [&f] { f.signal(); });
    }
};

// The i-th task a producer queues.
template <typename Task>
Task makeTask(int i);
template <>
Work makeTask<Work>(int i) {
    return Work{&gSink, i};
}
template <>
EventWork makeTask<EventWork>(int) {
    return EventWork{kEventText, &gSink};
}

// One block: `producers` threads queue `count` rounds of kTasksPerRound tasks
// between them, and each round ends when the worker has run its last task.
template <typename Pool, typename Task>
std::function<void(int)> rounds(int producers) {
    return [producers](int count) {
        Fence fence;
        for (int round = 0; round < count; ++round) {
            std::vector<std::thread> threads;
            for (int p = 0; p < producers; ++p) {
                threads.emplace_back([p, producers] {
                    for (int i = p; i < kTasksPerRound; i += producers)
                        Pool::post(makeTask<Task>(i));
                });
            }
            for (std::thread& t : threads) t.join();
            Pool::fence(fence);
            fence.wait();
        }
    };
}

// Rounds per contender; each takes some ten milliseconds, long enough that a
// round rarely ends in another scheduling regime than it began in.
constexpr int kRounds = 61;

template <typename Task>
void compare(const char* what, int producers, const char* target) {
    bench::Contender xthr{rounds<Xthr, Task>(producers), {}};
    bench::Contender asio{rounds<Asio, Task>(producers), {}};
    bench::interleave({&xthr, &asio}, kRounds, 1);
    // Wall-clock time: the producers and the worker run side by side.
    const double perSecond = 1e9 * kTasksPerRound;
    bench::printRow(
        {"worker pool",
         std::string(what) + ", " + std::to_string(producers) + " producer(s) -> 1 worker",
         perSecond / xthr.medianNs(), "tasks/s", "asio::thread_pool(1)",
         perSecond / asio.medianNs(), target});
}

}  // namespace

int main() {
    for (int producers : {1, 2}) compare<Work>("small tasks/s", producers, ">=0.90");
    for (int producers : {1, 2}) compare<EventWork>("tasks/s with a string", producers, "-");
    return 0;
}
