// A small file layer over POSIX: front operations and their ...Basic back-ends.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include "xpl/Xerr.h"
#include "xpl/XplExport.h"

struct Xfile {
    int32_t fd;
};

enum : int {
    XFILE_MODE_READ = 1,
    XFILE_MODE_READ_WRITE = 2,
    XFILE_MODE_APPEND = 3,
    XFILE_MODE_TRUNCATE = 4,
    XFILE_MODE_EXISTING = 5,
};

XPL_EXPORT xerr_t xfileCleanPath(const std::string& path, std::string& out);

XPL_EXPORT xerr_t xfileOpen(Xfile* file, const std::string& path, int mode);
XPL_EXPORT xerr_t xfileClose(Xfile* file);
XPL_EXPORT xerr_t xfileRead(Xfile* file, void* buf, size_t count, size_t* done);
XPL_EXPORT xerr_t xfileWrite(Xfile* file, void* buf, size_t count, size_t* done);
XPL_EXPORT xerr_t xfileReadAll(Xfile* file, void* buf, size_t count);
XPL_EXPORT xerr_t xfileWriteAll(Xfile* file, void* buf, size_t count);
XPL_EXPORT xerr_t xfileSeek(Xfile* file, long long offset, int whence, long long* pos);
XPL_EXPORT xerr_t xfileSize(Xfile* file, long long* size);
XPL_EXPORT xerr_t xfileSizeByName(const std::string& path, long long* size);
XPL_EXPORT xerr_t xfilePathExists(const std::string& path);
XPL_EXPORT xerr_t xfileMakeDirectory(const std::string& path, int mode);
XPL_EXPORT xerr_t xfileRemoveDirectory(const std::string& path);
XPL_EXPORT xerr_t xfileDelete(const std::string& path);
XPL_EXPORT xerr_t xfileMove(const std::string& from, const std::string& to);
XPL_EXPORT xerr_t xfileFlush(const std::string& path);

XPL_EXPORT xerr_t xfileOpenBasic(Xfile* file, const std::string& path, int mode);
XPL_EXPORT xerr_t xfileCloseBasic(Xfile* file);
XPL_EXPORT xerr_t xfileReadBasic(Xfile* file, void* buf, size_t count, size_t* done);
XPL_EXPORT xerr_t xfileWriteBasic(Xfile* file, void* buf, size_t count, size_t* done);
XPL_EXPORT xerr_t xfileSeekBasic(Xfile* file, long long offset, int whence, long long* pos);
XPL_EXPORT xerr_t xfileSizeBasic(Xfile* file, long long* size);
XPL_EXPORT xerr_t xfileSizeByNameBasic(const std::string& path, long long* size);
XPL_EXPORT xerr_t xfilePathExistsBasic(const std::string& path);
XPL_EXPORT xerr_t xfileMakeDirectoryBasic(const std::string& path, int mode);
XPL_EXPORT xerr_t xfileRemoveDirectoryBasic(const std::string& path);
XPL_EXPORT xerr_t xfileDeleteBasic(const std::string& path);
XPL_EXPORT xerr_t xfileMoveBasic(const std::string& from, const std::string& to);
XPL_EXPORT xerr_t xfileFlushBasic(const std::string& path);
