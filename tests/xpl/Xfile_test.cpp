#include "xpl/Xfile.h"

#include <android/log.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>

#include "support/AndroidLogCapture.h"
#include "xpl/Xerr.h"
#include "xpl/Xlog.h"

// A descriptor that accepts no bytes stands for a device whose writes make no
// progress; no real file on this machine behaves so. Every other descriptor
// writes through to the C library.
static std::atomic<int> g_stalledFd{-1};

extern "C" ssize_t write(int fd, const void* buf, size_t count) {
    using WriteFn = ssize_t (*)(int, const void*, size_t);
    static const WriteFn next = reinterpret_cast<WriteFn>(dlsym(RTLD_NEXT, "write"));
    if (fd == g_stalledFd.load()) return 0;
    return next(fd, buf, count);
}

namespace {

constexpr int kUnusedFd = 1234;
// Room for a signal to reach the reader blocked in read.
constexpr auto kSignalSpacing = std::chrono::milliseconds(5);

mode_t modeOf(const std::string& path) {
    struct stat info {};
    return stat(path.c_str(), &info) == 0 ? info.st_mode : 0;
}

bool exists(const std::string& path) { return modeOf(path) != 0; }

std::string readAll(const std::string& path) {
    std::string text;
    int fd = open(path.c_str(), O_RDONLY);
    char buf[256];
    ssize_t got;
    while (fd >= 0 && (got = read(fd, buf, sizeof(buf))) > 0) text.append(buf, got);
    if (fd >= 0) close(fd);
    return text;
}

void writeFile(const std::string& path, const std::string& text) {
    int fd = open(path.c_str(), O_CREAT | O_WRONLY | O_TRUNC, 0600);
    ASSERT_GE(fd, 0) << path;
    ASSERT_EQ(write(fd, text.data(), text.size()), static_cast<ssize_t>(text.size()));
    close(fd);
}

class XfileTest : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_EQ(xerrLibInit(), XERR_SUCCESS);
        ASSERT_EQ(xlogLibInit(nullptr, "", "*:I"), XERR_SUCCESS);
        char dir[] = "/tmp/xfile_test_XXXXXX";
        ASSERT_NE(mkdtemp(dir), nullptr);
        dir_ = dir;
        oldUmask_ = umask(0);
    }
    void TearDown() override {
        umask(oldUmask_);
        std::string command = "rm -rf '" + dir_ + "'";
        ASSERT_EQ(system(command.c_str()), 0);
    }
    std::string path(const std::string& name) const { return dir_ + "/" + name; }

    std::string dir_;
    mode_t oldUmask_ = 0;
};

TEST_F(XfileTest, Open_WhenParentsAreMissing_CreatesThemUnlessReading) {
    Xfile file{kUnusedFd};
    EXPECT_EQ(xfileOpen(&file, path("ro/sub/log.txt"), XFILE_MODE_READ), XERR_NOENT);
    EXPECT_FALSE(exists(path("ro"))) << "reading creates nothing";
    EXPECT_EQ(file.fd, kUnusedFd) << "a failed open leaves the handle alone";

    ASSERT_EQ(xfileOpen(&file, path("dir/sub/log.txt"), XFILE_MODE_APPEND), XERR_SUCCESS);
    EXPECT_EQ(modeOf(path("dir")) & 07777, 0774u);
    EXPECT_EQ(modeOf(path("dir/sub")) & 07777, 0774u);
    EXPECT_EQ(modeOf(path("dir/sub/log.txt")) & 07777, 0774u);
    EXPECT_EQ(xfileClose(&file), XERR_SUCCESS);

    EXPECT_EQ(xfileOpen(&file, path("ex/missing.txt"), XFILE_MODE_EXISTING), XERR_NOENT);
    EXPECT_TRUE(S_ISDIR(modeOf(path("ex")))) << "the parent is made before the open fails";
    EXPECT_FALSE(exists(path("ex/missing.txt")));

    EXPECT_EQ(xfileOpen(&file, path("other/x"), 9), XERR_NOENT)
        << "an unknown mode opens read-only";
    EXPECT_TRUE(S_ISDIR(modeOf(path("other")))) << "but still makes the parent";

    EXPECT_EQ(xfileOpen(&file, "/xfile-test-no-such-file", XFILE_MODE_EXISTING), XERR_NOENT)
        << "a file in the root folder: the empty parent is skipped over";
}

