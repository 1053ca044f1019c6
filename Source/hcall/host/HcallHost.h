// The host half of the host-call service "hcal": read a guest's request, answer
// it, and print it. Link hcall_host (Android: libhcall_host); it is never part
// of the guest library.
//
// Wire rules. Every integer is little-endian; fields follow one another with
// no padding.
//
//   request   u32 opCode        1 to 43, one per operation (HcallCatalogue.h)
//             u32 totalLength   bytes of the whole request, these 8 included
//             one field per parameter, in the order of the operation's
//             signature text:
//               const char*     u32 count (length + 1), the bytes, one NUL
//               i32/int/xerr_t  4 bytes, two's complement
//               bool            01 00 00 00 or 00 00 00 00
//               char* filled    u32 capacity, equal to the i32 length
//                               parameter that follows it
//               i32* filled     u32 4
//               u64* filled     u32 8
//   reply     the data of each filled parameter, in parameter order, each
//             exactly the size its request field names; then a 4-byte result:
//             an xerr_t, or for hcallIsAppLaunchAllowedRpc a bool field
//             (01 00 00 00 allows the launch). No header, no length.
//
// A request is refused, with the reason, when it is shorter than the header,
// names an unknown code, states a totalLength below 8, beyond the bytes that
// arrived or beyond the host-bound capacity, has a field running past
// totalLength, a string without exactly one NUL at its end, a bool word other
// than 0 or 1, a filled size other than 4 or 8, a buffer capacity that is
// negative as an i32 or differs from its length parameter, bytes left after
// the last field, or a reply that would not fit the guest-bound capacity.
//
// Parsing and dispatching allocate nothing; only the text functions do.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "hcall/guest/HcallCatalogue.h"

// One parameter of a request. Filled parameters also carry the host's data.
struct HcallValue {
    hcall::Kind kind = hcall::I32;
    // Str: the string's bytes without the NUL, inside the request bytes.
    // Buf: the data for the buffer, cut or NUL-padded to `size`.
    std::string_view text;
    int32_t i32 = 0;   // I32: the value; OutI32: the data for the i32 *
    uint64_t u64 = 0;  // OutU64: the data for the u64 *
    bool flag = false;
    uint32_t size = 0;      // Buf, OutI32, OutU64: bytes of reply
    bool answered = false;  // filled: hcallReadReply found its data
};

enum class HcallFault : uint8_t {
    None,
    ShortHeader,
    UnknownCode,
    ShortTotalLength,
    OverHostCapacity,
    PastReceived,
    FieldPastEnd,
    EmptyString,
    StringPastEnd,
    Unterminated,
    InnerNul,
    BadBool,
    BadFilledSize,
    TrailingBytes,
    NegativeBuffer,
    BufferMismatch,
    OverGuestCapacity,
};

// A request read into its operation and values, or the first rule it broke.
struct HcallRequest {
    uint32_t opCode = 0;       // 0 when fewer than 4 bytes arrived
    uint32_t totalLength = 0;  // 0 when fewer than 8 bytes arrived
    const hcall::OpInfo* op = nullptr;
    HcallValue params[hcall::kMaxParams];
    uint32_t replySize = 0;  // filled sizes plus the result

    HcallFault fault = HcallFault::None;
    uint32_t faultOffset = 0;  // where the offending field starts
    uint64_t faultValue = 0;   // the offending word or length
    uint64_t faultBound = 0;   // the limit it broke

    bool ok() const { return fault == HcallFault::None; }
    int numParams() const { return op ? op->numParams : 0; }
};

// Capacities of the connection's buffers; 0 leaves that check out.
struct HcallLimits {
    uint32_t hostBoundCapacity = 0;
    uint32_t guestBoundCapacity = 0;
};

HcallRequest hcallParseRequest(const uint8_t* bytes, size_t length, HcallLimits limits = {});

// Writes the reply to a well-formed request: its filled values, then
// `result` (for a bool result, nonzero is true). Returns request.replySize, or
// 0 with nothing written when the request is refused or the reply does not
// fit `capacity`.
size_t hcallBuildReply(const HcallRequest& request, int32_t result, uint8_t* out, size_t capacity);

// Reads a reply back into the filled values of a well-formed request and its
// result (a bool result as 0 or 1). Values whose data arrived are marked
// answered; false when the reply is shorter than replySize.
bool hcallReadReply(HcallRequest& request, const uint8_t* reply, size_t length, int32_t& result);

// Why the request was refused, e.g. "string at offset 8 lacks its
// terminating NUL"; empty for a well-formed one.
std::string hcallFaultText(const HcallRequest& request);
// One line: hcallOnLocaleChangedRpc("en-US"), or "!malformed NAME: why".
std::string hcallCallText(const HcallRequest& request);
// The call with what the reply says: its filled data and " -> result", e.g.
// hcallGetPropsRpc(char[8]="abc", 8, i32*=7) -> 0.
std::string hcallExchangeText(const HcallRequest& request, const uint8_t* reply, size_t length);

