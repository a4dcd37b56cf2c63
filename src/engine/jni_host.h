// The JNI implementation of the host bridge, and the conversions of texts and arrays between
// Java and C++ that the exports use. Everything here is safe from any thread: a thread that is
// not yet attached to the JVM attaches once, as a daemon, and detaches when it ends. Host objects
// are held by global references that live as long as their binding; every call runs in its own
// local frame and clears any exception the host raised (the call then answers nothing).
#pragma once

#include <jni.h>

#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "engine/host_bridge.h"

namespace tessel {

// The calling thread's environment in vm; nullptr when it cannot attach.
JNIEnv* AttachedEnv(JavaVM* vm);

struct SimulatorBinding;
struct HandlerBinding;
class JavaArguments;

class JniHost final : public HostBridge {
 public:
  // The one instance; it is never destroyed, so no global reference is released after the JVM.
  static JniHost& Instance();

  // Binds the network simulator object (status lines, text conversion). False when one of its
  // methods is missing.
  bool BindNetworkSimulator(JNIEnv* env, jobject simulator);
  // Binds the SNMP handler object (value calls). False when one of its methods is missing.
  bool BindSnmpHandler(JNIEnv* env, jobject handler);

  // Java text to C++ bytes (UTF-8, through the simulator's getBytes when bound); nothing for
  // null or when the host fails.
  std::optional<std::string> ToCpp(JNIEnv* env, jstring text);

  void PrintStatus(const std::string& text) override;
  HostAnswer ScalarGetOidVal(const HostValueQuery& query) override;
  HostAnswer ScalarGetNextOidVal(const HostValueQuery& query) override;
  HostAnswer SetOidVal(const HostValueQuery& query) override;
  HostAnswer TableGetOidVal(const HostValueQuery& query) override;
  HostAnswer TableGetNextOidVal(const HostValueQuery& query) override;
  HostAnswer TableSetOidVal(const HostValueQuery& query) override;

 private:
  std::shared_ptr<const SimulatorBinding> Simulator() const;
  std::shared_ptr<const HandlerBinding> Handler() const;
  // Calls value method number method with the arguments fill adds.
  template <typename Fill>
  HostAnswer CallValueMethod(int method, Fill fill);
  HostAnswer AnswerFromJava(JNIEnv* env, jobjectArray answer);

  mutable std::mutex mutex_;  // guards the two bindings; calls work on their own copies
  std::shared_ptr<const SimulatorBinding> simulator_;
  std::shared_ptr<const HandlerBinding> handler_;
};

// C++ bytes to a Java String (local reference), decoded as UTF-8; bytes that are not plain
// ASCII never reach NewStringUTF. nullptr (exception cleared) on failure.
jstring StringToJava(JNIEnv* env, const std::string& text);
// Copies at most 65535 elements (the engine's array counts are 16-bit); a null element becomes
// the empty text. Nothing for a null array or a failed conversion.
std::optional<std::vector<std::string>> StringsFromJava(JNIEnv* env, jobjectArray array);
std::optional<std::vector<std::int32_t>> IntsFromJava(JNIEnv* env, jintArray array);
// nullptr on failure.
jintArray IntsToJava(JNIEnv* env, std::span<const std::int32_t> values);
// A String[size] holding texts in order and null after them; nullptr on failure.
jobjectArray StringsToJava(JNIEnv* env, const std::vector<std::string>& texts, std::size_t size);

}  // namespace tessel