TEST_F(XfileTest, Open_ModesSetTheirFlags) {
    std::string name = path("modes.txt");
    writeFile(name, "0123456789");
    Xfile file{};
    size_t done = 0;
    char data[] = "ab";

    ASSERT_EQ(xfileOpen(&file, name, XFILE_MODE_READ), XERR_SUCCESS);
    EXPECT_EQ(xfileWrite(&file, data, 2, &done), XERR_BADF) << "read-only";
    xfileClose(&file);

    ASSERT_EQ(xfileOpen(&file, name, XFILE_MODE_READ_WRITE), XERR_SUCCESS);
    ASSERT_EQ(xfileWrite(&file, data, 2, &done), XERR_SUCCESS);
    xfileClose(&file);
    EXPECT_EQ(readAll(name), "ab23456789") << "read-write writes in place, no truncation";

    ASSERT_EQ(xfileOpen(&file, name, XFILE_MODE_APPEND), XERR_SUCCESS);
    ASSERT_EQ(xfileWrite(&file, data, 2, &done), XERR_SUCCESS);
    xfileClose(&file);
    EXPECT_EQ(readAll(name), "ab23456789ab") << "append writes at the end";

    ASSERT_EQ(xfileOpen(&file, name, XFILE_MODE_EXISTING), XERR_SUCCESS);
    xfileClose(&file);
    ASSERT_EQ(xfileOpen(&file, name, XFILE_MODE_TRUNCATE), XERR_SUCCESS);
    xfileClose(&file);
    EXPECT_EQ(readAll(name), "") << "truncate empties the file";
}

TEST_F(XfileTest, TransfersSeekAndSize_ReportBytesAndPositions) {
    Xfile file{};
    ASSERT_EQ(xfileOpen(&file, path("rw.bin"), XFILE_MODE_READ_WRITE), XERR_SUCCESS);
    char data[] = "hello world";
    ASSERT_EQ(xfileWriteAll(&file, data, 11), XERR_SUCCESS);
    long long size = 0;
    ASSERT_EQ(xfileSize(&file, &size), XERR_SUCCESS);
    EXPECT_EQ(size, 11);
    ASSERT_EQ(xfileSizeByName(path("rw.bin"), &size), XERR_SUCCESS);
    EXPECT_EQ(size, 11);

    long long pos = 0;
    ASSERT_EQ(xfileSeek(&file, 6, SEEK_SET, &pos), XERR_SUCCESS);
    EXPECT_EQ(pos, 6);
    char buf[16] = "";
    size_t done = 0;
    ASSERT_EQ(xfileRead(&file, buf, sizeof(buf), &done), XERR_SUCCESS);
    EXPECT_EQ(done, 5u) << "a short read is success";
    EXPECT_EQ(std::string(buf, done), "world");
    ASSERT_EQ(xfileRead(&file, buf, sizeof(buf), &done), XERR_SUCCESS);
    EXPECT_EQ(done, 0u) << "0 bytes at end of file";

    EXPECT_EQ(xfileSeek(&file, -100, SEEK_SET, &pos), XERR_INVAL);
    EXPECT_EQ(pos, -1) << "a failed seek stores -1";
    EXPECT_EQ(xfileClose(&file), XERR_SUCCESS);
    EXPECT_EQ(xfileClose(&file), XERR_BADF) << "the stored descriptor is left as it was";
    EXPECT_EQ(xfileSizeByName(path("none"), &size), XERR_NOENT);
}

