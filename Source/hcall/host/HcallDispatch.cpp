// From request bytes to the handler entry of their operation and back to
// reply bytes. Filled buffers are handed to the handler in place, inside the
// reply; an i32 * and a u64 * point at the value's own field.
#include <algorithm>
#include <cstring>
#include <utility>

#include "hcall/host/HcallBytes.h"
#include "hcall/host/HcallHost.h"

namespace {

template <hcall::Kind K>
hcall::HostArgT<K> argument(HcallValue& value, char* buffer) {
    if constexpr (K == hcall::Str) {
        return value.text;
    } else if constexpr (K == hcall::I32) {
        return value.i32;
    } else if constexpr (K == hcall::Bool) {
        return value.flag;
    } else if constexpr (K == hcall::Buf) {
        return buffer;
    } else if constexpr (K == hcall::OutI32) {
        return &value.i32;
    } else {
        return &value.u64;
    }
}

template <uint32_t Code, typename Entry, size_t... I>
int32_t callEntry(HcallHandler& handler, Entry entry, HcallRequest& request, char* const* buffers,
                  std::index_sequence<I...>) {
    (void)request;  // an operation without parameters takes nothing from it
    (void)buffers;
    return int32_t((handler.*entry)(
        argument<hcall::kOps[Code - 1].params[I]>(request.params[I], buffers[I])...));
}

using Caller = int32_t (*)(HcallHandler&, HcallRequest&, char* const*);

constexpr Caller kCallers[] = {
#define HCALL_CALLER(code, name, result, sig, params)                                        \
    [](HcallHandler& handler, HcallRequest& request, char* const* buffers) {                 \
        return callEntry<code>(handler, &HcallHandler::name, request, buffers,               \
                               std::make_index_sequence<hcall::kOps[code - 1].numParams>()); \
    },
    HCALL_CATALOGUE(HCALL_CALLER)
#undef HCALL_CALLER
};
static_assert(sizeof(kCallers) / sizeof(kCallers[0]) == hcall::kNumOps, "one per operation");

}  // namespace

size_t hcallDispatch(HcallHandler& handler, const uint8_t* requestBytes, size_t length,
                     uint8_t* reply, size_t capacity, HcallLimits limits) {
    if (capacity < hcall::kResultSize) return 0;  // not even a result fits
    const uint32_t room = uint32_t(std::min<size_t>(capacity, UINT32_MAX));
    if (limits.guestBoundCapacity == 0 || limits.guestBoundCapacity > room)
        limits.guestBoundCapacity = room;
    HcallRequest request = hcallParseRequest(requestBytes, length, limits);
    if (!request.ok()) {
        hcall::putLe32(reply, uint32_t(handler.malformed(request)));
        return hcall::kResultSize;
    }
    char* buffers[hcall::kMaxParams] = {};
    size_t at = 0;
    for (int i = 0; i < request.numParams(); ++i) {
        if (request.params[i].kind == hcall::Buf) {
            buffers[i] = reinterpret_cast<char*>(reply + at);
            std::memset(buffers[i], 0, request.params[i].size);
        }
        at += request.params[i].size;
    }
    const int32_t result = kCallers[request.opCode - 1](handler, request, buffers);
    for (int i = 0; i < request.numParams(); ++i)
        if (buffers[i] != nullptr) request.params[i].text = {buffers[i], request.params[i].size};
    return hcallBuildReply(request, result, reply, capacity);
}
