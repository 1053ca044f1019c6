// Captures the lines the library's logger prints, through a caller's XlogLogger.
// Lines above the recorder's level are refused at the should-log step, so they
// are never formatted. One recorder at a time.
#pragma once

#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <mutex>
#include <string>
#include <vector>

#include "xpl/Xlog.h"

// A level as its letter; '?' for a value outside the five, so a wrong level
// shows in a comparison rather than reading past the letters.
inline std::string levelLetter(int level) {
    return std::string(1, level >= 0 && level < 5 ? "EWIDV"[level] : '?');
}

struct LoggedLine {
    int level, module;
    std::string file, function;
    int line;
    std::string format, text;
};

class LogRecorder {
  public:
    explicit LogRecorder(int maxLevel = XLOG_LEVEL_V) {
        state().maxLevel = maxLevel;
        clear();
        const XlogLogger logger = {&LogRecorder::shouldLog, &LogRecorder::print};
        xlogLibInit(&logger, "", "");
    }
    ~LogRecorder() {
        const XlogLogger defaults = {xlogShouldLog, xlogPrint};
        xlogLibInit(&defaults, "", "");
    }
    LogRecorder(const LogRecorder&) = delete;
    LogRecorder& operator=(const LogRecorder&) = delete;

    void clear() {
        std::lock_guard<std::mutex> lock(state().mutex);
        state().lines.clear();
        state().asked.clear();
    }
    std::vector<LoggedLine> lines(int module) const {
        std::lock_guard<std::mutex> lock(state().mutex);
        std::vector<LoggedLine> found;
        for (const LoggedLine& line : state().lines)
            if (line.module == module) found.push_back(line);
        return found;
    }
    // (module, level) pairs the should-log step was asked about.
    std::vector<std::pair<int, int>> asked() const {
        std::lock_guard<std::mutex> lock(state().mutex);
        return state().asked;
    }

  private:
    struct State {
        std::atomic<int> maxLevel{XLOG_LEVEL_V};
        std::mutex mutex;
        std::vector<LoggedLine> lines;
        std::vector<std::pair<int, int>> asked;
    };
    static State& state() {
        static State* const s = new State();  // outlives late lines at exit
        return *s;
    }
    static int shouldLog(int module, int level) {
        State& s = state();
        std::lock_guard<std::mutex> lock(s.mutex);
        s.asked.emplace_back(module, level);
        return level <= s.maxLevel ? 1 : 0;
    }
    __attribute__((format(printf, 6, 7))) static void print(int level, int module, const char* file,
                                                            const char* function, int line,
                                                            const char* format, ...) {
        va_list args;
        va_start(args, format);
        char* raw = nullptr;  // left alone when formatting fails
        const std::string text = vasprintf(&raw, format, args) >= 0 ? raw : "";
        va_end(args);
        free(raw);
        State& s = state();
        std::lock_guard<std::mutex> lock(s.mutex);
        s.lines.push_back(LoggedLine{level, module, file, function, line, format, text});
    }
};