TEST_F(XfileTest, ReadAll_WhenDataArrivesInPieces_FillsTheBufferInOrder) {
    int fds[2];
    // Each read of a packet socket returns one packet: 4 bytes, then 6.
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_SEQPACKET, 0, fds), 0);
    ASSERT_EQ(write(fds[1], "abcd", 4), 4);
    ASSERT_EQ(write(fds[1], "efghij", 6), 6);
    Xfile file{fds[0]};
    char buf[10];
    EXPECT_EQ(xfileReadAll(&file, buf, sizeof(buf)), XERR_SUCCESS);
    EXPECT_EQ(std::string(buf, 10), "abcdefghij");
    EXPECT_EQ(xfileReadAll(&file, buf, 0), XERR_SUCCESS) << "nothing to read";
    close(fds[0]);
    close(fds[1]);
}

// Regression: a file that ended early returned 0 bytes for ever and the loop
// never ended.
TEST_F(XfileTest, ReadAll_WhenFileEndsEarly_ReturnsAnIoFailure) {
    writeFile(path("short.txt"), "12345");
    Xfile file{};
    ASSERT_EQ(xfileOpen(&file, path("short.txt"), XFILE_MODE_READ), XERR_SUCCESS);
    char buf[10] = "";
    EXPECT_EQ(xfileReadAll(&file, buf, sizeof(buf)), XERR_IO) << "a short read is no success";
    EXPECT_EQ(std::string(buf, 5), "12345") << "bytes already read stay read";
    xfileClose(&file);
}

// Regression: a write that made no progress was retried for ever.
TEST_F(XfileTest, WriteAll_WhenWritesMakeNoProgress_ReturnsAnIoFailure) {
    Xfile file{};
    ASSERT_EQ(xfileOpen(&file, path("stalled.bin"), XFILE_MODE_TRUNCATE), XERR_SUCCESS);
    char data[] = "payload";
    g_stalledFd.store(file.fd);
    xerr_t err = xfileWriteAll(&file, data, 7);
    g_stalledFd.store(-1);
    EXPECT_EQ(err, XERR_IO) << "no progress must end the loop with a failure";
    xfileClose(&file);
}

TEST_F(XfileTest, Read_WhenInterruptedBySignal_RetriesAndDelivers) {
    struct sigaction action {};
    action.sa_handler = [](int) {};  // no SA_RESTART: read fails with EINTR
    struct sigaction old {};
    ASSERT_EQ(sigaction(SIGUSR1, &action, &old), 0);
    int fds[2];
    ASSERT_EQ(pipe(fds), 0);
    std::atomic<bool> finished{false};
    xerr_t result = XERR_FAILURE;
    char buf[4] = "";
    size_t done = 0;
    std::thread reader([&] {
        Xfile file{fds[0]};
        result = xfileRead(&file, buf, sizeof(buf), &done);
        finished.store(true);
    });
    // Interrupt the blocked read a few times before any data arrives.
    for (int i = 0; i < 5 && !finished.load(); ++i) {
        pthread_kill(reader.native_handle(), SIGUSR1);
        std::this_thread::sleep_for(kSignalSpacing);
    }
    EXPECT_FALSE(finished.load()) << "an interrupted read is reissued, not reported";
    ASSERT_EQ(write(fds[1], "ok", 2), 2);
    reader.join();
    EXPECT_EQ(result, XERR_SUCCESS);
    EXPECT_EQ(std::string(buf, done), "ok");
    close(fds[0]);
    close(fds[1]);
    sigaction(SIGUSR1, &old, nullptr);
}

TEST_F(XfileTest, PathExists_AcceptsFilesAndFoldersOnly) {
    writeFile(path("plain"), "x");
    ASSERT_EQ(mkfifo(path("fifo").c_str(), 0600), 0);
    EXPECT_EQ(xfilePathExists(dir_), XERR_SUCCESS);
    EXPECT_EQ(xfilePathExists(path("plain")), XERR_SUCCESS);
    EXPECT_EQ(xfilePathExists(path("missing")), XERR_NOENT);
    EXPECT_EQ(xfilePathExists(path("fifo")), XERR_NOENT) << "a pipe counts as missing";
}

