// The host's answer to one request, written into the guest-bound buffer.
#pragma once

#include <cstdint>

#include "HcallDecoder.h"
#include "VmsgDeviceModel.h"

namespace vmsgdev {

// Writes the reply that the script asks for into out (capacity bytes of
// guest-bound buffer) and returns how many bytes it wrote from the start.
// seed varies the garbage pattern between exchanges; failed answers the
// script's failureResult (false for a flag) in place of the result.
uint32_t writeReply(const VmsgDeviceScript& script, const HcallDecoded& request, uint8_t* out,
                    uint32_t capacity, uint64_t seed, bool failed = false);

}  // namespace vmsgdev
