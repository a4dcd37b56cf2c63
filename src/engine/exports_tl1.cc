// The TL1 exports: thin functions that convert their arguments, call the TL1 service and convert
// its result.
#include <jni.h>

#include <algorithm>
#include <cstdlib>
#include <new>

#include "engine/engine.h"
#include "engine/exports_marshal.h"
#include "engine/jni_host.h"
#include "engine/log.h"
#include "tl1/tl1_service.h"

namespace tessel {
namespace {

std::optional<std::string> OptionalText(JNIEnv* env, jstring text) {
  return JniHost::Instance().ToCpp(env, text);
}

std::string Text(JNIEnv* env, jstring text) { return OptionalText(env, text).value_or(""); }

// A modifier that is null or empty is absent.
std::optional<std::string> Modifier(JNIEnv* env, jstring text) {
  std::optional<std::string> modifier = OptionalText(env, text);
  if (modifier && modifier->empty()) return std::nullopt;
  return modifier;
}

// Ports are 16-bit: the low bits count.
std::uint16_t Port(jint port) { return static_cast<std::uint16_t>(port); }

// A port given as text; 0 when it is not a number.
std::uint16_t Port(JNIEnv* env, jstring port) {
  std::string text = Text(env, port);
  char* end = nullptr;
  long value = std::strtol(text.c_str(), &end, 10);
  if (text.empty() || *end != '\0' || value < 0 || value > 65535) return 0;
  return static_cast<std::uint16_t>(value);
}

// Line types 0 quoted, 1 plain, 2 comment; any other is quoted.
std::uint8_t LineType(std::int32_t type) {
  if (type == 1) return kTl1PlainLine;
  if (type == 2) return kTl1CommentLine;
  return kTl1QuotedLine;
}

std::vector<Tl1TextElement> Lines(JNIEnv* env, jobjectArray lines, jintArray types) {
  std::vector<std::string> texts = StringsFromJava(env, lines).value_or(std::vector<std::string>{});
  std::vector<std::int32_t> kinds = IntsFromJava(env, types).value_or(std::vector<std::int32_t>{});
  std::vector<Tl1TextElement> elements;
  for (std::size_t i = 0; i < texts.size(); ++i) {
    elements.push_back({LineType(i < kinds.size() ? kinds[i] : 0), std::move(texts[i])});
  }
  return elements;
}

jstring JavaOptionalText(JNIEnv* env, const std::optional<std::string>& text) {
  return text ? StringToJava(env, *text) : nullptr;
}

std::string DateOrTime(const std::optional<Tl1DateOrTime>& value) {
  if (!value) return {};
  return std::to_string((*value)[0]) + "-" + std::to_string((*value)[1]) + "-" +
         std::to_string((*value)[2]);
}

// id, session, on, date or "", time or "", the command as received; joined by TAB.
std::string PendingText(const Tl1PendingEntry& entry) {
  const Tl1GeneralBlock block = entry.command.generalBlock.value_or(Tl1GeneralBlock{});
  return std::to_string(entry.id) + "\t" + std::to_string(entry.sessionId) + "\t" +
         std::to_string(block.on) + "\t" + DateOrTime(block.date) + "\t" + DateOrTime(block.time) +
         "\t" + entry.commandText;
}

// The element at index of a Java object array as a local reference (nullptr when missing).
jobject Element(JNIEnv* env, jobjectArray array, jsize index) {
  if (array == nullptr || index >= env->GetArrayLength(array)) return nullptr;
  return env->GetObjectArrayElement(array, index);
}

}  // namespace
}  // namespace tessel

using namespace tessel;

