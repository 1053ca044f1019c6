// hcall-decode: turns recorded host calls into one decoded line each.
//
//   hcall-decode [options] [TRACE-FILE | -]   lines of a device trace, or of hex request bytes
//   hcall-decode [options] --hex BYTES...     one request given as hex on the command line
//
// Options: --reply HEX (with --hex), --host-capacity N, --guest-capacity N.
// A trace line holds "req=HEX" and optionally "reply=HEX" ("-" for none);
// any other non-blank line not starting with '#' is taken as request bytes.
// Exits 0 when every request was well-formed, 1 when one was not or a line
// could not be read, 2 on a usage error.
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iostream>
#include <sstream>
#include <string>
#include <vector>

#include "hcall/host/HcallHost.h"

namespace {

struct Options {
    uint32_t hostBoundCapacity = 0;
    uint32_t guestBoundCapacity = 0;
    bool hexArgs = false;
    std::string reply;
    bool hasReply = false;
    std::vector<std::string> rest;
};

int usage() {
    std::fprintf(stderr,
                 "usage: hcall-decode [--host-capacity N] [--guest-capacity N] [TRACE-FILE | -]\n"
                 "       hcall-decode [--host-capacity N] [--guest-capacity N] --hex BYTES... "
                 "[--reply HEX]\n");
    return 2;
}

bool parseCapacity(const char* text, uint32_t& out) {
    char* end = nullptr;
    const unsigned long long v = std::strtoull(text, &end, 0);
    if (*text == '\0' || *end != '\0' || v > 0xFFFFFFFFULL) return false;
    out = uint32_t(v);
    return true;
}

bool parseArgs(int argc, char** argv, Options& o) {
    for (int i = 1; i < argc; ++i) {
        const std::string a = argv[i];
        const bool hasValue = i + 1 < argc;
        if (a == "--hex") {
            o.hexArgs = true;
        } else if (a == "--reply" && hasValue) {
            o.reply = argv[++i];
            o.hasReply = true;
        } else if (a == "--host-capacity" && hasValue) {
            if (!parseCapacity(argv[++i], o.hostBoundCapacity)) return false;
        } else if (a == "--guest-capacity" && hasValue) {
            if (!parseCapacity(argv[++i], o.guestBoundCapacity)) return false;
        } else if (a.size() > 1 && a[0] == '-' && a[1] == '-') {
            return false;
        } else {
            o.rest.push_back(a);
        }
    }
    if (o.hasReply && !o.hexArgs) return false;
    return o.hexArgs ? !o.rest.empty() : o.rest.size() <= 1;
}

// Decodes one request (and reply, when given) and prints its line.
bool decodeOne(const Options& o, const std::vector<uint8_t>& request,
               const std::vector<uint8_t>* reply) {
    const HcallRequest r = hcallParseRequest(request.data(), request.size(),
                                             {o.hostBoundCapacity, o.guestBoundCapacity});
    std::cout << (reply ? hcallExchangeText(r, reply->data(), reply->size()) : hcallCallText(r))
              << '\n';
    return r.ok();
}

// The value of a "key=" token in a trace line, or empty.
std::string token(const std::string& line, const char* key) {
    std::istringstream words(line);
    std::string word;
    const size_t n = std::strlen(key);
    while (words >> word)
        if (word.compare(0, n, key) == 0) return word.substr(n);
    return {};
}

bool decodeLine(const Options& o, const std::string& line, size_t lineNo) {
    std::vector<uint8_t> request, reply;
    const std::string req = token(line, "req=");
    bool ok = false;
    if (req.empty()) {
        ok = hcallParseHex(line, request);
    } else {
        const std::string rep = token(line, "reply=");
        ok =
            hcallParseHex(req, request) && (rep.empty() || rep == "-" || hcallParseHex(rep, reply));
        if (ok && !rep.empty() && rep != "-") return decodeOne(o, request, &reply);
    }
    if (!ok) {
        std::cout << "!unreadable line " << lineNo << '\n';
        return false;
    }
    return decodeOne(o, request, nullptr);
}

bool decodeStream(const Options& o, std::istream& in) {
    bool allGood = true;
    std::string line;
    for (size_t lineNo = 1; std::getline(in, line); ++lineNo) {
        const size_t first = line.find_first_not_of(" \t\r");
        if (first == std::string::npos || line[first] == '#') continue;
        if (!line.empty() && line.back() == '\r') line.pop_back();
        allGood = decodeLine(o, line, lineNo) && allGood;
    }
    return allGood;
}

}  // namespace

int main(int argc, char** argv) {
    Options o;
    if (!parseArgs(argc, argv, o)) return usage();
    bool good = false;
    if (o.hexArgs) {
        std::string joined;
        for (const std::string& part : o.rest) joined += part + " ";
        std::vector<uint8_t> request, reply;
        if (!hcallParseHex(joined, request) || (o.hasReply && !hcallParseHex(o.reply, reply))) {
            std::fprintf(stderr, "hcall-decode: not hex bytes\n");
            return 2;
        }
        good = decodeOne(o, request, o.hasReply ? &reply : nullptr);
    } else if (o.rest.empty() || o.rest[0] == "-") {
        good = decodeStream(o, std::cin);
    } else {
        std::ifstream file(o.rest[0]);
        if (!file) {
            std::fprintf(stderr, "hcall-decode: cannot read %s\n", o.rest[0].c_str());
            return 2;
        }
        good = decodeStream(o, file);
    }
    return good ? 0 : 1;
}
