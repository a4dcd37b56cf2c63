#include "engine/exports_marshal.h"

#include <algorithm>

#include "engine/jni_host.h"
#include "engine/log.h"

namespace tessel {

std::optional<std::vector<std::string>> StringsFromJava(JNIEnv* env, jobjectArray array) {
  if (array == nullptr) return std::nullopt;
  std::vector<std::string> texts;
  bool ok = ForEachElement(env, array, [&](jobject element) {
    if (element == nullptr) {
      texts.emplace_back();
      return true;
    }
    std::optional<std::string> text = JniHost::Instance().ToCpp(env, static_cast<jstring>(element));
    if (text) texts.push_back(std::move(*text));
    return text.has_value();
  });
  if (!ok) return std::nullopt;
  return texts;
}

std::optional<std::vector<std::int32_t>> IntsFromJava(JNIEnv* env, jintArray array) {
  if (array == nullptr) return std::nullopt;
  std::vector<std::int32_t> values(
      static_cast<std::size_t>(std::min(env->GetArrayLength(array), kMaxJavaArrayElements)));
  env->GetIntArrayRegion(array, 0, static_cast<jsize>(values.size()),
                         reinterpret_cast<jint*>(values.data()));
  return values;
}

jintArray IntsToJava(JNIEnv* env, std::span<const std::int32_t> values) {
  jintArray array = env->NewIntArray(static_cast<jsize>(values.size()));
  if (array == nullptr) {
    env->ExceptionClear();
    LOG_ERROR("unable to alloc memory \n");
    return nullptr;
  }
  env->SetIntArrayRegion(array, 0, static_cast<jsize>(values.size()),
                         reinterpret_cast<const jint*>(values.data()));
  return array;
}

}  // namespace tessel
