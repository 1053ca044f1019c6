#include "JavaString.h"

#include <nativehelper/JNIHelp.h>
#include <nativehelper/ScopedUtfChars.h>

std::string getStringFromJstring(JNIEnv* env, jobject /*object*/, jstring s) {
    std::string bytes;
    if (env->ExceptionCheck()) {
        // Nothing but exception handling is allowed now; the string counts as empty.
    } else if (s == nullptr) {
        // Checked here: ScopedUtfChars would raise NullPointerException instead.
        jniThrowException(env, "java/lang/IllegalArgumentException", "Null argument");
    } else {
        // A runtime out of memory lends nothing (c_str() is null) and leaves
        // OutOfMemoryError pending; the string then counts as empty.
        ScopedUtfChars chars(env, s);
        if (chars.c_str() != nullptr) bytes = chars.c_str();
    }
    return bytes;
}
