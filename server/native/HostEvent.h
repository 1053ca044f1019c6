// The one pattern behind the 32 event and query methods: convert the Java
// arguments, refuse the call when a required string is empty, write the debug
// lines, and either queue a task that makes the host call on the worker or
// make it on the caller's thread. Each method is a declaration of its texts,
// its arguments and its host call (see com_zelvane_server_KivHostCallService).
#pragma once

#include <jni.h>

#include <array>
#include <string>
#include <tuple>
#include <type_traits>
#include <utility>

#include "BridgeLog.h"
#include "JavaString.h"
#include "xpl/Xerr.h"
#include "xpl/XthrPool.h"

namespace bridge {

// What a method writes before it converts its strings.
enum class FirstLine {
    None,
    Called,        // "%s: called", while debugging
    CalledAlways,  // "%s called", on every call
};

// The log texts of one method. `name` is the implementing function's
// signature text, `taskName` the name its task logs under; `detail` is written
// with the name followed by every logged argument, in Java order.
struct MethodTexts {
    const char* name;
    const char* taskName;
    FirstLine first;
    const char* detail;             // null: no detail line
    bool blankBeforeComma = false;  // the task's "returning" line reads "returning , rval"
};

// Both names of a method from its signature text less the return type.
#define BRIDGE_NAMES(returnType, signature) \
    returnType " " signature, "auto " signature "::(anonymous class)::operator()() const"

// Argument wrappers a method declaration uses beside plain jstring, jboolean
// and jint: a string that must not be empty, and a value the detail line does
// not show.
struct Required {
    jstring value;
};
template <typename T>
struct Unlogged {
    T value;
};

// Converts the arguments of one call, in the order it is applied to them, and
// remembers whether a required string came out empty.
class ArgumentReader {
  public:
    ArgumentReader(JNIEnv* env, jobject object) : mEnv(env), mObject(object) {}

    std::string operator()(jstring s) const { return getStringFromJstring(mEnv, mObject, s); }
    std::string operator()(Required s) {
        std::string bytes = (*this)(s.value);
        mMissing = mMissing || bytes.empty();
        return bytes;
    }
    jboolean operator()(jboolean b) const { return b; }
    jint operator()(jint i) const { return i; }
    template <typename T>
    Unlogged<T> operator()(Unlogged<T> u) const {
        return u;
    }

    bool missing() const { return mMissing; }

