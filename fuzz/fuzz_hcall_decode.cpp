// The host half's parser fed any bytes: a request (as long as its totalLength
// says, or all of the input) followed by a reply. Checked against a reading of
// the wire rules written here, at capacities around the request's own sizes;
// a reply read back must build the same bytes.
#include <algorithm>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "FuzzCheck.h"
#include "hcall/host/HcallHost.h"

namespace {

using fuzz::expect;
using fuzz::le32;

// Bytes in an allocation of exactly their size, so ASan sees any read past it.
struct Exact {
    Exact(const uint8_t* data, size_t size) : bytes(new uint8_t[size]), size(size) {
        if (size != 0) std::memcpy(bytes.get(), data, size);
    }
    std::unique_ptr<uint8_t[]> bytes;
    size_t size;
};

struct Reading {
    bool wellFormed = false;
    uint64_t replySize = 0;
};

// The wire rules: a known code; totalLength from the header to within what
// arrived and the host-bound capacity; each field whole; a string's count
// covering its bytes and one NUL that ends them; bools 0 or 1; filled sizes 4
// and 8; a buffer's capacity not negative and equal to the length after it;
// the fields ending exactly at totalLength; the reply within the guest-bound
// capacity.
Reading readByRules(const uint8_t* req, size_t len, uint32_t hostCap, uint32_t guestCap) {
    Reading r;
    if (len < 8) return r;
    const hcall::OpInfo* op = hcall::findOp(le32(req));
    const uint32_t total = le32(req + 4);
    if (op == nullptr || total < 8 || total > len || (hostCap != 0 && total > hostCap)) return r;
    uint64_t pos = 8;
    uint32_t words[hcall::kMaxParams] = {};
    uint64_t reply = 4;
    for (int i = 0; i < op->numParams; ++i) {
        if (pos + 4 > total) return r;
        const uint32_t w = words[i] = le32(req + pos);
        pos += 4;
        switch (op->params[i]) {
            case hcall::Str:
                if (w == 0 || pos + w > total || req[pos + w - 1] != 0) return r;
                for (uint32_t k = 0; k + 1 < w; ++k)
                    if (req[pos + k] == 0) return r;
                pos += w;
                break;
            case hcall::Bool:
                if (w > 1) return r;
                break;
            case hcall::I32:
                break;
            case hcall::Buf:
                if (w > 0x7FFFFFFF) return r;
                reply += w;
                break;
            case hcall::OutI32:
            case hcall::OutU64:
                if (w != (op->params[i] == hcall::OutI32 ? 4u : 8u)) return r;
                reply += w;
                break;
        }
    }
    if (pos != total) return r;
    for (int i = 0; i + 1 < op->numParams; ++i)
        if (op->params[i] == hcall::Buf && words[i + 1] != words[i]) return r;
    if (guestCap != 0 && reply > guestCap) return r;
    r.wellFormed = true;
    r.replySize = reply;
    return r;
}

bool endsWith(const std::string& s, const std::string& tail) {
    return s.size() >= tail.size() && s.compare(s.size() - tail.size(), tail.size(), tail) == 0;
}

// A reply read into the request's values builds back the bytes it came from;
// a bool result comes back as 01 or 00 in its first byte.
void checkRebuilt(HcallRequest request, const uint8_t* reply) {
    int32_t result = 0;
    expect(hcallReadReply(request, reply, request.replySize, result), "a whole reply reads");
    std::vector<uint8_t> built(request.replySize);
    expect(hcallBuildReply(request, result, built.data(), built.size()) == request.replySize,
           "the reply fits its own size");
    std::vector<uint8_t> want(reply, reply + request.replySize);
    if (request.op->result == hcall::Flag) {
        uint8_t* word = want.data() + want.size() - 4;
        word[0] = word[0] != 0 ? 1 : 0;
        word[1] = word[2] = word[3] = 0;
    }
    expect(built == want, "the reply builds back from what was read");
}

// One parse, against the rules; the answer shown when a reply was given.
Reading decodeAt(const Exact& req, const Exact* reply, uint32_t hostCap, uint32_t guestCap) {
    const Reading want = readByRules(req.bytes.get(), req.size, hostCap, guestCap);
    const HcallRequest r = hcallParseRequest(req.bytes.get(), req.size, {hostCap, guestCap});
    const std::string text =
        reply ? hcallExchangeText(r, reply->bytes.get(), reply->size) : hcallCallText(r);
    expect(r.ok() == want.wellFormed, "the parser accepts exactly what the rules allow");
    expect(r.ok() == hcallFaultText(r).empty(), "a rejected request says why");
    expect(!text.empty(), "every request gets a line");
    if (!r.ok()) return want;
    expect(r.replySize == want.replySize, "the reply's size is the filled sizes and the result");
    if (reply == nullptr) return want;
    if (reply->size < r.replySize) {
        expect(text.find(" -> !short reply: ") != std::string::npos, "a short reply is told");
    } else {
        const uint8_t* result = reply->bytes.get() + r.replySize - 4;
        const std::string shown = r.op->result == hcall::Flag
                                      ? (result[0] ? " -> true" : " -> false")
                                      : " -> " + std::to_string(int32_t(le32(result)));
        expect(endsWith(text, shown), "the answer shown is the reply's last word");
        checkRebuilt(r, reply->bytes.get());
    }
    return want;
}

// Where the words of a well-formed request lie: totalLength, then the first
// word of every field.
std::vector<size_t> wordOffsets(const uint8_t* req) {
    const hcall::OpInfo& op = *hcall::findOp(le32(req));
    std::vector<size_t> offsets{4};
    size_t pos = 8;
    for (int i = 0; i < op.numParams; ++i) {
        offsets.push_back(pos);
        pos += 4 + (op.params[i] == hcall::Str ? le32(req + pos) : 0);
    }
    return offsets;
}

// A well-formed request with one word moved to a boundary value is judged as
// the rules judge it: random mutation alone seldom lands on exactly these.
void checkNeighbours(const Exact& request) {
    for (const size_t at : wordOffsets(request.bytes.get())) {
        const uint32_t word = le32(request.bytes.get() + at);
        const uint32_t values[] = {word - 1, word + 1, 0, 1, 2,          3,          4,
                                   5,        7,        8, 9, 0x7FFFFFFF, 0x80000000, 0xFFFFFFFF};
        for (const uint32_t value : values) {
            Exact changed(request.bytes.get(), request.size);
            for (int i = 0; i < 4; ++i) changed.bytes[at + i] = uint8_t(value >> (8 * i));
            decodeAt(changed, nullptr, 0, 0);
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    size_t requestLen = size;
    if (size >= 8) requestLen = std::min<size_t>(size, le32(data + 4));
    const Exact request(data, requestLen);
    const Exact reply(data + requestLen, size - requestLen);
    const Exact whole(data, size);

    const Reading open = decodeAt(request, &reply, 0, 0);
    decodeAt(whole, nullptr, 0, 0);
    if (open.wellFormed) {
        const uint32_t total = le32(data + 4);
        const auto replySize = uint32_t(open.replySize);
        expect(decodeAt(request, &reply, total, replySize).wellFormed, "exact capacities do");
        expect(!decodeAt(request, nullptr, total - 1, 0).wellFormed, "one byte less of room fails");
        expect(!decodeAt(request, nullptr, 0, replySize - 1).wellFormed,
               "one byte less of reply room fails");
        checkNeighbours(request);
    }
    return 0;
}
