// The Java arrays the exports take and give back, converted to and from C++. Texts cross as
// UTF-8 (see StringToJava and JniHost::ToCpp).
#pragma once

#include <jni.h>

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace tessel {

// Copies at most kMaxJavaArrayElements elements; a null element becomes the empty text.
// Nothing for a null array or a failed conversion.
std::optional<std::vector<std::string>> StringsFromJava(JNIEnv* env, jobjectArray array);
std::optional<std::vector<std::int32_t>> IntsFromJava(JNIEnv* env, jintArray array);
// nullptr on failure.
jintArray IntsToJava(JNIEnv* env, std::span<const std::int32_t> values);

}  // namespace tessel
