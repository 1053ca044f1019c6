// Runs one scenario of the exit helper program in its own process and watches
// it: a process that has not ended when the watchdog fires is killed and
// reported as hung.
#pragma once

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <vector>

extern char** environ;

// Far beyond the few milliseconds an exit takes, even under a sanitizer.
constexpr std::chrono::seconds kExitWatchdog{20};

struct ExitRun {
    bool hung = false;
    int status = 0;      // as from waitpid, valid when not hung
    std::string output;  // what the helper wrote to standard output

    bool exitedCleanly() const { return !hung && WIFEXITED(status) && WEXITSTATUS(status) == 0; }

    std::string describe() const {
        if (hung) return "hung and was killed; output: " + output;
        if (WIFSIGNALED(status)) {
            return "killed by signal " + std::to_string(WTERMSIG(status)) + "; output: " + output;
        }
        return "exit status " + std::to_string(WEXITSTATUS(status)) + "; output: " + output;
    }
};

inline ExitRun runExitScenario(const std::vector<std::string>& args) {
    ExitRun run;
    int fds[2];
    if (pipe2(fds, O_CLOEXEC) != 0) {
        run.hung = true;
        run.output = "pipe failed";
        return run;
    }
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, fds[1], STDOUT_FILENO);
    std::vector<char*> argv;
    std::string program = XPL_EXIT_HELPER;
    argv.push_back(program.data());
    std::vector<std::string> copies = args;
    for (std::string& arg : copies) argv.push_back(arg.data());
    argv.push_back(nullptr);
    pid_t pid = -1;
    int err = posix_spawn(&pid, program.c_str(), &actions, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    close(fds[1]);
    if (err != 0) {
        close(fds[0]);
        run.hung = true;
        run.output = "spawn failed";
        return run;
    }
    auto deadline = std::chrono::steady_clock::now() + kExitWatchdog;
    bool reaped = false;
    while (!reaped) {
        pollfd readable{fds[0], POLLIN, 0};
        if (poll(&readable, 1, 10) > 0) {
            char buf[512];
            ssize_t got = read(fds[0], buf, sizeof(buf));
            if (got > 0) run.output.append(buf, static_cast<size_t>(got));
        }
        reaped = waitpid(pid, &run.status, WNOHANG) == pid;
        if (!reaped && std::chrono::steady_clock::now() > deadline) {
            kill(pid, SIGKILL);
            waitpid(pid, &run.status, 0);
            run.hung = true;
            reaped = true;
        }
    }
    char buf[512];
    ssize_t got;
    while ((got = read(fds[0], buf, sizeof(buf))) > 0) run.output.append(buf, size_t(got));
    close(fds[0]);
    return run;
}
