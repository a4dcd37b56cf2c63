// The Java arrays the exports take and give back, converted to and from C++. Texts cross as
// UTF-8 (see StringToJava and JniHost::ToCpp).
#pragma once

#include <jni.h>

#include <cstdint>
#include <new>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "engine/log.h"

namespace tessel {

// Runs an export's body; no C++ exception leaves an export (running out of memory gives the
// failure result).
template <typename Result, typename Body>
Result Guarded(Result failure, Body body) noexcept {
  try {
    return body();
  } catch (const std::bad_alloc&) {
    LOG_ERROR("unable to alloc memory \n");
  } catch (...) {
    LOG_ERROR("unexpected failure in a host call\n");
  }
  return failure;
}

template <typename Body>
void GuardedVoid(Body body) noexcept {
  Guarded(0, [&] {
    body();
    return 0;
  });
}

inline jboolean ToJboolean(bool value) { return value ? JNI_TRUE : JNI_FALSE; }

// Copies at most kMaxJavaArrayElements elements; a null element becomes the empty text.
// Nothing for a null array or a failed conversion.
std::optional<std::vector<std::string>> StringsFromJava(JNIEnv* env, jobjectArray array);
std::optional<std::vector<std::int32_t>> IntsFromJava(JNIEnv* env, jintArray array);
// nullptr on failure.
jintArray IntsToJava(JNIEnv* env, std::span<const std::int32_t> values);

}  // namespace tessel
