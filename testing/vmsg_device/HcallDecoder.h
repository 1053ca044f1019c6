// Host-side reading of host-call requests and replies, driven by the same
// catalogue as the guest's encoder. Used by the device model and by the
// hcall-decode tool.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "hcall/guest/HcallCatalogue.h"

// A parameter that the host fills, in parameter order.
struct HcallFilled {
    hcall::Kind kind = hcall::Buf;
    uint32_t size = 0;  // bytes of reply it takes
};

struct HcallDecoded {
    uint32_t opCode = 0;       // first word of the request, 0 when shorter than 4 bytes
    uint32_t totalLength = 0;  // second word, 0 when shorter than 8 bytes
    bool wellFormed = false;   // the request matched its operation's layout exactly
    std::string problem;       // the first reason it did not
    std::string text;          // one line: the call, and its answer when a reply was given
    uint32_t replySize = 0;  // bytes of the proper reply (filled data plus result); 0 if malformed
    const hcall::OpInfo* op = nullptr;  // the catalogue entry, when the code is known
    int numFilled = 0;
    HcallFilled filled[hcall::kMaxParams];
};

// Capacity arguments of 0 skip the matching check: the host-bound capacity
// bounds totalLength, the guest-bound capacity bounds the reply the call asks
// for. With reply null, text holds the call alone ("name(args)"); with a reply,
// the filled data and " -> result" are shown as well, and a reply shorter than
// replySize is called out.
HcallDecoded hcallDecode(const uint8_t* request, size_t requestLen, const uint8_t* reply,
                         size_t replyLen, uint32_t hostBoundCapacity = 0,
                         uint32_t guestBoundCapacity = 0);

// The framing checks of hcallDecode without rendering any text: allocates
// nothing for a well-formed request, so a host can run it on every exchange.
HcallDecoded hcallCheck(const uint8_t* request, size_t requestLen, uint32_t hostBoundCapacity = 0,
                        uint32_t guestBoundCapacity = 0);

// A byte string as a quoted literal: printable ASCII as is, backslash and quote
// escaped, \n \r \t, every other byte as \xHH.
std::string hcallQuote(const uint8_t* bytes, size_t len);

// Lower-case hex, two digits a byte, no separators.
std::string hcallHex(const uint8_t* bytes, size_t len);

// Hex bytes, two digits each, with or without blanks between bytes; false on
// anything else.
bool hcallParseHex(const std::string& text, std::vector<uint8_t>& bytes);
