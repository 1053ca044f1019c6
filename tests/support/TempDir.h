// A fresh folder under /tmp, removed with all it holds when it goes out of scope.
#pragma once

#include <ftw.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <cstdio>
#include <fstream>
#include <sstream>
#include <string>

class TempDir {
  public:
    TempDir() {
        char pattern[] = "/tmp/hostcall_test_XXXXXX";
        if (mkdtemp(pattern) != nullptr) path_ = pattern;
    }
    ~TempDir() {
        auto remove = [](const char* path, const struct stat*, int, struct FTW*) {
            return std::remove(path);
        };
        if (!path_.empty()) (void)nftw(path_.c_str(), remove, 16, FTW_DEPTH | FTW_PHYS);
    }
    TempDir(const TempDir&) = delete;
    TempDir& operator=(const TempDir&) = delete;

    std::string operator/(const std::string& name) const { return path_ + "/" + name; }

    // What the file `name` holds; empty when it cannot be read.
    std::string read(const std::string& name) const {
        std::stringstream text;
        text << std::ifstream(*this / name, std::ios::binary).rdbuf();
        return text.str();
    }
    void write(const std::string& name, const std::string& text) const {
        std::ofstream(*this / name, std::ios::binary) << text;
    }
    // The entry's type and permission bits; 0 when it does not exist.
    mode_t mode(const std::string& name) const {
        struct stat info {};
        return stat((*this / name).c_str(), &info) == 0 ? info.st_mode : 0;
    }

  private:
    std::string path_;
};
