// Runs a piece of a test in a forked child, for state that must not leak into
// the test process: time zones, mount namespaces, process exit, unstarted
// globals. The body returns an empty text on success or what went wrong.
#pragma once

#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <ctime>
#include <functional>
#include <string>

struct ChildOutcome {
    bool exited = false;  // ended through exit rather than a signal
    int exitCode = -1;
    int signal = 0;
    std::string message;  // what the body returned

    bool ok() const { return exited && exitCode == 0 && message.empty(); }
};

// Exit code a body's child uses to say that the set-up is not permitted here.
constexpr int kChildSkipExitCode = 77;

inline ChildOutcome runInChild(const std::function<std::string()>& body) {
    ChildOutcome outcome;
    int fds[2];
    if (pipe(fds) != 0) {
        outcome.message = "pipe failed";
        return outcome;
    }
    pid_t pid = fork();
    if (pid == 0) {
        close(fds[0]);
        std::string message = body();
        const char* data = message.data();
        size_t left = message.size();
        while (left > 0) {
            ssize_t written = write(fds[1], data, left);
            if (written <= 0) break;
            data += written;
            left -= static_cast<size_t>(written);
        }
        _exit(message.empty() ? 0 : 1);
    }
    close(fds[1]);
    char buf[512];
    ssize_t got;
    while ((got = read(fds[0], buf, sizeof(buf))) > 0) {
        outcome.message.append(buf, static_cast<size_t>(got));
    }
    close(fds[0]);
    int status = 0;
    if (pid > 0 && waitpid(pid, &status, 0) == pid) {
        outcome.exited = WIFEXITED(status);
        outcome.exitCode = outcome.exited ? WEXITSTATUS(status) : -1;
        outcome.signal = WIFSIGNALED(status) ? WTERMSIG(status) : 0;
    } else if (pid < 0) {
        outcome.message = "fork failed";
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
