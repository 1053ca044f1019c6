// Gates and event logs for tests that check the order of work on other
// threads without sleeping. A gate opens once and stays open; destroying it
// opens it, so a failed assertion cannot leave a thread blocked on it. Every
// wait is bounded by a tolerance far beyond any honest delay, so a fault shows
// as a failure rather than a hung suite.
#pragma once

#include <chrono>
#include <condition_variable>
#include <mutex>
#include <string>
#include <vector>

// Long enough that only a fault (a task that never runs) reaches it.
constexpr std::chrono::seconds kGateTolerance{30};

class Gate {
  public:
    Gate() = default;
    ~Gate() { open(); }
    Gate(const Gate&) = delete;
    Gate& operator=(const Gate&) = delete;

    void open() {
        std::lock_guard<std::mutex> lock(mutex_);
        open_ = true;
        cond_.notify_all();
    }

    // True once the gate is open; false when the tolerance ran out first.
    bool wait(std::chrono::milliseconds tolerance = kGateTolerance) {
        std::unique_lock<std::mutex> lock(mutex_);
        return cond_.wait_for(lock, tolerance, [this] { return open_; });
    }

    bool isOpen() {
        std::lock_guard<std::mutex> lock(mutex_);
        return open_;
    }

  private:
    std::mutex mutex_;
    std::condition_variable cond_;
    bool open_ = false;
};

// Names of events in the order in which threads recorded them.
class EventLog {
  public:
    void record(const std::string& event) {
        std::lock_guard<std::mutex> lock(mutex_);
        events_.push_back(event);
        cond_.notify_all();
    }

    // True once at least `count` events are in; false when the tolerance ran
    // out first.
    bool waitForCount(size_t count, std::chrono::milliseconds tolerance = kGateTolerance) {
        std::unique_lock<std::mutex> lock(mutex_);
        return cond_.wait_for(lock, tolerance, [&] { return events_.size() >= count; });
    }

    std::vector<std::string> events() {
        std::lock_guard<std::mutex> lock(mutex_);
        return events_;
    }

  private:
    std::mutex mutex_;
    std::condition_variable cond_;
    std::vector<std::string> events_;
};
