// The host's answer to one request, written into the guest-bound buffer.
#pragma once

#include <cstdint>

#include "VmsgDeviceModel.h"
#include "hcall/host/HcallHost.h"

namespace vmsgdev {

// Writes the reply that the script asks for into `out` (`capacity` bytes of
// guest-bound buffer) and returns how many bytes it wrote from the start.
// `seed` varies the garbage between exchanges; `failed` answers the script's
// failureResult (false for the launch query) in place of the result.
uint32_t writeReply(const VmsgDeviceScript& script, const uint8_t* request, uint32_t length,
                    HcallLimits limits, uint8_t* out, uint32_t capacity, uint64_t seed,
                    bool failed);

}  // namespace vmsgdev
