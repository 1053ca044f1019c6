// The hcall-decode program as a user runs it.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <string>

namespace {

struct ToolRun {
    int status = -1;
    std::string out;
};

ToolRun run(const std::string& args) {
    ToolRun r;
    const std::string command = std::string(HCALL_DECODE_TOOL) + " " + args + " 2>/dev/null";
    FILE* pipe = popen(command.c_str(), "r");
    if (pipe == nullptr) return r;
    char buf[512];
    size_t n = 0;
    while ((n = fread(buf, 1, sizeof buf, pipe)) > 0) r.out.append(buf, n);
    const int status = pclose(pipe);
    r.status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    return r;
}

TEST(HcallDecodeTool, Hex_WhenGivenOnTheCommandLine_PrintsTheCall) {
    const ToolRun r = run("--hex 0C 00 00 00 10 00 00 00 04 00 00 00 61 62 63 00 --reply 00000000");
    EXPECT_EQ(r.out, "hcallOnLocaleChangedRpc(\"abc\") -> 0\n");
    EXPECT_EQ(r.status, 0);
    const ToolRun bad = run("--hex 0C000000 10000000 09000000 61626300");
    EXPECT_EQ(bad.out,
              "!malformed hcallOnLocaleChangedRpc: string count 9 at offset 8 runs past "
              "totalLength 16\n");
    EXPECT_EQ(bad.status, 1) << "a malformed request fails the run";
}

TEST(HcallDecodeTool, Trace_WhenLinesAreMixed_DecodesEachAndFlagsTheUnreadable) {
    const std::string path = ::testing::TempDir() + "hcall_trace_" + std::to_string(getpid());
    {
        std::ofstream trace(path);
        trace << "# recorded by the device model\n"
              << "req=0c0000001200000006000000656e2d555300 reply=fbffffff "
                 "hcallOnLocaleChangedRpc(\"en-US\") -> -5\n"
              << "\n"
              << "07000000 0C000000 01000000\n"
              << "req=1000000008000000 reply=- hcallStartImportFilesRpc() -> !failed: errno 5\n"
              << "not hex at all\n";
    }
    const ToolRun r = run(path);
    EXPECT_EQ(r.out,
              "hcallOnLocaleChangedRpc(\"en-US\") -> -5\n"
              "hcallOnOrientationChangedRpc(1)\n"
              "hcallStartImportFilesRpc()\n"
              "!unreadable line 6\n");
    EXPECT_EQ(r.status, 1);
    EXPECT_EQ(run("--host-capacity 12 - < " + path)
                  .out.find("!malformed hcallOnLocaleChangedRpc: "
                            "totalLength 18 exceeds"),
              0u)
        << "standard input, with the capacity checked";
    unlink(path.c_str());
}

TEST(HcallDecodeTool, Usage_WhenArgumentsAreWrong_ExitsWithTwo) {
    EXPECT_EQ(run("--bogus").status, 2);
    EXPECT_EQ(run("--hex zz").status, 2);
    EXPECT_EQ(run("/nonexistent/trace").status, 2);
    EXPECT_EQ(run("--reply 00 file").status, 2) << "--reply belongs to --hex";
}

}  // namespace
