// Calls an exported host-call operation with arguments held as data, for
// tests and fuzz targets that go through all 43: `args.get<K>(i)` hands out
// parameter i, of kind K, in the operation's own C type.
#pragma once

#include <cstdint>
#include <utility>

#include "hcall/guest/HcallCall.h"
#include "hcall/guest/HcallEnc.h"

namespace hcalltest {

template <uint32_t Code, typename Args, size_t... I>
int64_t invokeWith(typename hcall::Op<Code>::Function fn, Args& args, std::index_sequence<I...>) {
    (void)args;  // an operation without parameters takes nothing
    return int64_t(fn(args.template get<hcall::Op<Code>::template kind<I>>(I)...));
}

// Calls the operation with `code`; a bool result comes back as 0 or 1.
template <typename Args>
int64_t invokeExported(uint32_t code, Args& args) {
    using Invoker = int64_t (*)(Args&);
    static constexpr Invoker kInvokers[] = {
#define HCALL_TEST_INVOKER(code, name, result, sig, params)                                      \
    [](Args& a) {                                                                                \
        return invokeWith<code>(&name, a, std::make_index_sequence<hcall::Op<code>::kParams>()); \
    },
        HCALL_CATALOGUE(HCALL_TEST_INVOKER)
#undef HCALL_TEST_INVOKER
    };
    static_assert(sizeof(kInvokers) / sizeof(kInvokers[0]) == hcall::kNumOps, "one per operation");
    return kInvokers[code - 1](args);
}

}  // namespace hcalltest
