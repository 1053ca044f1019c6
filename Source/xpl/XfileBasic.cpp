// The back-end file operations: one system call each, its errno translated.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "xpl/Xfile.h"
#include "xpl/Xmem.h"

namespace {

constexpr mode_t kCreateMode = 0774;
constexpr size_t kMaxDirectoryPath = 4096;

// open(2) flags by mode, indexed by mode number; other modes read only.
constexpr int kOpenFlags[] = {
    O_RDONLY,                     // (not a mode)
    O_RDONLY,                     // XFILE_MODE_READ
    O_RDWR | O_CREAT,             // XFILE_MODE_READ_WRITE
    O_RDWR | O_CREAT | O_APPEND,  // XFILE_MODE_APPEND
    O_RDWR | O_CREAT | O_TRUNC,   // XFILE_MODE_TRUNCATE
    O_RDWR,                       // XFILE_MODE_EXISTING
};
static_assert(sizeof(kOpenFlags) / sizeof(kOpenFlags[0]) == XFILE_MODE_EXISTING + 1,
              "one row per open mode");

int openFlags(int mode) {
    return mode >= XFILE_MODE_READ && mode <= XFILE_MODE_EXISTING ? kOpenFlags[mode] : O_RDONLY;
}

xerr_t lastError() { return xerrFromNative(errno); }

// errno is tested directly (not its translation) so that these rules hold
// even before the result-code tables are filled.
xerr_t mkdirIgnoringExisting(const char* path, int mode) {
    if (mkdir(path, static_cast<mode_t>(mode)) == 0 || errno == EEXIST) return XERR_SUCCESS;
    return lastError();
}

template <typename Transfer>
xerr_t transferRetryingInterrupts(Transfer transfer, size_t* done) {
    ssize_t result;
    do {
        result = transfer();
    } while (result < 0 && errno == EINTR);
    if (result < 0) return lastError();
    *done = static_cast<size_t>(result);
    return XERR_SUCCESS;
}

}  // namespace

xerr_t xfileOpenBasic(Xfile* file, const std::string& path, int mode) {
    int fd = open(path.c_str(), openFlags(mode), kCreateMode);
    if (fd < 0) return lastError();
    file->fd = fd;
    return XERR_SUCCESS;
}

xerr_t xfileCloseBasic(Xfile* file) { return close(file->fd) == 0 ? XERR_SUCCESS : lastError(); }

xerr_t xfileReadBasic(Xfile* file, void* buf, size_t count, size_t* done) {
    return transferRetryingInterrupts([&] { return read(file->fd, buf, count); }, done);
}

xerr_t xfileWriteBasic(Xfile* file, void* buf, size_t count, size_t* done) {
    return transferRetryingInterrupts([&] { return write(file->fd, buf, count); }, done);
}

xerr_t xfileSeekBasic(Xfile* file, long long offset, int whence, long long* pos) {
    off64_t result = lseek64(file->fd, static_cast<off64_t>(offset), whence);
    *pos = result;
    return result < 0 ? lastError() : XERR_SUCCESS;
}

xerr_t xfileSizeBasic(Xfile* file, long long* size) {
    struct stat64 info;
    if (fstat64(file->fd, &info) != 0) return lastError();
    *size = info.st_size;
    return XERR_SUCCESS;
}

xerr_t xfileSizeByNameBasic(const std::string& path, long long* size) {
    struct stat64 info;
    if (stat64(path.c_str(), &info) != 0) return lastError();
    *size = info.st_size;
    return XERR_SUCCESS;
}

xerr_t xfilePathExistsBasic(const std::string& path) {
    struct stat64 info;
    if (stat64(path.c_str(), &info) != 0) return lastError();
    // Devices, pipes and sockets are not files this layer works with.
    return S_ISDIR(info.st_mode) || S_ISREG(info.st_mode) ? XERR_SUCCESS : XERR_NOENT;
}

xerr_t xfileMakeDirectoryBasic(const std::string& path, int mode) {
    size_t length = std::strlen(path.c_str());
    if (length > kMaxDirectoryPath) return XERR_NAMETOOLONG;
    char* prefix = static_cast<char*>(xmem_alloc(length + 1));
    if (prefix == nullptr) return XERR_NOMEM;
    xmem_cpy(prefix, path.c_str(), length + 1);
    xerr_t err = XERR_SUCCESS;
    // Each ancestor in turn, cut off at its "/"; starting after the first
    // character keeps a leading "/" from making an empty prefix.
    for (size_t i = 1; i < length && err == XERR_SUCCESS; ++i) {
        if (prefix[i] != '/') continue;
        prefix[i] = '\0';
        err = mkdirIgnoringExisting(prefix, mode);
        prefix[i] = '/';
    }
    if (err == XERR_SUCCESS) err = mkdirIgnoringExisting(prefix, mode);
    xmem_free(prefix);
    return err;
}

xerr_t xfileRemoveDirectoryBasic(const std::string& path) {
    return rmdir(path.c_str()) == 0 ? XERR_SUCCESS : lastError();
}

xerr_t xfileDeleteBasic(const std::string& path) {
    return unlink(path.c_str()) == 0 ? XERR_SUCCESS : lastError();
}

xerr_t xfileMoveBasic(const std::string& from, const std::string& to) {
    return rename(from.c_str(), to.c_str()) == 0 ? XERR_SUCCESS : lastError();
}

xerr_t xfileFlushBasic(const std::string& path) {
    Xfile file{};
    xerr_t err = xfileOpen(&file, path, XFILE_MODE_EXISTING);
    if (err != XERR_SUCCESS) return err;
    if (fsync(file.fd) != 0) {
        err = lastError();
        xfileCloseBasic(&file);
        return err;
    }
    return xfileCloseBasic(&file);
}
