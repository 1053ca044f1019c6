// Runs a piece of a test in a forked child, for state that must not leak into
// the test process. The body returns an empty text on success or what went
// wrong; a child the watchdog finds still running is killed and reported as hung.
#pragma once

#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <functional>
#include <string>

struct ChildOutcome {
    bool exited = false;  // ended through exit rather than a signal
    int exitCode = -1, signal = 0;
    bool hung = false;    // killed by the watchdog
    std::string message;  // what the body returned

    bool ok() const { return exited && exitCode == 0 && message.empty(); }
    std::string describe() const {
        if (hung) return "hung and was killed: " + message;
        if (!exited) return "killed by signal " + std::to_string(signal) + ": " + message;
        return "exit code " + std::to_string(exitCode) + ": " + message;
    }
};

inline int gChildReportFd = -1;  // inside a child: the write end of the pipe to the parent

// Inside a child: adds `text` to what the parent receives, for checks that
// run where the body cannot return (exit-time handlers of a body that calls
// exit()); any text fails the child.
inline void childReport(const std::string& text) {
    if (gChildReportFd >= 0) (void)!write(gChildReportFd, text.data(), text.size());
}

inline ChildOutcome runInChild(const std::function<std::string()>& body) {
    ChildOutcome outcome;
    int fds[2];
    if (pipe(fds) != 0) return ChildOutcome{false, -1, 0, false, "pipe failed"};
    const pid_t pid = fork();
    if (pid == 0) {
        close(fds[0]);
        gChildReportFd = fds[1];
        const std::string message = body();
        childReport(message);
        _exit(message.empty() ? 0 : 1);
    }
    close(fds[1]);
    // Far beyond what any body takes, even under a sanitizer.
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
    for (;;) {
        auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
            deadline - std::chrono::steady_clock::now());
        pollfd reader{fds[0], POLLIN, 0};
        int ready = left.count() > 0 ? poll(&reader, 1, static_cast<int>(left.count())) : 0;
        if (ready < 0 && errno == EINTR) continue;
        outcome.hung = ready == 0;
        char buf[512];
        const ssize_t got = outcome.hung ? 0 : read(fds[0], buf, sizeof(buf));
        if (got <= 0) break;
        outcome.message.append(buf, static_cast<size_t>(got));
    }
    close(fds[0]);
    if (pid < 0) return ChildOutcome{false, -1, 0, false, "fork failed"};
    if (outcome.hung) kill(pid, SIGKILL);
    int status = 0;
    if (waitpid(pid, &status, 0) == pid) {
        outcome.exited = WIFEXITED(status);
        outcome.exitCode = outcome.exited ? WEXITSTATUS(status) : -1;
        outcome.signal = WIFSIGNALED(status) ? WTERMSIG(status) : 0;
    }
    return outcome;
}
