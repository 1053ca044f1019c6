#include "JavaString.h"

#include <nativehelper/JNIHelp.h>

ScopedUtfChars::ScopedUtfChars(JNIEnv* env, jstring string)
    : mEnv(env), mString(string), mChars(env->GetStringUTFChars(string, nullptr)) {}

ScopedUtfChars::~ScopedUtfChars() {
    if (mChars != nullptr) mEnv->ReleaseStringUTFChars(mString, mChars);
}

std::string getStringFromJstring(JNIEnv* env, jobject /*object*/, jstring s) {
    std::string bytes;
    if (env->ExceptionCheck()) {
        // Nothing but exception handling is allowed now; the string counts as empty.
    } else if (s == nullptr) {
        jniThrowException(env, "java/lang/IllegalArgumentException", "Null argument");
    } else {
        ScopedUtfChars chars(env, s);
        if (chars.c_str() != nullptr) bytes = chars.c_str();
    }
    return bytes;
}
