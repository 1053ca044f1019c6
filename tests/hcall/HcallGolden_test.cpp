// Both halves against hand-written exchanges (tests/data/hcall_golden.txt): the guest
// sends exactly those bytes and hands back the reply; the host reads them and builds it.

#include <gtest/gtest.h>

#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "DeviceSession.h"
#include "hcall/host/HcallHost.h"
#include "support/HcallInvoke.h"
#include "support/LogRecorder.h"

namespace {

struct Row {
    std::string exchange;
    std::vector<uint8_t> request, reply;
};

// Lines of "request hex | reply hex | exchange"; "#" starts a comment.
std::vector<Row> readCorpus() {
    std::vector<Row> rows;
    std::ifstream in(HCALL_GOLDEN);
    std::string text;
    for (int line = 1; std::getline(in, text); ++line) {
        if (text.find_first_not_of(' ') == std::string::npos || text[0] == '#') continue;
        const size_t bar1 = text.find(" | "), bar2 = text.find(" | ", bar1 + 3);
        Row row{bar2 == std::string::npos ? "" : text.substr(bar2 + 3), {}, {}};
        EXPECT_TRUE(bar2 != std::string::npos && hcallParseHex(text.substr(0, bar1), row.request) &&
                    hcallParseHex(text.substr(bar1 + 3, bar2 - bar1 - 3), row.reply))
            << "hcall_golden.txt:" << line << ": not request | reply | exchange";
        rows.push_back(row);
    }
    return rows;
}

struct RowHost : HcallHandler {
    RowHost(const HcallRequest& answer, int32_t result) : mAnswer(answer), mResult(result) {}
    int32_t unhandled(const hcall::OpInfo& op) override {
        entered = op.code;
        return mResult;
    }
    int32_t hcallGetPropsRpc(char* buffer, int32_t length, int32_t* value) override {
        entered = hcall::kOp_hcallGetPropsRpc;
        std::copy_n(mAnswer.params[0].text.data(), length, buffer);
        *value = mAnswer.params[2].i32;
        return mResult;
    }
    int32_t hcallGetTimeInfoRpc(uint64_t* time, char* buffer, int32_t length) override {
        entered = hcall::kOp_hcallGetTimeInfoRpc;
        *time = mAnswer.params[0].u64;
        std::copy_n(mAnswer.params[1].text.data(), length, buffer);
        return mResult;
    }
    uint32_t entered = 0;
    const HcallRequest& mAnswer;
    int32_t mResult;
};

// Arguments from the values the host read; strings end in their NUL in the request.
struct GuestCall {
    HcallRequest& values;
    std::unique_ptr<char[]> buffers[hcall::kMaxParams];

    template <hcall::Kind K>
    auto get(size_t i) {
        HcallValue& v = values.params[i];
        if constexpr (K == hcall::Buf) {
            buffers[i].reset(new char[v.size + 1]());
            v.text = {buffers[i].get(), v.size};
        }
        if constexpr (K == hcall::Str) return v.text.data();
        if constexpr (K == hcall::I32) return v.i32;
        if constexpr (K == hcall::Bool) return v.flag;
        if constexpr (K == hcall::Buf) return buffers[i].get();
        if constexpr (K == hcall::OutI32) return &v.i32;
        if constexpr (K == hcall::OutU64) return &v.u64;
    }
};

TEST(HcallGolden, Host_ReadsEveryRowAndBuildsItsReply) {
    bool seen[hcall::kNumOps + 1] = {};
    for (const Row& row : readCorpus()) {
        SCOPED_TRACE(row.exchange);
        HcallRequest request = hcallParseRequest(row.request.data(), row.request.size());
        ASSERT_TRUE(request.ok()) << hcallFaultText(request);
        seen[request.opCode] = true;
        EXPECT_EQ(hcallExchangeText(request, row.reply.data(), row.reply.size()), row.exchange);

        int32_t result = 0;
        ASSERT_TRUE(hcallReadReply(request, row.reply.data(), row.reply.size(), result));
        RowHost host(request, result);
        std::vector<uint8_t> reply(row.reply.size() + 8, 0xEE);
        reply.resize(hcallDispatch(host, row.request.data(), row.request.size(), reply.data(),
                                   reply.size()));
        EXPECT_EQ(reply, row.reply);
        EXPECT_EQ(host.entered, request.opCode);
    }
    for (uint32_t code = 1; code <= hcall::kNumOps; ++code)
        EXPECT_TRUE(seen[code]) << "no row for operation " << code;
}

TEST(HcallGolden, Guest_SendsEveryRowAndReadsItsReply) {
    LogRecorder log(XLOG_LEVEL_E);  // quiet: lines are checked in HcallLog_test
    for (const Row& row : readCorpus()) {
        SCOPED_TRACE(row.exchange);
        VmsgDeviceScript script;
        script.replyMode = VmsgDeviceReplyMode::Raw;
        script.rawReply = row.reply;
        HcallSession session(script);
        ASSERT_TRUE(session.connected);
        HcallRequest values = hcallParseRequest(row.request.data(), row.request.size());
        ASSERT_TRUE(values.ok()) << hcallFaultText(values);

        GuestCall guest{values, {}};
        const int32_t result = int32_t(hcalltest::invokeExported(values.opCode, guest));
        const std::vector<VmsgDeviceExchange> sent = vmsgDeviceExchanges();
        ASSERT_EQ(sent.size(), 1u);
        EXPECT_EQ(sent[0].request, row.request) << "the bytes the guest sent";
        std::vector<uint8_t> received(row.reply.size());
        ASSERT_EQ(hcallBuildReply(values, result, received.data(), received.size()),
                  row.reply.size());
        EXPECT_EQ(received, row.reply) << "what the guest handed back: filled data and result";
    }
}

}  // namespace