extern "C" {

JNIEXPORT jintArray JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_startTL1Network(
    JNIEnv* env, jobject, jintArray agentIds, jobjectArray agentTexts, jobjectArray ipAddresses,
    jintArray ports, jstring networkText, jobjectArray sids, jintArray agentNumbers) {
  return Guarded<jintArray>(nullptr, [&]() -> jintArray {
    std::vector<std::int32_t> ids =
        IntsFromJava(env, agentIds).value_or(std::vector<std::int32_t>{});
    std::vector<std::int32_t> portList =
        IntsFromJava(env, ports).value_or(std::vector<std::int32_t>{});
    std::vector<std::int32_t> numbers =
        IntsFromJava(env, agentNumbers).value_or(std::vector<std::int32_t>{});
    std::vector<std::string> texts =
        StringsFromJava(env, agentTexts).value_or(std::vector<std::string>{});
    std::vector<std::string> addresses =
        StringsFromJava(env, ipAddresses).value_or(std::vector<std::string>{});
    std::vector<std::string> sidList =
        StringsFromJava(env, sids).value_or(std::vector<std::string>{});
    std::string network = Text(env, networkText);
    std::vector<std::int32_t> started(ids.size(), 0);
    for (std::size_t i = 0; i < ids.size(); ++i) {
      if (i >= portList.size() || i >= addresses.size() || i >= sidList.size()) break;
      Tl1Agent agent{ids[i],
                     sidList[i],
                     addresses[i],
                     Port(portList[i]),
                     network,
                     i < texts.size() ? texts[i] : "",
                     ""};
      try {
        TheTl1Service().RegisterAgent(agent, i < numbers.size() ? numbers[i] : 0);
        started[i] = TheTl1Service().StartAgent(agent.ipAddress, agent.port) ? 1 : 0;
      } catch (const std::bad_alloc&) {
        started[i] = -1;
      }
    }
    return IntsToJava(env, started);
  });
}

JNIEXPORT jint JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_nativePassOneAgentInfo(
    JNIEnv* env, jobject, jstring networkText, jstring agentText, jstring modeText,
    jstring ipAddress, jint port, jstring sid, jint agentId, jint agentNumber) {
  return Guarded<jint>(agentId, [&] {
    Tl1Agent agent{agentId, Text(env, sid),     Text(env, ipAddress), Port(port), "",
                   "",      Text(env, modeText)};
    if (networkText != nullptr) {
      agent.hostText1 = Text(env, networkText);
      agent.hostText2 = Text(env, agentText);
    }
    TheTl1Service().RegisterAgent(agent, agentNumber);
    return agentId;
  });
}

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_registerTL1Commands(
    JNIEnv* env, jobject, jstring commandCode) {
  return Guarded<jboolean>(JNI_FALSE, [&] {
    return ToJboolean(TheTl1Service().Registry().RegisterCmd(Text(env, commandCode)));
  });
}

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_startAgent(
    JNIEnv* env, jobject, jstring ipAddress, jint port, jint) {
  return Guarded<jboolean>(JNI_FALSE, [&] {
    return ToJboolean(TheTl1Service().StartAgent(Text(env, ipAddress), Port(port)));
  });
}

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_stopAgent(
    JNIEnv* env, jobject, jstring ipAddress, jint port) {
  return Guarded<jboolean>(JNI_FALSE, [&] {
    return ToJboolean(TheTl1Service().StopAgent(Text(env, ipAddress), Port(port)));
  });
}

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_tl1_TL1Register_nativeBaseLoop(JNIEnv*, jobject) {
  BaseLoop();
  return JNI_TRUE;
}

JNIEXPORT jstring JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_GetTL1ModeInfo(
    JNIEnv* env, jobject, jstring ipAddress, jstring port) {
  return Guarded<jstring>(nullptr, [&] {
    return JavaOptionalText(env, TheTl1Service().ModeInfo(Text(env, ipAddress), Port(env, port)));
  });
}

JNIEXPORT jint JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_GetTL1ServerSessionID(
    JNIEnv* env, jobject, jstring ipAddress, jstring port) {
  return Guarded<jint>(-1, [&] {
    return TheTl1Service().AgentIdAt(Text(env, ipAddress), Port(env, port)).value_or(-1);
  });
}

JNIEXPORT jint JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_KeepAliveTimeForTL1Agent(
    JNIEnv*, jobject, jint seconds) {
  std::uint32_t kept =
      TheTl1Service().SetKeepAlive(seconds < 0 ? 0U : static_cast<std::uint32_t>(seconds));
  return static_cast<jint>(kept);
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_setLoginRequired(
    JNIEnv*, jobject, jint agentId, jboolean required) {
  GuardedVoid([&] { TheTl1Service().SetLoginRequired(agentId, required == JNI_TRUE); });
}

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_startTelnetListener(
    JNIEnv* env, jobject, jstring ipAddress, jint port, jint agentId) {
  return Guarded<jboolean>(JNI_FALSE, [&] {
    return ToJboolean(
        TheTl1Service().StartTelnetListener(Text(env, ipAddress), Port(port), agentId));
  });
}

JNIEXPORT jobjectArray JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_listPending(
    JNIEnv* env, jobject, jint agentId) {
  return Guarded<jobjectArray>(nullptr, [&] {
    std::vector<std::string> texts;
    for (const Tl1PendingEntry& entry : TheTl1Service().ListPending(agentId))
      texts.push_back(PendingText(entry));
    return StringsToJava(env, texts, texts.size());
  });
}

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_runPending(
    JNIEnv*, jobject, jint agentId, jint id) {
  return Guarded<jboolean>(JNI_FALSE, [&] {
    return ToJboolean(id > 0 &&
                      TheTl1Service().RunPending(agentId, static_cast<std::uint32_t>(id)));
  });
}

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Register_cancelPending(
    JNIEnv*, jobject, jint agentId, jint id) {
  return Guarded<jboolean>(JNI_FALSE, [&] {
    return ToJboolean(id > 0 &&
                      TheTl1Service().CancelPending(agentId, static_cast<std::uint32_t>(id)));
  });
}

JNIEXPORT jlongArray JNICALL
Java_com_kestrelon_simulator_tessel_tl1_TL1Register_tl1Counters(JNIEnv* env, jobject) {
  Tl1Counters counters = TheTl1Service().Counters();
  jlong values[2] = {static_cast<jlong>(counters.sessionsOpen),
                     static_cast<jlong>(counters.commandsAnswered)};
  jlongArray array = env->NewLongArray(2);
  if (array == nullptr) {
    env->ExceptionClear();
    return nullptr;
  }
  env->SetLongArrayRegion(array, 0, 2, values);
  return array;
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1AlarmImpl_SendAutonomousMessage(
    JNIEnv* env, jobject, jstring verb, jstring modifier1, jstring modifier2, jbyte alarmCode,
    jobjectArray lines, jintArray lineTypes, jint agentId) {
  GuardedVoid([&] {
    Tl1AutonomousMessage message{static_cast<std::uint8_t>(alarmCode), Text(env, verb),
                                 Modifier(env, modifier1), Modifier(env, modifier2),
                                 Lines(env, lines, lineTypes)};
    TheTl1Service().SendAutonomous(agentId, {message});
  });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1AlarmImpl_SetAtagValue(
    JNIEnv*, jobject, jint atag, jint agentId) {
  GuardedVoid([&] { TheTl1Service().SetAtag(agentId, static_cast<std::uint32_t>(atag)); });
}

JNIEXPORT jint JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1AlarmImpl_sendAutonomousBatch(
    JNIEnv* env, jobject, jobjectArray verbs, jobjectArray modifiers1, jobjectArray modifiers2,
    jbyteArray alarmCodes, jobjectArray lines, jobjectArray lineTypes, jint agentId) {
  return Guarded<jint>(0, [&]() -> jint {
    if (verbs == nullptr || alarmCodes == nullptr) return 0;
    jsize count = std::min(env->GetArrayLength(verbs), env->GetArrayLength(alarmCodes));
    std::vector<jbyte> codes(static_cast<std::size_t>(count));
    env->GetByteArrayRegion(alarmCodes, 0, count, codes.data());
    std::vector<Tl1AutonomousMessage> batch;
    for (jsize i = 0; i < count; ++i) {
      auto verb = static_cast<jstring>(Element(env, verbs, i));
      auto modifier1 = static_cast<jstring>(Element(env, modifiers1, i));
      auto modifier2 = static_cast<jstring>(Element(env, modifiers2, i));
      auto texts = static_cast<jobjectArray>(Element(env, lines, i));
      auto types = static_cast<jintArray>(Element(env, lineTypes, i));
      batch.push_back({static_cast<std::uint8_t>(codes[static_cast<std::size_t>(i)]),
                       Text(env, verb), Modifier(env, modifier1), Modifier(env, modifier2),
                       Lines(env, texts, types)});
      for (jobject local : {static_cast<jobject>(verb), static_cast<jobject>(modifier1),
                            static_cast<jobject>(modifier2), static_cast<jobject>(texts),
                            static_cast<jobject>(types)}) {
        if (local != nullptr) env->DeleteLocalRef(local);
      }
    }
    return static_cast<jint>(TheTl1Service().SendAutonomous(agentId, batch));
  });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_tl1_TL1Handler_nativeCacheThisObject(
    JNIEnv* env, jobject self, jobject handler) {
  GuardedVoid([&] {
    JniHost& host = JniHost::Instance();
    if (!host.BindTl1Handler(env, handler != nullptr ? handler : self)) {
      LOG_ERROR("unable to bind the TL1 handler\n");
      jclass error = env->FindClass("java/lang/IllegalStateException");
      if (error != nullptr) env->ThrowNew(error, "TL1 handler lacks getAck or getResponseBlock");
      return;
    }
    InstallHost(&host);
  });
}

}  // extern "C"
