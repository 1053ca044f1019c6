#!/usr/bin/env bash
# Clang's thread-safety analysis over the shipped library's sources: the pool,
# the timer service and the exchange lock state what guards what (GUARDED_BY,
# REQUIRES, ACQUIRE/RELEASE from android-base/thread_annotations.h). It runs
# against libc++, whose mutex and lock_guard are annotated capabilities, as
# libstdc++'s are not. A probe that touches each guarded record without its
# lock must be refused first, so that a check which checks nothing fails too.
# Usage: check-thread-safety.sh [REPO_ROOT]
set -euo pipefail
root=${1:-$(cd "$(dirname "$0")/../.." && pwd)}
android=/usr/include/android
flags=(-std=c++17 -stdlib=libc++ -D_LIBCPP_ENABLE_THREAD_SAFETY_ANNOTATIONS -fsyntax-only
    -Wthread-safety -Werror -I"$root/Source" -I"$root/server/native"
    -isystem "$android" -isystem "$android/nativehelper"
    -isystem "$root/platform/cutils/include" -isystem "$root/platform/android_runtime/include")

probe='#include "hcall/guest/HcallEnc.h"
#include "xpl/XthrPool.h"
#include "xpl/Xtimer.h"
int pool(XthrPool* p) { return p->numActive; }
int timer() { return g_xtimer->threadStarted; }
int client() { return g_hcall.client.mFd; }'
refused=$(clang++ "${flags[@]}" -x c++ - <<<"$probe" 2>&1 | grep -c "requires holding" || true)
if [[ "$refused" -ne 3 ]]; then
    echo "thread safety: the probe's 3 unguarded reads gave $refused findings; the check is not working"
    exit 1
fi

status=0
count=0
while IFS= read -r file; do
    count=$((count + 1))
    clang++ "${flags[@]}" "$file" || status=1
done < <(cd "$root" && find Source server/native -name '*.cpp' | sort | sed "s|^|$root/|")
[[ $status -eq 0 ]] && echo "thread safety: $count library sources clean"
exit $status
