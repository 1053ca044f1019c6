// The file layer against real files, folders, pipes and sockets.
#include "xpl/Xfile.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <filesystem>

#include "support/AndroidLogCapture.h"
#include "support/ChildProcess.h"
#include "support/TempDir.h"
#include "xpl/Xlog.h"

namespace {

class XfileTest : public ::testing::Test {
  protected:
    void SetUp() override { ASSERT_EQ(xerrLibInit() + xlogLibInit(nullptr, "", ""), 0); }
    TempDir dir_;
};

// Each row opens N/sub/f, writes "ab" if it opened, and shows the results, the
// content and the modes of N/sub and N/sub/f. Existing ones hold "0123456789".
TEST_F(XfileTest, Open_EachModeSetsItsFlagsAndMakesMissingParentsUnlessReading) {
    const mode_t oldUmask = umask(0);  // so that created modes show whole
    const std::tuple<int, bool, const char*> rows[] = {
        {XFILE_MODE_READ, false, "XERR_NOENT - '' 0 0"},
        {XFILE_MODE_READ, true, "XERR_SUCCESS XERR_BADF '0123456789' 40777 100666"},
        {XFILE_MODE_READ_WRITE, false, "XERR_SUCCESS XERR_SUCCESS 'ab' 40774 100774"},
        {XFILE_MODE_READ_WRITE, true, "XERR_SUCCESS XERR_SUCCESS 'ab23456789' 40777 100666"},
        {XFILE_MODE_APPEND, true, "XERR_SUCCESS XERR_SUCCESS '0123456789ab' 40777 100666"},
        {XFILE_MODE_TRUNCATE, true, "XERR_SUCCESS XERR_SUCCESS 'ab' 40777 100666"},
        {XFILE_MODE_EXISTING, false, "XERR_NOENT - '' 40774 0"},
        {XFILE_MODE_EXISTING, true, "XERR_SUCCESS XERR_SUCCESS 'ab23456789' 40777 100666"},
        {0, false, "XERR_NOENT - '' 40774 0"},  // other modes read only, but make parents
        {6, false, "XERR_NOENT - '' 40774 0"},
    };
    for (size_t i = 0; i < std::size(rows); ++i) {
        const auto& [mode, exists, want] = rows[i];
        const std::string sub = std::to_string(i) + "/sub", name = sub + "/f";
        if (exists) std::filesystem::create_directories(dir_ / sub), dir_.write(name, "0123456789");
        Xfile file{1234};
        char ab[] = "ab";
        size_t done = 0;
        const xerr_t open = xfileOpen(&file, dir_ / name, mode);
        EXPECT_EQ(file.fd == 1234, open != XERR_SUCCESS) << "a failed open keeps the handle";
        std::ostringstream got;
        got << xerrStr(open) << " " << (open ? "-" : xerrStr(xfileWrite(&file, ab, 2, &done)))
            << " '" << dir_.read(name) << "' " << std::oct << dir_.mode(sub) << " "
            << dir_.mode(name);
        EXPECT_EQ(got.str(), want) << "mode " << mode;
        EXPECT_EQ(open ? XERR_SUCCESS : xfileClose(&file), XERR_SUCCESS);
    }
    umask(oldUmask);
}

TEST_F(XfileTest, Transfers_ReportBytesPositionsAndSizes) {
    Xfile file{};
    ASSERT_EQ(xfileOpen(&file, dir_ / "rw", XFILE_MODE_READ_WRITE), XERR_SUCCESS);
    char buf[16] = "hello world";
    long long size = 0, byName = 0, pos = 0;
    size_t done = 0;
    EXPECT_EQ(xfileWriteAll(&file, buf, 11) + xfileSize(&file, &size), XERR_SUCCESS);
    EXPECT_EQ(xfileSizeByName(dir_ / "none", &byName), XERR_NOENT);
    EXPECT_EQ(xfileSizeByName(dir_ / "rw", &byName) + xfileSeek(&file, 6, SEEK_SET, &pos), 0);
    EXPECT_EQ(size * 10000 + byName * 100 + pos, 111106);
    EXPECT_EQ(xfileRead(&file, buf, sizeof(buf), &done), XERR_SUCCESS);
    EXPECT_EQ(std::string(buf, done), "world") << "a short read is success";
    EXPECT_EQ(xfileSeek(&file, -100, SEEK_SET, &pos), XERR_INVAL);
    EXPECT_EQ(pos, -1) << "a failed seek stores -1";
    // Regression: a file that ended early gave 0 bytes for ever and the loop
    // never ended. The write loop is the same loop.
    EXPECT_EQ(xfileSeek(&file, 6, SEEK_SET, &pos), XERR_SUCCESS);
    EXPECT_EQ(xfileReadAll(&file, buf, 10), XERR_IO);
    EXPECT_EQ(xfileClose(&file), XERR_SUCCESS);
    EXPECT_EQ(xfileClose(&file), XERR_BADF) << "closing keeps the stored descriptor";
}

// Each read of a packet socket takes one packet, cut to the size asked for. The
// second packet comes while signals interrupt the read about ten times.
TEST_F(XfileTest, ReadAll_WhenDataComesInPiecesAndSignalsInterrupt_FillsTheBufferInOrder) {
    ChildOutcome outcome = runInChild([]() -> std::string {
        struct sigaction action {};
        action.sa_handler = [](int) {};  // no SA_RESTART: the blocked read fails with EINTR
        sigaction(SIGALRM, &action, nullptr);
        int fds[2];
        if (socketpair(AF_UNIX, SOCK_SEQPACKET, 0, fds) || write(fds[1], "abcd", 4) != 4)
            return "set-up";
        if (fork() == 0) _exit(usleep(50000) == 0 && write(fds[1], "efghij+++", 9) == 9 ? 0 : 1);
        ualarm(5000, 5000);
        Xfile file{fds[0]};
        char buf[] = "################";
        xerr_t err = xfileReadAll(&file, buf, 0) + xfileReadAll(&file, buf, 10);
        ualarm(0, 0);
        return err == XERR_SUCCESS && !strcmp(buf, "abcdefghij######") ? "" : xerrStr(err) + buf;
    });
    EXPECT_TRUE(outcome.ok()) << outcome.describe();
}

TEST_F(XfileTest, Folders_AreMadeWithTheirAncestorsUpTo4096Bytes) {
    dir_.write("plain", "x");
    ASSERT_EQ(mkfifo((dir_ / "fifo").c_str(), 0600) + symlink("plain", (dir_ / "link").c_str()), 0);
    auto longPath = [&](size_t length) {
        std::string path = dir_ / std::to_string(length);
        while (path.size() < length) path += "/" + std::string(200, 'd');
        return path.substr(0, length);
    };
    const std::tuple<std::string, xerr_t, xerr_t> rows[] = {
        {dir_ / "a/b//c/", XERR_SUCCESS, XERR_SUCCESS},
        {dir_ / "a/b", XERR_SUCCESS, XERR_SUCCESS},
        {dir_ / "plain", XERR_SUCCESS, XERR_SUCCESS},
        {dir_ / "link", XERR_SUCCESS, XERR_SUCCESS},  // a link counts as what it names
        {dir_ / "fifo", XERR_SUCCESS, XERR_NOENT},    // a pipe counts as missing
        {dir_ / "plain/under", XERR_NOTDIR, XERR_NOTDIR},
        {"", XERR_NOENT, XERR_NOENT},
        {longPath(4095), XERR_SUCCESS, XERR_SUCCESS},
        {longPath(4096), XERR_NAMETOOLONG, XERR_NAMETOOLONG},  // the system refuses
        {longPath(4097), XERR_NAMETOOLONG, XERR_NAMETOOLONG},  // refused before
    };
    for (const auto& [path, made, exists] : rows) {
        EXPECT_EQ(xfileMakeDirectoryBasic(path, 0700), made) << path.size();
        EXPECT_EQ(xfilePathExists(path), exists) << path;
    }
    EXPECT_EQ(dir_.mode("a/b"), S_IFDIR | 0700) << "ancestors get the mode asked for";
    EXPECT_TRUE(dir_.mode("4096") && !dir_.mode("4097")) << "4096 bytes are attempted";
    EXPECT_EQ(xfileMakeDirectory(dir_ / "plain/under", 0700), XERR_SUCCESS) << "never fails";
}

TEST_F(XfileTest, MoveFlushDelete_WorkOnNamedFiles) {
    dir_.write("from", "data");
    dir_.write("to", "old");
    std::string cleaned;
    EXPECT_EQ(xfileCleanPath("a//b\\c/./", cleaned), XERR_SUCCESS);
    EXPECT_EQ(cleaned, "a//b\\c/./") << "paths are not normalised";
    EXPECT_EQ(xfileFlush(dir_ / "from"), XERR_SUCCESS);
    EXPECT_EQ(xfileFlush(dir_ / ""), XERR_ISDIR) << "a folder cannot be opened for writing";
    AndroidLogCapture capture;
    EXPECT_EQ(xfileMove(dir_ / "from", dir_ / "to"), XERR_SUCCESS);
    EXPECT_EQ(dir_.read("to") + dir_.read("from"), "data") << "the target is replaced";
    EXPECT_EQ(xfileMove(dir_ / "gone/missing", dir_ / "to2"), XERR_NOENT);
    const auto lines = capture.lines();  // none from the good flush
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(std::to_string(lines[0].priority) + lines[0].tag + " " + lines[0].text,
              "5XFILE Error in flushing file " + dir_ / "gone/missing" + " to disk. Error = 2");
    EXPECT_EQ(xfileDelete(dir_ / "gone"), XERR_ISDIR) << "the flush's open made the parent";
    EXPECT_EQ(xfileRemoveDirectory(dir_ / "to"), XERR_NOTDIR);
    EXPECT_EQ(xfileDelete(dir_ / "to") + xfileRemoveDirectory(dir_ / "gone"), XERR_SUCCESS);
    EXPECT_EQ(dir_.mode("gone") + dir_.mode("to"), 0u);
}

}  // namespace
