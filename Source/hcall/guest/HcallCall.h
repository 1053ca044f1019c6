// The steps every host call shares, instantiated per operation from its line
// in the catalogue: entry line, measuring, the request written in place, the
// exchange, the reply read in place, exit line.
#pragma once

#include <array>
#include <cstring>
#include <tuple>
#include <type_traits>
#include <utility>

#include "hcall/guest/HcallCatalogue.h"
#include "hcall/guest/HcallExchange.h"
#include "hcall/guest/HcallFormat.h"
#include "xpl/Xerr.h"
#include "xpl/Xlog.h"

namespace hcall {

// The C type of each kind of parameter and result.
// clang-format off
template <Kind K> struct KindType;
template <> struct KindType<Str> { using type = const char*; };
template <> struct KindType<I32> { using type = int32_t; };
template <> struct KindType<Bool> { using type = bool; };
template <> struct KindType<Buf> { using type = char*; };
template <> struct KindType<OutI32> { using type = int32_t*; };
template <> struct KindType<OutU64> { using type = uint64_t*; };
template <Result R> struct ResultType;
template <> struct ResultType<Xerr> { using type = xerr_t; };
template <> struct ResultType<Flag> { using type = bool; };
// clang-format on

template <uint32_t Code>
struct Op {
    static constexpr const OpInfo& info = kOps[Code - 1];
    static constexpr int kParams = info.numParams;
    using Result = typename ResultType<info.result>::type;
    template <size_t I>
    static constexpr Kind kind = info.params[I];

