// Unlike the platform's own helper, which aborts the VM when a class or method
// is missing, this reports the failure so the caller can log it and refuse to
// load.
#include "android_runtime/AndroidRuntime.h"

namespace android {

namespace {

// Clears whatever exception the failed lookup or binding left, so the caller
// may go on making JNI calls.
int failWithoutPendingException(JNIEnv* env) {
    if (env->ExceptionCheck()) env->ExceptionClear();
    return -1;
}

}  // namespace

int AndroidRuntime::registerNativeMethods(JNIEnv* env, const char* className,
                                          const JNINativeMethod* gMethods, int numMethods) {
    jclass clazz = env->FindClass(className);
    if (clazz == nullptr) return failWithoutPendingException(env);
    int result = env->RegisterNatives(clazz, gMethods, numMethods) == JNI_OK
                     ? 0
                     : failWithoutPendingException(env);
    env->DeleteLocalRef(clazz);
    return result;
}

}  // namespace android
