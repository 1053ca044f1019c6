// Captures every line the library's logger is asked to print, through a
// caller-supplied XlogLogger installed with xlogLibInit. Lines above the
// recorder's level are refused at the should-log step, so they are never
// formatted. One recorder at a time; the destructor reinstates the default
// operations.
#pragma once

#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <mutex>
#include <string>
#include <vector>

#include "xpl/Xlog.h"

struct LoggedLine {
    int level;
    int module;
    std::string file;
    std::string function;
    int line;
    std::string format;
    std::string text;
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

    void setMaxLevel(int level) { state().maxLevel = level; }
    void clear() {
        std::lock_guard<std::mutex> lock(state().mutex);
        state().lines.clear();
        state().asked.clear();
    }
    // Lines printed under `module`, in order.
    std::vector<LoggedLine> lines(int module) const {
        std::lock_guard<std::mutex> lock(state().mutex);
        std::vector<LoggedLine> found;
        for (const LoggedLine& line : state().lines)
            if (line.module == module) found.push_back(line);
        return found;
    }
    // Texts of the lines printed under `module`, in order.
    std::vector<std::string> texts(int module) const {
        std::vector<std::string> found;
        for (const LoggedLine& line : lines(module)) found.push_back(line.text);
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
        va_list measure;
        va_copy(measure, args);
        int size = std::vsnprintf(nullptr, 0, format, measure);
        va_end(measure);
        std::string text(size > 0 ? size_t(size) : 0, '\0');
        std::vsnprintf(&text[0], text.size() + 1, format, args);
        va_end(args);
        State& s = state();
        std::lock_guard<std::mutex> lock(s.mutex);
        s.lines.push_back(LoggedLine{level, module, file, function, line, format, text});
    }
};