// Bytes as a quoted literal: printable ASCII as is, \" \\ \n \r \t, the rest
// as \xHH.
std::string hcallQuote(const uint8_t* bytes, size_t length);
// Lower-case hex, two digits a byte.
std::string hcallHex(const uint8_t* bytes, size_t length);
// Two hex digits a byte, blanks, tabs or commas allowed between bytes.
bool hcallParseHex(const std::string& text, std::vector<uint8_t>& bytes);

namespace hcall {

// What a handler receives for each kind of parameter. A filled buffer is
// exactly its capacity long, an i32 * and a u64 * point at 0; whatever the
// handler leaves there goes into the reply.
// clang-format off
template <Kind K> struct HostArg;
template <> struct HostArg<Str> { using type = std::string_view; };
template <> struct HostArg<I32> { using type = int32_t; };
template <> struct HostArg<Bool> { using type = bool; };
template <> struct HostArg<Buf> { using type = char*; };
template <> struct HostArg<OutI32> { using type = int32_t*; };
template <> struct HostArg<OutU64> { using type = uint64_t*; };
template <Result R> struct HostResult;
template <> struct HostResult<Xerr> { using type = int32_t; };
template <> struct HostResult<Flag> { using type = bool; };
// clang-format on
template <Kind K>
using HostArgT = typename HostArg<K>::type;
template <Result R>
using HostResultT = typename HostResult<R>::type;

}  // namespace hcall

// clang-format off
#define HCALL_HOST_ARG(kind) hcall::HostArgT<hcall::kind>
#define HCALL_HOST_ARGS_0()
#define HCALL_HOST_ARGS_1(a) HCALL_HOST_ARG(a)
#define HCALL_HOST_ARGS_2(a, ...) HCALL_HOST_ARG(a), HCALL_HOST_ARGS_1(__VA_ARGS__)
#define HCALL_HOST_ARGS_3(a, ...) HCALL_HOST_ARG(a), HCALL_HOST_ARGS_2(__VA_ARGS__)
#define HCALL_HOST_ARGS_4(a, ...) HCALL_HOST_ARG(a), HCALL_HOST_ARGS_3(__VA_ARGS__)
#define HCALL_HOST_ARGS_5(a, ...) HCALL_HOST_ARG(a), HCALL_HOST_ARGS_4(__VA_ARGS__)
#define HCALL_HOST_ARGS_6(a, ...) HCALL_HOST_ARG(a), HCALL_HOST_ARGS_5(__VA_ARGS__)
#define HCALL_HOST_ARGS_7(a, ...) HCALL_HOST_ARG(a), HCALL_HOST_ARGS_6(__VA_ARGS__)
#define HCALL_HOST_ARGS_8(a, ...) HCALL_HOST_ARG(a), HCALL_HOST_ARGS_7(__VA_ARGS__)
#define HCALL_HOST_COUNT_(_0, _1, _2, _3, _4, _5, _6, _7, _8, n, ...) n
#define HCALL_HOST_COUNT(...) HCALL_HOST_COUNT_(_ __VA_OPT__(,) __VA_ARGS__, 8, 7, 6, 5, 4, 3, 2, 1, 0)
#define HCALL_HOST_CAT_(a, b) a##b
#define HCALL_HOST_CAT(a, b) HCALL_HOST_CAT_(a, b)
// The parameter types of a catalogue line's kinds: (Buf, I32, OutI32) gives
// char*, int32_t, int32_t*.
#define HCALL_HOST_ARGS(...) HCALL_HOST_CAT(HCALL_HOST_ARGS_, HCALL_HOST_COUNT(__VA_ARGS__))(__VA_ARGS__)
// clang-format on

// A host's answers, one virtual function per operation with the operation's
// own name and parameters. Override the ones the host acts on; the others
// answer unhandled(). Example:
//
//   struct MyHost : HcallHandler {
//       int32_t hcallOnLocaleChangedRpc(std::string_view locale) override;
//       bool hcallIsAppLaunchAllowedRpc(std::string_view pkg) override;
//   };
class HcallHandler {
  public:
    virtual ~HcallHandler() = default;

#define HCALL_HANDLER_ENTRY(code, name, result, sig, params)                        \
    virtual hcall::HostResultT<hcall::result> name(HCALL_HOST_ARGS params) {        \
        return hcall::HostResultT<hcall::result>(unhandled(hcall::kOps[code - 1])); \
    }
    HCALL_CATALOGUE(HCALL_HANDLER_ENTRY)
#undef HCALL_HANDLER_ENTRY

    // The result of an operation not overridden: 0, which for the launch
    // query allows it.
    virtual int32_t unhandled(const hcall::OpInfo& op) {
        (void)op;
        return 0;
    }
    // The 4-byte answer to a refused request: -22, XERR_INVAL.
    virtual int32_t malformed(const HcallRequest& request) {
        (void)request;
        return -22;
    }
};

// Request bytes in, reply bytes out: parses the request, calls its handler
// entry and writes the reply into `reply` (its capacity also bounds the reply
// the request may ask for). A refused request gets handler.malformed() as a
// 4-byte answer. Returns the bytes written.
size_t hcallDispatch(HcallHandler& handler, const uint8_t* request, size_t length, uint8_t* reply,
                     size_t capacity, HcallLimits limits = {});
