// A move-only owner of one file descriptor: closes it unless released.
#pragma once

#include <unistd.h>

class VmsgFd {
  public:
    explicit VmsgFd(int fd) : mFd(fd) {}
    VmsgFd(const VmsgFd&) = delete;
    VmsgFd& operator=(const VmsgFd&) = delete;
    ~VmsgFd() {
        if (mFd >= 0) ::close(mFd);
    }

    int get() const { return mFd; }
    int release() {
        int fd = mFd;
        mFd = -1;
        return fd;
    }

  private:
    int mFd;
};
