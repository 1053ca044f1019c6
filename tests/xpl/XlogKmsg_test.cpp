// The default print's kernel-log sink. The stream is opened once per process,
// so every case runs in a child of its own; the parent never prints. Children
// write to the device path only after binding a file of their own over it in
// a private mount namespace.
#include <android/log.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <stdlib.h>
#include <sys/mount.h>
#include <sys/stat.h>

#include <condition_variable>
#include <fstream>
#include <mutex>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "support/AndroidLogCapture.h"
#include "support/ChildProcess.h"
#include "xpl/Xlog.h"

namespace {

constexpr const char* kFile = "tests/xpl/XlogKmsg_test";
constexpr const char* kFunction = "void test()";

std::string readFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

// In the child: makes "/dev/kmsg" a private temporary file and lets the
// library open it. Exits with kChildSkipExitCode where namespaces are not
// permitted; never lets a print reach the machine's device.
std::string bindPrivateKmsg() {
    if (unshare(CLONE_NEWNS) != 0) _exit(kChildSkipExitCode);
    if (mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) _exit(kChildSkipExitCode);
    char path[] = "/tmp/xlog_kmsg_XXXXXX";
    int fd = mkstemp(path);
    if (fd < 0) _exit(kChildSkipExitCode);
    close(fd);
    if (mount(path, "/dev/kmsg", nullptr, MS_BIND, nullptr) != 0) _exit(kChildSkipExitCode);
    struct stat info {};
    if (stat("/dev/kmsg", &info) != 0 || !S_ISREG(info.st_mode)) _exit(kChildSkipExitCode);
    setenv("HOSTCALL_TEST_KMSG", "passthrough", 1);
    return path;
}

void expectChildPassed(const ChildOutcome& outcome) {
    if (outcome.exited && outcome.exitCode == kChildSkipExitCode) {
        GTEST_SKIP() << "a private mount namespace with /dev/kmsg bound over is not permitted here";
    }
    EXPECT_TRUE(outcome.ok()) << outcome.message << " (signal " << outcome.signal << ")";
}

TEST(XlogKmsg, Print_WritesTheSameMessageToBothSinksAsFormatted) {
    expectChildPassed(runInChild([] {
        std::string kmsg = bindPrivateKmsg();
        AndroidLogCapture capture;
        xlogPrint(XLOG_LEVEL_W, XLOG_MODULE_VMSG, kFile, kFunction, __LINE__, "%s=%d;", "alpha", 7);
        std::string afterFirst = readFile(kmsg);
        xlogPrint(XLOG_LEVEL_E, XLOG_MODULE_VMSG, kFile, kFunction, __LINE__, "no line end");
        std::string written = readFile(kmsg);
        unlink(kmsg.c_str());
        if (afterFirst != "alpha=7;") return "not flushed at once: '" + afterFirst + "'";
        if (written != "alpha=7;no line end") return "kernel log got '" + written + "'";
        auto lines = capture.lines();
        if (lines.size() != 2 || lines[0].text != "alpha=7;" || lines[1].text != "no line end" ||
            lines[0].priority != ANDROID_LOG_WARN) {
            return std::string("the Android log did not get the same messages");
        }
        return std::string();
    }));
}

TEST(XlogKmsg, FirstPrintsOnManyThreads_ShareOneStream) {
    expectChildPassed(runInChild([] {
        std::string kmsg = bindPrivateKmsg();
        AndroidLogCapture capture;
        constexpr int kThreads = 8;
        std::mutex mutex;
        std::condition_variable cond;
        bool go = false;
        std::vector<std::thread> threads;
        for (int i = 0; i < kThreads; ++i) {
            threads.emplace_back([&, i] {
                {  // acquire lock
                    std::unique_lock<std::mutex> lock(mutex);
                    cond.wait(lock, [&] { return go; });
                }  // release lock
                xlogPrint(XLOG_LEVEL_E, XLOG_MODULE_XTHR, kFile, kFunction, __LINE__, "thread %d\n",
                          i);
            });
        }
        {  // acquire lock
            std::lock_guard<std::mutex> lock(mutex);
            go = true;
        }  // release lock
        cond.notify_all();
        for (std::thread& t : threads) t.join();
        std::string written = readFile(kmsg);
        unlink(kmsg.c_str());
        for (int i = 0; i < kThreads; ++i) {
            std::string line = "thread " + std::to_string(i) + "\n";
            // A second opening in "w+" mode would have truncated earlier lines.
            if (written.find(line) == std::string::npos) return "lost " + line + written;
        }
        return std::string();
    }));
}

TEST(XlogKmsg, WhenDeviceCannotBeOpened_AndroidLogStillGetsLinesAndNoRetry) {
    // No device involved: the redirect points at a folder that does not exist.
    char dir[] = "/tmp/xlog_nokmsg_XXXXXX";
    ASSERT_NE(mkdtemp(dir), nullptr);
    std::string missing = std::string(dir) + "/later";
    std::string target = missing + "/kmsg";
    ChildOutcome outcome = runInChild([&] {
        setenv("HOSTCALL_TEST_KMSG", target.c_str(), 1);
        AndroidLogCapture capture;
        xlogPrint(XLOG_LEVEL_E, XLOG_MODULE_XLOG, kFile, kFunction, __LINE__, "first");
        mkdir(missing.c_str(), 0700);
        xlogPrint(XLOG_LEVEL_E, XLOG_MODULE_XLOG, kFile, kFunction, __LINE__, "second");
        struct stat info {};
        if (stat(target.c_str(), &info) == 0) return std::string("the open was tried again");
        if (capture.lines().size() != 2) return std::string("Android log lines were lost");
        return std::string();
    });
    EXPECT_TRUE(outcome.ok()) << outcome.message;
    rmdir(missing.c_str());
    rmdir(dir);
}

}  // namespace
