// Captures what reaches the Android log through liblog's own logger hook. One
// capture at a time; the destructor hands liblog back to its stderr logger.
#pragma once

#include <android/log.h>

#include <mutex>
#include <string>
#include <utility>
#include <vector>

struct AndroidLogLine {
    int priority;
    std::string tag, text;
};

class AndroidLogCapture {
  public:
    AndroidLogCapture() {
        take();
        __android_log_set_logger(&AndroidLogCapture::record);
        previousMinimum_ = __android_log_set_minimum_priority(ANDROID_LOG_VERBOSE);
    }
    ~AndroidLogCapture() {
        __android_log_set_minimum_priority(previousMinimum_);
        __android_log_set_logger(__android_log_stderr_logger);
    }
    AndroidLogCapture(const AndroidLogCapture&) = delete;
    AndroidLogCapture& operator=(const AndroidLogCapture&) = delete;

    std::vector<AndroidLogLine> lines() const {
        Sink& s = sink();
        std::lock_guard<std::mutex> lock(s.mutex);
        return s.lines;
    }

    // The lines so far, which the capture then forgets: a long run takes them
    // now and then so that the capture does not grow with the run.
    std::vector<AndroidLogLine> take() {
        Sink& s = sink();
        std::lock_guard<std::mutex> lock(s.mutex);
        return std::exchange(s.lines, {});
    }

  private:
    struct Sink {
        std::mutex mutex;
        std::vector<AndroidLogLine> lines;
    };

    static Sink& sink() {
        static Sink* const s = new Sink();  // outlives late lines at exit
        return *s;
    }

    static void record(const struct __android_logger_data* data, const char* message) {
        Sink& s = sink();
        std::lock_guard<std::mutex> lock(s.mutex);
        s.lines.push_back({data->priority, data->tag != nullptr ? data->tag : "",
                           message != nullptr ? message : ""});
    }

    int previousMinimum_ = ANDROID_LOG_DEFAULT;
};
