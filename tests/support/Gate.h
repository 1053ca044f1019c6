// Gates and event logs order work on other threads without sleeping. A gate
// opens on destruction too, so a failed assertion leaves no thread blocked; every
// wait is bounded, so a fault shows as a failure rather than a hung suite.
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
    ~Gate() { open(); }  // its mutex already makes it not copyable

    void open() {
        std::lock_guard<std::mutex> lock(mutex_);
        open_ = true;
        cond_.notify_all();
    }

    // False when the tolerance ran out first.
    bool wait(std::chrono::milliseconds tolerance = kGateTolerance) {
        std::unique_lock<std::mutex> lock(mutex_);
        return cond_.wait_for(lock, tolerance, [this] { return open_; });
    }

  private:
    std::mutex mutex_;
    std::condition_variable cond_;
    bool open_ = false;
};

class EventLog {
  public:
    void record(const std::string& event) {
        std::lock_guard<std::mutex> lock(mutex_);
        events_.push_back(event);
        cond_.notify_all();
    }

    // False when the tolerance ran out before `count` events were in.
    bool waitForCount(size_t count) {
        std::unique_lock<std::mutex> lock(mutex_);
        return cond_.wait_for(lock, kGateTolerance, [&] { return events_.size() >= count; });
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
