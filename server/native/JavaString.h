// Java string arguments as byte strings.
#pragma once

#include <jni.h>

#include <string>

#include "xpl/XplExport.h"

// Lends a Java string's modified UTF-8 bytes for one scope and gives them back
// when the scope ends. c_str() is null when the runtime could not lend them
// (it is out of memory and has an OutOfMemoryError pending).
class ScopedUtfChars {
  public:
    ScopedUtfChars(JNIEnv* env, jstring string);
    ~ScopedUtfChars();
    ScopedUtfChars(const ScopedUtfChars&) = delete;
    ScopedUtfChars& operator=(const ScopedUtfChars&) = delete;

    const char* c_str() const { return mChars; }

  private:
    JNIEnv* mEnv;
    jstring mString;
    const char* mChars;
};

// The modified UTF-8 bytes of `s`. A null `s` raises IllegalArgumentException
// "Null argument" and yields an empty string. While an exception is pending
// (an earlier argument of the same call was null, or the runtime ran out of
// memory) the JNI rules forbid touching the string, so it too yields an empty
// string and the first exception is the one Java sees.
XPL_EXPORT std::string getStringFromJstring(JNIEnv* env, jobject object, jstring s);