TEST_F(XfileTest, MakeDirectory_CreatesAncestorsAndAcceptsWhatExists) {
    EXPECT_EQ(xfileMakeDirectoryBasic(path("a/b//c/"), 0700), XERR_SUCCESS)
        << "doubled and trailing separators make prefixes that already exist";
    EXPECT_TRUE(S_ISDIR(modeOf(path("a/b/c"))));
    EXPECT_EQ(modeOf(path("a/b")) & 07777, 0700u);
    EXPECT_EQ(xfileMakeDirectoryBasic(path("a/b"), 0700), XERR_SUCCESS) << "an existing folder";
    writeFile(path("plain"), "x");
    EXPECT_EQ(xfileMakeDirectoryBasic(path("plain"), 0700), XERR_SUCCESS) << "an existing file";
    EXPECT_EQ(xfileMakeDirectoryBasic("", 0700), XERR_NOENT);
    EXPECT_EQ(xfileMakeDirectoryBasic(path("plain/under"), 0700), XERR_NOTDIR);
    EXPECT_EQ(xfileMakeDirectory(path("plain/under"), 0700), XERR_SUCCESS)
        << "the front never reports failure";
    EXPECT_FALSE(exists(path("plain/under")));
}

TEST_F(XfileTest, MakeDirectory_LimitsThePathTo4096Bytes) {
    auto longPath = [&](char fill, size_t length) {
        std::string p = dir_;
        while (p.size() < length) {
            size_t part = std::min<size_t>(200, length - p.size() - 1);
            p += "/" + std::string(std::max<size_t>(part, 1), fill);
        }
        p.resize(length);
        return p;
    };
    std::string at4096 = longPath('a', 4096);
    std::string at4097 = longPath('b', 4097);
    ASSERT_EQ(at4096.size(), 4096u);
    ASSERT_EQ(at4097.size(), 4097u);
    std::string firstA = dir_ + "/" + std::string(200, 'a');
    std::string firstB = dir_ + "/" + std::string(200, 'b');

    EXPECT_EQ(xfileMakeDirectoryBasic(at4097, 0700), XERR_NAMETOOLONG);
    EXPECT_FALSE(exists(firstB)) << "4097 bytes: nothing is created";
    xfileMakeDirectoryBasic(at4096, 0700);
    EXPECT_TRUE(exists(firstA)) << "4096 bytes: the creation is attempted";
}

TEST_F(XfileTest, Move_FlushesRenamesAndLogsAFailedFlush) {
    writeFile(path("from.txt"), "data");
    writeFile(path("to.txt"), "old");
    EXPECT_EQ(xfileFlush(path("from.txt")), XERR_SUCCESS);
    EXPECT_EQ(xfileFlush(dir_), XERR_ISDIR) << "a folder cannot be opened for writing";
    AndroidLogCapture capture;
    EXPECT_EQ(xfileMove(path("from.txt"), path("to.txt")), XERR_SUCCESS);
    EXPECT_EQ(readAll(path("to.txt")), "data") << "rename replaces the target";
    EXPECT_TRUE(capture.lines().empty()) << "a good flush logs nothing";

    std::string missing = path("gone/missing.txt");
    EXPECT_EQ(xfileMove(missing, path("to2.txt")), XERR_NOENT);
    auto lines = capture.lines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].priority, ANDROID_LOG_WARN);
    EXPECT_EQ(lines[0].tag, "XFILE");
    EXPECT_EQ(lines[0].text, "Error in flushing file " + missing + " to disk. Error = 2");
    EXPECT_TRUE(S_ISDIR(modeOf(path("gone")))) << "the flush's open made the parent";
}

}  // namespace
