// Runs a piece of a test in a forked child, for state that must not leak into
// the test process: time zones, mount namespaces, process exit, unstarted
// globals. The body returns an empty text on success or what went wrong. A
// child still running when the watchdog fires is killed and reported as hung,
// so a fault that makes the body loop for ever fails the test instead of
// stalling the suite.
#pragma once

#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <ctime>
#include <functional>
#include <string>

struct ChildOutcome {
    bool exited = false;  // ended through exit rather than a signal
    int exitCode = -1;
    int signal = 0;
    bool hung = false;    // killed by the watchdog
    std::string message;  // what the body returned

    bool ok() const { return exited && exitCode == 0 && message.empty(); }
    std::string describe() const {
        if (hung) return "hung and was killed: " + message;
        if (!exited) return "killed by signal " + std::to_string(signal) + ": " + message;
        return "exit code " + std::to_string(exitCode) + ": " + message;
    }
};

// Exit code a body's child uses to say that the set-up is not permitted here.
constexpr int kChildSkipExitCode = 77;

// Far beyond what any body takes, even under a sanitizer.
constexpr std::chrono::seconds kChildWatchdog{30};

// Inside a child of runInChild: the write end of the pipe to the parent.
inline int& childReportFd() {
    static int fd = -1;
    return fd;
}

// Inside a child: adds `text` to what the parent receives, for checks that
// run where the body cannot return (exit-time handlers of a body that calls
// exit()); any text fails the child.
inline void childReport(const std::string& text) {
    if (childReportFd() >= 0) (void)!write(childReportFd(), text.data(), text.size());
}

inline ChildOutcome runInChild(const std::function<std::string()>& body,
                               std::chrono::milliseconds watchdog = kChildWatchdog) {
    ChildOutcome outcome;
    int fds[2];
    if (pipe(fds) != 0) {
        outcome.message = "pipe failed";
        return outcome;
    }
    pid_t pid = fork();
    if (pid == 0) {
        close(fds[0]);
        childReportFd() = fds[1];
        std::string message = body();
        for (size_t done = 0; done < message.size();) {
            ssize_t written = write(fds[1], message.data() + done, message.size() - done);
            if (written <= 0) break;
            done += static_cast<size_t>(written);
        }
        _exit(message.empty() ? 0 : 1);
    }
    close(fds[1]);
    const auto deadline = std::chrono::steady_clock::now() + watchdog;
    for (;;) {
        auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
            deadline - std::chrono::steady_clock::now());
        pollfd reader{fds[0], POLLIN, 0};
        int ready = left.count() > 0 ? poll(&reader, 1, static_cast<int>(left.count())) : 0;
        if (ready < 0 && errno == EINTR) continue;
        if (ready == 0) {
            outcome.hung = pid > 0;
            break;
        }
        char buf[512];
        ssize_t got = read(fds[0], buf, sizeof(buf));
        if (got <= 0) break;
        outcome.message.append(buf, static_cast<size_t>(got));
    }
    close(fds[0]);
    if (pid < 0) {
        outcome.message = "fork failed";
        return outcome;
    }
    if (outcome.hung) kill(pid, SIGKILL);
    int status = 0;
    if (waitpid(pid, &status, 0) == pid) {
        outcome.exited = WIFEXITED(status);
        outcome.exitCode = outcome.exited ? WEXITSTATUS(status) : -1;
        outcome.signal = WIFSIGNALED(status) ? WTERMSIG(status) : 0;
    }
    return outcome;
}

// Runs `body` in a child with the time zone `tz` in force.
inline ChildOutcome runWithTimeZone(const char* tz, const std::function<std::string()>& body) {
    return runInChild([&] {
        setenv("TZ", tz, 1);
        tzset();
        return body();
    });
}
