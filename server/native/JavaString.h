// Java string arguments as byte strings.
#pragma once

#include <jni.h>

#include <string>

#include "xpl/XplExport.h"

// The modified UTF-8 bytes of `s`. A null `s` raises IllegalArgumentException
// "Null argument" and yields an empty string. While an exception is pending
// (an earlier argument of the same call was null, or the runtime ran out of
// memory) the JNI rules forbid touching the string, so it too yields an empty
// string and the first exception is the one Java sees.
XPL_EXPORT std::string getStringFromJstring(JNIEnv* env, jobject object, jstring s);
