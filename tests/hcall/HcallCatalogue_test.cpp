// The catalogue read against its own signature texts: every parameter kind
// and result kind must be what the text says, so a slip in the one list
// cannot pass unnoticed through the encoder and the decoder that share it.

#include "hcall/guest/HcallCatalogue.h"

#include <gtest/gtest.h>

#include <map>
#include <string>

namespace {

std::vector<std::string> split(const std::string& list) {
    std::vector<std::string> parts;
    size_t start = 0;
    while (start < list.size()) {
        size_t comma = list.find(", ", start);
        if (comma == std::string::npos) comma = list.size();
        parts.push_back(list.substr(start, comma - start));
        start = comma + 2;
    }
    return parts;
}

TEST(HcallCatalogue, EveryOperation_MatchesItsSignatureText) {
    const std::map<std::string, hcall::Kind> kinds = {
        {"const char *", hcall::Str}, {"i32", hcall::I32},      {"int", hcall::I32},
        {"xerr_t", hcall::I32},       {"bool", hcall::Bool},    {"char *", hcall::Buf},
        {"i32 *", hcall::OutI32},     {"u64 *", hcall::OutU64},
    };
    for (const hcall::OpInfo& op : hcall::kOps) {
        const std::string text = op.signature;
        const std::string prefix =
            std::string(op.result == hcall::Flag ? "bool " : "xerr_t ") + op.name + "(";
        ASSERT_EQ(text.compare(0, prefix.size(), prefix), 0) << text;
        ASSERT_EQ(text.back(), ')') << text;
        std::vector<std::string> params =
            split(text.substr(prefix.size(), text.size() - prefix.size() - 1));
        ASSERT_EQ(int(params.size()), op.numParams) << text;
        for (int i = 0; i < op.numParams; ++i) {
            ASSERT_EQ(kinds.count(params[i]), 1u) << text << ": " << params[i];
            EXPECT_EQ(kinds.at(params[i]), op.params[i]) << text << ", parameter " << i;
        }
    }
    EXPECT_EQ(hcall::findOp(0), nullptr);
    EXPECT_EQ(hcall::findOp(44), nullptr);
    EXPECT_STREQ(hcall::findOp(24)->name, "hcallIsAppLaunchAllowedRpc");
}

}  // namespace
