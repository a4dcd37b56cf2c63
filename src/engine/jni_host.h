// The JNI implementation of the host bridge, and the conversion of texts between Java and C++.
// Everything here is safe from any thread: a thread that is not yet attached to the JVM attaches
// once, as a daemon, and detaches when it ends. Host objects are held by global references that
// live as long as their binding; every call runs in its own local frame and clears any exception
// the host raised (the call then answers nothing).
#pragma once

#include <jni.h>

#include <algorithm>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "engine/host_bridge.h"

namespace tessel {

// The calling thread's environment in vm; nullptr when it cannot attach.
JNIEnv* AttachedEnv(JavaVM* vm);

struct SimulatorBinding;
struct HandlerBinding;
struct Tl1HandlerBinding;
struct CliHandlerBinding;
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
  // Binds the TL1 handler object (acknowledgments and responses). False when one of its methods
  // is missing.
  bool BindTl1Handler(JNIEnv* env, jobject handler);
  // Binds the CLI handler object (line answers, help, completion); its context-taking line
  // method is used when it has one. False when one of its required methods is missing.
  bool BindCliHandler(JNIEnv* env, jobject handler);

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
  void LogResponseMessage(const InformReport& report) override;
  void StoreDroppedInformMessage(const InformReport& report) override;
  std::optional<ScrambleChanges> ScramblePDU(const ScrambleQuery& query) override;
  std::int32_t Tl1GetAck(const Tl1HostQuery& query) override;
  HostAnswer Tl1GetResponseBlock(const Tl1HostQuery& query) override;
  HostAnswer CliEnterResponse(const CliHostQuery& query) override;
  std::optional<std::string> CliQuestionResponse(const CliHostQuery& query) override;
  std::optional<std::string> CliTabResponse(const CliHostQuery& query) override;

 private:
  // Calls the handler's inform method (kLogResponse or kStoreDropped) with what fill adds.
  template <typename Fill>
  void CallInformMethod(int method, Fill fill);
  std::shared_ptr<const SimulatorBinding> Simulator() const;
  std::shared_ptr<const HandlerBinding> Handler() const;
  std::shared_ptr<const Tl1HandlerBinding> Tl1Handler() const;
  std::shared_ptr<const CliHandlerBinding> CliHandler() const;
  // The help (tab false) or completion text of the CLI handler.
  std::optional<std::string> CallCliText(bool tab, const CliHostQuery& query);
  // Calls value method number method with the arguments fill adds.
  template <typename Fill>
  HostAnswer CallValueMethod(int method, Fill fill);
  HostAnswer AnswerFromJava(JNIEnv* env, jobjectArray answer);
  // The fields a scrambler's Hashtable replaces; nothing when it cannot be read whole.
  std::optional<ScrambleChanges> ChangesFromJava(JNIEnv* env, jobject table);

  mutable std::mutex mutex_;  // guards the bindings; calls work on their own copies
  std::shared_ptr<const SimulatorBinding> simulator_;
  std::shared_ptr<const HandlerBinding> handler_;
  std::shared_ptr<const Tl1HandlerBinding> tl1Handler_;
  std::shared_ptr<const CliHandlerBinding> cliHandler_;
};

// C++ bytes to a Java String (local reference), decoded as UTF-8; bytes that are not plain
// ASCII never reach NewStringUTF. nullptr (exception cleared) on failure.
jstring StringToJava(JNIEnv* env, const std::string& text);
// java.lang.String's class, held for the life of the process; nullptr when it cannot be had.
jclass JavaStringClass(JNIEnv* env);
// A String[size] holding texts in order and null after them; nullptr on failure.
jobjectArray StringsToJava(JNIEnv* env, const std::vector<std::string>& texts, std::size_t size);
// A String[] of texts in order, null where a text is missing; nullptr on failure.
jobjectArray OptionalStringsToJava(JNIEnv* env,
                                   const std::vector<std::optional<std::string>>& texts);

// The engine's array counts are 16-bit: longer host arrays are read up to this many elements.
inline constexpr jsize kMaxJavaArrayElements = 65535;

// Runs body (returning false to stop) with each element of array as a local reference that is
// dropped afterwards; false when body stopped.
template <typename Body>
bool ForEachElement(JNIEnv* env, jobjectArray array, Body body) {
  jsize count = std::min(env->GetArrayLength(array), kMaxJavaArrayElements);
  for (jsize i = 0; i < count; ++i) {
    jobject element = env->GetObjectArrayElement(array, i);
    bool ok = body(element);
    if (element != nullptr) env->DeleteLocalRef(element);
    if (!ok) return false;
  }
  return true;
}

}  // namespace tessel
