// The reply to a request: filled data in parameter order, then the result.
#include <algorithm>
#include <cstring>

#include "hcall/host/HcallBytes.h"
#include "hcall/host/HcallHost.h"

size_t hcallBuildReply(const HcallRequest& request, int32_t result, uint8_t* out, size_t capacity) {
    if (!request.ok() || request.replySize > capacity) return 0;
    uint8_t* at = out;
    for (int i = 0; i < request.numParams(); ++i) {
        const HcallValue& v = request.params[i];
        if (v.kind == hcall::Buf) {
            const size_t n = std::min<size_t>(v.text.size(), v.size);
            // A handler may have written the buffer in place already.
            if (n != 0 && v.text.data() != reinterpret_cast<const char*>(at))
                std::memmove(at, v.text.data(), n);
            std::memset(at + n, 0, v.size - n);
        } else if (v.kind == hcall::OutI32) {
            hcall::putLe32(at, uint32_t(v.i32));
        } else if (v.kind == hcall::OutU64) {
            hcall::putLe64(at, v.u64);
        }
        at += v.size;
    }
    if (request.op->result == hcall::Flag) result = result != 0 ? 1 : 0;
    hcall::putLe32(at, uint32_t(result));
    return request.replySize;
}

bool hcallReadReply(HcallRequest& request, const uint8_t* reply, size_t length, int32_t& result) {
    if (!request.ok()) return false;
    size_t pos = 0;
    for (int i = 0; i < request.numParams(); ++i) {
        HcallValue& v = request.params[i];
        if (v.size == 0 && v.kind != hcall::Buf) continue;
        if (length - pos < v.size) break;
        const uint8_t* data = reply + pos;
        if (v.kind == hcall::Buf)
            v.text = std::string_view(reinterpret_cast<const char*>(data), v.size);
        if (v.kind == hcall::OutI32) v.i32 = int32_t(hcall::le32(data));
        if (v.kind == hcall::OutU64) v.u64 = hcall::le64(data);
        v.answered = true;
        pos += v.size;
    }
    if (length < request.replySize) return false;
    const uint8_t* word = reply + request.replySize - hcall::kResultSize;
    result =
        request.op->result == hcall::Flag ? (word[0] != 0 ? 1 : 0) : int32_t(hcall::le32(word));
    return true;
}
