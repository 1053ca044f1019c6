// The part of the Android runtime's interface that native services link
// against: binding native methods to a Java class.
#pragma once

#include <jni.h>

namespace android {

class __attribute__((visibility("default"))) AndroidRuntime {
  public:
    // Binds `numMethods` entries to `className`. Returns 0 on success and
    // non-zero on failure, with no Java exception left pending either way.
    static int registerNativeMethods(JNIEnv* env, const char* className,
                                     const JNINativeMethod* gMethods, int numMethods);
};

}  // namespace android
