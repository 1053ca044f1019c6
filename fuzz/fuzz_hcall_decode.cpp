// The host half fed any bytes: a request (as long as its totalLength says, or
// all of the input) followed by a reply. What it accepts it must describe, fit
// exactly the capacities it names, and rebuild from what it read; what it
// refuses it must say why. tests/hcall_host tables each framing rule.
#include <algorithm>
#include <cstring>
#include <string>
#include <vector>

#include "FuzzCheck.h"
#include "hcall/host/HcallHost.h"

namespace {

using fuzz::expect;

// Exactly the input's bytes in an allocation of their own, so ASan sees any read past them.
using Exact = std::vector<uint8_t>;

bool decode(const Exact& req, const Exact* reply, HcallLimits limits = {}) {
    HcallRequest r = hcallParseRequest(req.data(), req.size(), limits);
    const std::string text =
        reply ? hcallExchangeText(r, reply->data(), reply->size()) : hcallCallText(r);
    expect(r.ok() == hcallFaultText(r).empty(), "a rejected request says why");
    expect(!text.empty(), "every request gets a line");
    if (!r.ok() || reply == nullptr) return r.ok();
    if (reply->size() < r.replySize) {
        expect(text.find(" -> !short reply: ") != std::string::npos, "a short reply is told");
        return true;
    }
    // Read back, the reply builds the same bytes; a bool result as 01 or 00.
    std::vector<uint8_t> want(reply->begin(), reply->begin() + r.replySize), built(want);
    uint8_t* word = want.data() + want.size() - 4;
    const std::string shown = r.op->result == hcall::Flag
                                  ? (word[0] ? " -> true" : " -> false")
                                  : " -> " + std::to_string(int32_t(fuzz::le32(word)));
    expect(text.size() >= shown.size() &&
               text.compare(text.size() - shown.size(), shown.size(), shown) == 0,
           "the answer shown is the reply's last word");
    if (r.op->result == hcall::Flag) word[0] = word[0] != 0, word[1] = word[2] = word[3] = 0;
    int32_t result = 0;
    expect(hcallReadReply(r, reply->data(), r.replySize, result), "a whole reply reads");
    expect(hcallBuildReply(r, result, built.data(), built.size()) == r.replySize && built == want,
           "the reply builds back from what was read");
    return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    const size_t length = size >= 8 ? std::min<size_t>(size, fuzz::le32(data + 4)) : size;
    const Exact request(data, data + length), reply(data + length, data + size),
        whole(data, data + size);
    decode(whole, nullptr);
    if (!decode(request, &reply)) return 0;
    const uint32_t total = fuzz::le32(data + 4);
    const auto room = uint32_t(hcallParseRequest(data, length).replySize);
    expect(decode(request, &reply, {total, room}), "exact capacities do");
    expect(!decode(request, nullptr, {total - 1, 0}), "one byte less of room fails");
    expect(!decode(request, nullptr, {0, room - 1}), "one byte less of reply room fails");
    return 0;
}
