// Keeps tests away from the machine's kernel log. Opening "/dev/kmsg" through
// stdio is redirected to the file named by HOSTCALL_TEST_KMSG (default
// /dev/null). HOSTCALL_TEST_KMSG=passthrough opens the real path, for a test
// that has bound a file of its own over /dev/kmsg in a private mount namespace.
#include <dlfcn.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace {

using FopenFn = FILE* (*)(const char*, const char*);

const char* redirect(const char* path) {
    if (path == nullptr || std::strcmp(path, "/dev/kmsg") != 0) return path;
    const char* target = std::getenv("HOSTCALL_TEST_KMSG");
    if (target == nullptr || *target == '\0') return "/dev/null";
    if (std::strcmp(target, "passthrough") == 0) return path;
    return target;
}

FILE* callNext(const char* name, const char* path, const char* mode) {
    auto next = reinterpret_cast<FopenFn>(dlsym(RTLD_NEXT, name));
    return next == nullptr ? nullptr : next(redirect(path), mode);
}

}  // namespace

extern "C" __attribute__((visibility("default"))) FILE* fopen(const char* path, const char* mode) {
    return callNext("fopen", path, mode);
}

extern "C" __attribute__((visibility("default"))) FILE* fopen64(const char* path,
                                                                const char* mode) {
    return callNext("fopen64", path, mode);
}