    template <size_t... I>
    static auto pointerType(std::index_sequence<I...>)
        -> Result (*)(typename KindType<kind<I>>::type...);
    // The exported function's type as the catalogue describes it.
    using Function = decltype(pointerType(std::make_index_sequence<kParams>()));
};

// The capacity of the filled buffer at I, which the i32 right after it holds.
template <uint32_t Code, size_t I, typename Args>
int32_t bufferLengthAt(const Args& args) {
    if constexpr (Op<Code>::template kind<I> == Buf) {
        return std::get<I + 1>(args);
    } else {
        return 0;
    }
}

inline void putU32(uint8_t*& out, uint32_t value) {
    std::memcpy(out, &value, sizeof(value));
    out += sizeof(value);
}

template <Kind K, typename T>
void encodeField(uint8_t*& out, T value, size_t length, int32_t bufferLength) {
    if constexpr (K == Str) {
        putU32(out, uint32_t(length + 1));
        std::memcpy(out, value, length + 1);
        out += length + 1;
    } else if constexpr (K == I32) {
        putU32(out, uint32_t(value));
    } else if constexpr (K == Bool) {
        putU32(out, value ? 1 : 0);
    } else {
        putU32(out, filledSize(K, uint32_t(bufferLength)));
    }
}

template <Kind K, typename T>
void decodeField(const uint8_t*& in, T target, int32_t bufferLength) {
    if constexpr (K == Buf || K == OutI32 || K == OutU64) {
        size_t size = filledSize(K, uint32_t(bufferLength));
        if (target && size > 0) std::memcpy(target, in, size);
        in += size;
    }
}

// The arguments a parameter hands to the log line: a bounded buffer prints
// with a precision so that data without a NUL is never read past its end.
template <Kind K, bool Bounded, typename T>
auto printArgs(T value, int32_t bufferLength) {
    if constexpr (K == Buf && Bounded) {
        return std::make_tuple(bufferLength > 0 ? int(bufferLength) : 0,
                               static_cast<const char*>(value));
    } else if constexpr (K == Str || K == Buf) {
        return std::make_tuple(static_cast<const char*>(value));
    } else if constexpr (K == I32 || K == Bool) {
        return std::make_tuple(int(value));
    } else {
        return std::make_tuple(static_cast<const void*>(value));
    }
}

// True unless the parameter at I is a filled buffer without a NUL within its
// capacity.
template <uint32_t Code, size_t I, typename Args>
bool terminatedAt(const Args& args) {
    if constexpr (Op<Code>::template kind<I> == Buf) {
        const char* buffer = std::get<I>(args);
        int32_t length = bufferLengthAt<Code, I>(args);
        return buffer && length > 0 && std::memchr(buffer, 0, size_t(length));
    } else {
        return true;
    }
}

template <uint32_t Code, typename Args, size_t... I>
bool buffersTerminated(const Args& args, std::index_sequence<I...>) {
    return (terminatedAt<Code, I>(args) && ...);
}

// One log line of the operation; `lead` is the exit line's result.
template <uint32_t Code, typename Args, size_t... I, typename... Lead>
void logCall(int level, int line, const Args& args, std::index_sequence<I...> seq, Lead... lead) {
    XlogLogger* logger = xlogActiveLogger();
    if (!logger->shouldLog(XLOG_MODULE_HCALL, level)) return;
    const OpInfo& op = Op<Code>::info;
    bool exit = sizeof...(Lead) > 0;
    auto emit = [&](const FormatText& format, auto printable) {
        std::apply(
            [&](auto... values) {
                logger->print(level, XLOG_MODULE_HCALL, kEncSource, op.signature, line, format.text,
                              lead..., op.name, values...);
            },
            printable);
    };
    if (buffersTerminated<Code>(args, seq)) {
        emit(exit ? Formats<Code>::exit : Formats<Code>::entry,
             std::tuple_cat(printArgs<Op<Code>::template kind<I>, false>(
                 std::get<I>(args), bufferLengthAt<Code, I>(args))...));
    } else {
        emit(exit ? Formats<Code>::boundedExit : Formats<Code>::boundedEntry,
             std::tuple_cat(printArgs<Op<Code>::template kind<I>, true>(
                 std::get<I>(args), bufferLengthAt<Code, I>(args))...));
    }
}

// What a call answers when the host was not asked or did not answer: -1, and
// for the launch query true (see hcallIsAppLaunchAllowedRpc).
template <Result R>
constexpr typename ResultType<R>::type refusedResult() {
    if constexpr (R == Flag) {
        return true;
    } else {
        return XERR_FAILURE;
    }
}

template <Kind K, typename T>
size_t measure(T value) {
    if constexpr (K == Str) {
        return std::strlen(value);
    } else {
        return 0;
    }
}

template <uint32_t Code, typename Args, size_t... I>
typename Op<Code>::Result call(const Args& args, std::index_sequence<I...> seq) {
    using O = Op<Code>;
    const OpInfo& op = O::info;
    logCall<Code>(XLOG_LEVEL_I, __LINE__, args, seq);

    // Lengths in size_t: strings of several GiB must not wrap the total.
    const std::array<size_t, sizeof...(I)> lengths{
        measure<O::template kind<I>>(std::get<I>(args))...};
    (void)lengths;  // an operation without parameters measures nothing
    size_t requestLength =
        kHeaderSize + ((kFieldSize + (O::template kind<I> == Str ? lengths[I] + 1 : 0)) + ... + 0);
    bool lengthsValid = ((bufferLengthAt<Code, I>(args) >= 0) && ...);
    size_t replyLength =
        kResultSize +
        (filledSize(O::template kind<I>, uint32_t(bufferLengthAt<Code, I>(args))) + ... + 0);

    constexpr Result kResult = O::info.result;
    typename O::Result result = refusedResult<kResult>();
    if (!lengthsValid) {
        XLOG_AT(XLOG_MODULE_HCALL, XLOG_LEVEL_E, kEncSource, op.signature,
                "%s: negative buffer length", op.signature);
    } else {
        Exchange exchange;
        uint8_t* request = exchange.requestBuffer(op.signature, requestLength, replyLength);
        const uint8_t* reply = nullptr;
        if (request) {
            uint8_t* out = request;
            putU32(out, Code);
            putU32(out, uint32_t(requestLength));
            (encodeField<O::template kind<I>>(out, std::get<I>(args), lengths[I],
                                              bufferLengthAt<Code, I>(args)),
             ...);
            reply = exchange.send(request, uint32_t(requestLength));
        }
        if (reply) {
            int reported = 0;
            (decodeField<O::template kind<I>>(reply, std::get<I>(args),
                                              bufferLengthAt<Code, I>(args)),
             ...);
            if constexpr (kResult == Flag) {
                reported = reply[0];
                result = reply[0] != 0;
            } else {
                std::memcpy(&result, reply, sizeof(result));
                reported = result;
            }
            // A refused or failed exchange writes nothing more: only a reply
            // gets its exit line.
            logCall<Code>(XLOG_LEVEL_D, __LINE__, args, seq, reported);
        }
    }
    return result;
}

// The body of every exported operation.
template <uint32_t Code, typename... A>
typename Op<Code>::Result invoke(A... args) {
    static_assert(
        std::is_same<typename Op<Code>::Function, typename Op<Code>::Result (*)(A...)>::value,
        "arguments differ from the catalogue");
    return call<Code>(std::tuple<A...>(args...), std::index_sequence_for<A...>());
}

}  // namespace hcall