  private:
    JNIEnv* mEnv;
    jobject mObject;
    bool mMissing = false;
};

// The copy a task keeps of a Java argument.
template <typename Java>
using Stored = decltype(std::declval<ArgumentReader&>()(std::declval<Java>()));

// A stored value as the host call takes it: booleans are true for any
// non-zero jboolean.
inline const char* hostValue(const std::string& s) { return s.c_str(); }
inline bool hostValue(jboolean b) { return b != JNI_FALSE; }
inline jint hostValue(jint i) { return i; }
template <typename T>
auto hostValue(const Unlogged<T>& u) {
    return hostValue(u.value);
}

// A stored value as the detail line shows it: booleans as the jboolean value.
inline std::tuple<const char*> loggedValue(const std::string& s) { return {s.c_str()}; }
inline std::tuple<int> loggedValue(jboolean b) { return {b}; }
inline std::tuple<int> loggedValue(jint i) { return {i}; }
template <typename T>
std::tuple<> loggedValue(const Unlogged<T>&) {
    return {};
}

// The printf conversion each stored type is shown with; '-' for none.
template <typename T>
inline constexpr char kConversion = '-';
template <>
inline constexpr char kConversion<std::string> = 's';
template <>
inline constexpr char kConversion<jboolean> = 'd';
template <>
inline constexpr char kConversion<jint> = 'd';

// True when `format` holds exactly the conversions in `expected` ('-' skipped).
constexpr bool formatMatches(const char* format, const char* expected) {
    for (; *format != '\0'; ++format) {
        if (*format != '%') continue;
        ++format;
        if (*format == '%') continue;
        while (*expected == '-') ++expected;
        if (*expected == '\0' || *format != *expected) return false;
        ++expected;
    }
    while (*expected == '-') ++expected;
    return *expected == '\0';
}

template <const MethodTexts& Texts, typename... Values>
constexpr bool detailMatches() {
    constexpr std::array<char, sizeof...(Values) + 2> expected{'s', kConversion<Values>..., '\0'};
    return Texts.detail == nullptr ? sizeof...(Values) == 0
                                   : formatMatches(Texts.detail, expected.data());
}

inline void writeFirstLine(const MethodTexts& texts) {
    if (texts.first == FirstLine::CalledAlways)
        ALOGD("%s called", texts.name);
    else if (texts.first == FirstLine::Called && bridgeDebugEnabled())
        ALOGD("%s: called", texts.name);
}

template <const MethodTexts& Texts, typename... Values>
void writeDetailLine(const std::tuple<Values...>& values) {
    static_assert(detailMatches<Texts, Values...>(),
                  "the detail format must show the logged arguments in order");
    if constexpr (Texts.detail != nullptr) {
        if (!bridgeDebugEnabled()) return;
        auto shown = std::apply(
            [](const auto&... value) { return std::tuple_cat(loggedValue(value)...); }, values);
        std::apply([](auto... value) { ALOGD(Texts.detail, Texts.name, value...); }, shown);
    }
}

// What the worker runs for one event.
template <const MethodTexts& Texts, auto hostCall, typename Values>
void runTask(const Values& values) {
    xerr_t result =
        std::apply([](const auto&... value) { return hostCall(hostValue(value)...); }, values);
    if (result != XERR_SUCCESS) ALOGE("RPC failed for %s, error %d", Texts.taskName, result);
    if (!bridgeDebugEnabled()) return;
    if (Texts.blankBeforeComma)
        ALOGD("%s: returning , rval = %d", Texts.taskName, result);
    else
        ALOGD("%s: returning, rval = %d", Texts.taskName, result);
}

// A forwarding method: 0 once the event is queued, -1 when a required string is
// empty (or null, which also leaves IllegalArgumentException pending).
template <const MethodTexts& Texts, auto hostCall, typename... Java>
jint forwardEvent(JNIEnv* env, jobject object, Java... java) {
    writeFirstLine(Texts);
    ArgumentReader read(env, object);
    // Braced initialisation converts the strings in Java parameter order.
    std::tuple<Stored<Java>...> values{read(java)...};
    if (read.missing()) return -1;
    writeDetailLine<Texts>(values);
    if constexpr ((std::is_trivially_copyable_v<Stored<Java>> && ...)) {
        // Plain values are captured one by one: std::tuple is never trivially
        // copyable, and only a trivially copyable task fits inside
        // std::function without a heap block per event.
        std::apply(
            [](auto... value) {
                xthrPoolAddTask(&g_thr_pool, [value...] {
                    runTask<Texts, hostCall>(std::make_tuple(value...));
                });
            },
            values);
    } else {
        xthrPoolAddTask(&g_thr_pool,
                        [values = std::move(values)] { runTask<Texts, hostCall>(values); });
    }
    return 0;
}

// A query: the host's answer, asked on the caller's thread; `whenEmpty`
// without asking when the string is empty.
template <const MethodTexts& Texts, auto hostCall, typename Answer>
Answer askHost(JNIEnv* env, jobject object, Answer whenEmpty, Required java) {
    writeFirstLine(Texts);
    ArgumentReader read(env, object);
    std::tuple<std::string> values{read(java)};
    if (read.missing()) return whenEmpty;
    writeDetailLine<Texts>(values);
    auto answer = hostCall(std::get<0>(values).c_str());
    if (bridgeDebugEnabled())
        ALOGD("%s: returning, rval = %d", Texts.name, static_cast<int>(answer));
    return static_cast<Answer>(answer);
}

}  // namespace bridge
