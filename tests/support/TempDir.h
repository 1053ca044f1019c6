// A fresh folder under /tmp, removed with all it holds when it goes out of scope.
#pragma once

#include <stdlib.h>
#include <sys/stat.h>

#include <filesystem>
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
        std::error_code ignored;
        if (!path_.empty()) std::filesystem::remove_all(path_, ignored);
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
