// The libcutils stand-in: system properties read from a build.prop-style file.
#include <cutils/properties.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <cstdio>
#include <string>

namespace {

// A properties file for one test, named by the variable property_get reads.
class PropertiesFile {
  public:
    explicit PropertiesFile(const std::string& contents) {
        char path[] = "/tmp/property-get-XXXXXX";
        int fd = mkstemp(path);
        mPath = path;
        if (fd >= 0) {
            (void)!write(fd, contents.data(), contents.size());
            close(fd);
        }
        setenv("HOSTCALL_PROPERTIES_FILE", mPath.c_str(), 1);
    }
    ~PropertiesFile() {
        unsetenv("HOSTCALL_PROPERTIES_FILE");
        unlink(mPath.c_str());
    }

  private:
    std::string mPath;
};

std::string get(const char* key, const char* defaultValue = "dflt") {
    char value[PROPERTY_VALUE_MAX];
    memset(value, 'x', sizeof(value));
    int length = property_get(key, value, defaultValue);
    EXPECT_EQ(length, int(strlen(value))) << "the result is the length of the terminated value";
    return value;
}

TEST(PropertyGet, WhenKeyIsListed_YieldsItsValueLaterLinesWinning) {
    PropertiesFile file(
        "# comment=ignored\n\n  kiv.debug.kivhostcall = 1\nother=x\nkiv.debug.kivhostcall= 7\r\n");
    EXPECT_EQ(" 7", get("kiv.debug.kivhostcall"))
        << "value kept as written after '=', last line wins";
    EXPECT_EQ("x", get("other"));
    EXPECT_EQ("dflt", get("comment")) << "comment lines hold no properties";
}

TEST(PropertyGet, WhenKeyIsMissingEmptyOrFileAbsent_YieldsTheDefault) {
    {
        PropertiesFile file("empty=\n");
        EXPECT_EQ("dflt", get("empty")) << "an empty value counts as not set, as on the platform";
        EXPECT_EQ("dflt", get("absent"));
        EXPECT_EQ("", get("absent", nullptr)) << "no default: an empty, terminated value";
    }
    EXPECT_EQ("0", get("kiv.debug.kivhostcall", "0")) << "no file named: every property is unset";
}

TEST(PropertyGet, WhenValueIsLong_TruncatesToOneLessThanTheMaximumAndTerminates) {
    const std::string exact(PROPERTY_VALUE_MAX - 1, 'a');
    const std::string longer(PROPERTY_VALUE_MAX, 'b');
    PropertiesFile file("exact=" + exact + "\nlonger=" + longer + "\n");
    EXPECT_EQ(exact, get("exact"));
    EXPECT_EQ(longer.substr(0, PROPERTY_VALUE_MAX - 1), get("longer"));
    EXPECT_EQ(std::string(PROPERTY_VALUE_MAX - 1, 'c'),
              get("absent", std::string(PROPERTY_VALUE_MAX + 5, 'c').c_str()))
        << "a long default is cut the same way";
}

}  // namespace
