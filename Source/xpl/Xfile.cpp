// The front file operations: what callers use. Most forward to their back-end;
// opening, directory creation, whole-buffer transfers and moving add a step.
#include "xpl/Xfile.h"

#include <cstring>

#include "xpl/Xlog.h"

namespace {

constexpr const char* kSourcePath = "Source/xpl/Xfile";
constexpr int kDirectoryMode = 0774;

using Transfer = xerr_t (*)(Xfile*, void*, size_t, size_t*);

// Loops until `count` bytes have moved. A transfer that moves nothing (end of
// file, or a write that makes no progress) would otherwise loop for ever; it
// ends the loop as an I/O failure, since fewer bytes moved than asked.
xerr_t transferAll(Transfer transfer, Xfile* file, void* buf, size_t count) {
    size_t total = 0;
    while (total < count) {
        size_t done = 0;
        xerr_t err = transfer(file, static_cast<char*>(buf) + total, count - total, &done);
        if (err != XERR_SUCCESS) return err;
        if (done == 0) return XERR_IO;
        total += done;
    }
    return XERR_SUCCESS;
}

}  // namespace

xerr_t xfileCleanPath(const std::string& path, std::string& out) {
    if (&path != &out) out = path;
    return XERR_SUCCESS;
}

xerr_t xfileOpen(Xfile* file, const std::string& path, int mode) {
    if (mode != XFILE_MODE_READ) {
        // A missing parent directory is created; the open reports any
        // real failure, so the creation's outcome is not examined.
        const char* text = path.c_str();
        if (const char* slash = std::strrchr(text, '/')) {
            std::string directory(text, static_cast<size_t>(slash - text));
            if (xfilePathExistsBasic(directory) != XERR_SUCCESS) {
                xfileMakeDirectory(directory, kDirectoryMode);
            }
        }
    }
    return xfileOpenBasic(file, path, mode);
}

xerr_t xfileClose(Xfile* file) { return xfileCloseBasic(file); }

xerr_t xfileRead(Xfile* file, void* buf, size_t count, size_t* done) {
    return xfileReadBasic(file, buf, count, done);
}

xerr_t xfileWrite(Xfile* file, void* buf, size_t count, size_t* done) {
    return xfileWriteBasic(file, buf, count, done);
}

xerr_t xfileReadAll(Xfile* file, void* buf, size_t count) {
    return transferAll(xfileReadBasic, file, buf, count);
}

xerr_t xfileWriteAll(Xfile* file, void* buf, size_t count) {
    return transferAll(xfileWriteBasic, file, buf, count);
}

xerr_t xfileSeek(Xfile* file, long long offset, int whence, long long* pos) {
    return xfileSeekBasic(file, offset, whence, pos);
}

xerr_t xfileSize(Xfile* file, long long* size) { return xfileSizeBasic(file, size); }

xerr_t xfileSizeByName(const std::string& path, long long* size) {
    return xfileSizeByNameBasic(path, size);
}

xerr_t xfilePathExists(const std::string& path) { return xfilePathExistsBasic(path); }

xerr_t xfileMakeDirectory(const std::string& path, int mode) {
    // Callers go on to use the directory and meet the real error there.
    xfileMakeDirectoryBasic(path, mode);
    return XERR_SUCCESS;
}

xerr_t xfileRemoveDirectory(const std::string& path) { return xfileRemoveDirectoryBasic(path); }

xerr_t xfileDelete(const std::string& path) { return xfileDeleteBasic(path); }

xerr_t xfileMove(const std::string& from, const std::string& to) {
    xerr_t flushed = xfileFlushBasic(from);
    if (flushed != XERR_SUCCESS) {
        XLOG_AT(XLOG_MODULE_XFILE, XLOG_LEVEL_W, kSourcePath,
                "xerr_t xfileMove(const string &, const string &)",
                "Error in flushing file %s to disk. Error = %d", from.c_str(), flushed);
    }
    return xfileMoveBasic(from, to);
}

xerr_t xfileFlush(const std::string& path) { return xfileFlushBasic(path); }
