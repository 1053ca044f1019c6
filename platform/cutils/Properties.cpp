// System properties for a machine without Android's property service: the
// file named by HOSTCALL_PROPERTIES_FILE holds them in build.prop syntax
// (`key=value` lines, `#` comments, later lines override earlier ones).
#include <cutils/properties.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>

namespace {

constexpr const char* kPropertiesFileVariable = "HOSTCALL_PROPERTIES_FILE";

struct FileCloser {
    void operator()(FILE* file) const { fclose(file); }
};

std::string trim(const std::string& text) {
    const char* blanks = " \t\r\n";
    size_t first = text.find_first_not_of(blanks);
    if (first == std::string::npos) return std::string();
    return text.substr(first, text.find_last_not_of(blanks) - first + 1);
}

// Looks `key` up; an empty result means "not set", as for the platform.
std::string lookUp(const char* key) {
    std::string value;
    const char* path = getenv(kPropertiesFileVariable);
    if (key == nullptr || path == nullptr) return value;
    FILE* raw = fopen(path, "re");
    if (raw == nullptr) return value;
    std::unique_ptr<FILE, FileCloser> file(raw);
    char* line = nullptr;
    size_t capacity = 0;
    ssize_t length;
    while ((length = getline(&line, &capacity, file.get())) >= 0) {
        std::string text(line, length);
        while (!text.empty() && (text.back() == '\n' || text.back() == '\r')) text.pop_back();
        std::string start = trim(text);
        if (start.empty() || start[0] == '#') continue;
        size_t equals = text.find('=');
        if (equals == std::string::npos) continue;
        if (trim(text.substr(0, equals)) == key) value = text.substr(equals + 1);
    }
    free(line);
    return value;
}

}  // namespace

extern "C" __attribute__((visibility("default"))) int property_get(const char* key, char* value,
                                                                   const char* default_value) {
    std::string found = lookUp(key);
    const char* source = !found.empty() ? found.c_str() : default_value;
    size_t length = 0;
    if (source != nullptr) {
        length = strnlen(source, PROPERTY_VALUE_MAX - 1);
        memcpy(value, source, length);
    }
    value[length] = '\0';
    return static_cast<int>(length);
}
