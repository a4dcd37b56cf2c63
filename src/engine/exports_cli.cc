// The CLI exports: thin functions that convert their arguments, call the CLI service and convert
// its result.
#include <jni.h>

#include "cli/cli_service.h"
#include "engine/engine.h"
#include "engine/exports_marshal.h"
#include "engine/jni_host.h"
#include "engine/log.h"

namespace tessel {
namespace {

std::string Text(JNIEnv* env, jstring text) {
  return JniHost::Instance().ToCpp(env, text).value_or("");
}

// Ports are 16-bit: the low bits count.
std::uint16_t Port(jint port) { return static_cast<std::uint16_t>(port); }

}  // namespace
}  // namespace tessel

using namespace tessel;

extern "C" {

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_cli_CliHandler_jniJVMParams(JNIEnv* env, jobject self) {
  return Guarded<jboolean>(JNI_FALSE, [&] {
    JniHost& host = JniHost::Instance();
    if (!host.BindCliHandler(env, self)) {
      LOG_ERROR("unable to bind the CLI handler\n");
      return JNI_FALSE;
    }
    InstallHost(&host);
    return JNI_TRUE;
  });
}

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_cli_CliHandler_initCliThread(JNIEnv*, jobject) {
  return Guarded<jboolean>(JNI_FALSE, [] {
    TheCliService().Start();
    return JNI_TRUE;
  });
}

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_cli_CliHandler_initCliVectorThread(JNIEnv*, jobject) {
  return JNI_TRUE;  // the agent lists need no thread of their own
}

JNIEXPORT jint JNICALL Java_com_kestrelon_simulator_tessel_cli_CliHandler_nativePassCliAgentInfo(
    JNIEnv* env, jobject, jstring userName, jstring password, jstring enablePassword,
    jstring ipAddress, jint port, jstring hostText1, jstring hostText2, jstring hostText3,
    jstring hostText4, jstring deviceName, jint hostNumber, jint hostInt) {
  return Guarded<jint>(0, [&]() -> jint {
    CliAgent agent;
    agent.ipAddress = Text(env, ipAddress);
    agent.port = Port(port);
    if (agent.ipAddress.empty() || agent.port == 0) return 0;
    agent.userName = Text(env, userName);
    agent.password = Text(env, password);
    agent.enablePassword = Text(env, enablePassword);
    agent.enableByTelnet = !agent.enablePassword.empty();
    agent.hostText1 = Text(env, hostText1);
    agent.hostText2 = Text(env, hostText2);
    agent.hostText3 = Text(env, hostText3);
    agent.hostText4 = Text(env, hostText4);
    agent.deviceName = Text(env, deviceName);
    agent.hostNumber = hostNumber;
    agent.hostInt = hostInt;
    TheCliService().RegisterAgent(std::move(agent));
    return 1;
  });
}

JNIEXPORT jintArray JNICALL Java_com_kestrelon_simulator_tessel_cli_CliHandler_startCliNetwork(
    JNIEnv* env, jobject, jobjectArray ipAddresses, jintArray ports, jint telnetServerFlag,
    jint hostInt1, jint hostInt2) {
  return Guarded<jintArray>(nullptr, [&] {
    std::vector<std::string> addresses =
        StringsFromJava(env, ipAddresses).value_or(std::vector<std::string>{});
    std::vector<std::int32_t> portList =
        IntsFromJava(env, ports).value_or(std::vector<std::int32_t>{});
    std::vector<std::int32_t> started(addresses.size(), 0);
    for (std::size_t i = 0; i < addresses.size() && i < portList.size(); ++i) {
      started[i] = TheCliService().StartAgent(addresses[i], Port(portList[i]),
                                              telnetServerFlag == 1, hostInt1, hostInt2)
                       ? 1
                       : 0;
    }
    return IntsToJava(env, started);
  });
}

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_cli_CliHandler_startCliAgent(
    JNIEnv* env, jobject, jstring ipAddress, jint port, jint telnetServerFlag, jint hostInt1,
    jint hostInt2) {
  return Guarded<jboolean>(JNI_FALSE, [&] {
    return ToJboolean(TheCliService().StartAgent(Text(env, ipAddress), Port(port),
                                                 telnetServerFlag == 1, hostInt1, hostInt2));
  });
}

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_cli_CliHandler_stopCLIAgent(
    JNIEnv* env, jobject, jstring ipAddress, jint port, jint telnetServerFlag) {
  return Guarded<jboolean>(JNI_FALSE, [&] {
    return ToJboolean(
        TheCliService().StopAgent(Text(env, ipAddress), Port(port), telnetServerFlag == 1));
  });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_cli_CliHandler_setCliLoginPrompt(
    JNIEnv* env, jobject, jstring prompt) {
  GuardedVoid([&] { TheCliService().Prompts().SetLoginPrompt(Text(env, prompt)); });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_cli_CliHandler_setCliPasswordPrompt(
    JNIEnv* env, jobject, jstring prompt) {
  GuardedVoid([&] { TheCliService().Prompts().SetPasswordPrompt(Text(env, prompt)); });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_cli_CliHandler_setCliPromptString(
    JNIEnv* env, jobject, jstring prompt) {
  GuardedVoid([&] { TheCliService().Prompts().SetPromptString(Text(env, prompt)); });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_cli_CliHandler_changeCliPromptString(
    JNIEnv* env, jobject, jstring prompt) {
  GuardedVoid([&] { TheCliService().Prompts().SetOverride(Text(env, prompt)); });
}

JNIEXPORT void JNICALL
Java_com_kestrelon_simulator_tessel_cli_CliHandler_setUserAddedModesAndNames(JNIEnv*, jobject) {
  GuardedVoid([] { TheCliService().ReadUserModes(); });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_cli_CliHandler_setSSHStatus(
    JNIEnv*, jobject, jboolean enabled) {
  TheCliService().SetSshEnabled(enabled == JNI_TRUE);
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_cli_CliHandler_setSSHKeyPath(
    JNIEnv* env, jobject, jstring directory) {
  GuardedVoid([&] { TheCliService().SetSshKeyDirectory(Text(env, directory)); });
}

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_cli_CliHandler_startSshListener(
    JNIEnv* env, jobject, jstring ipAddress, jint sshPort, jint cliPort) {
  return Guarded<jboolean>(JNI_FALSE, [&] {
    return ToJboolean(
        TheCliService().StartSshListener(Text(env, ipAddress), Port(sshPort), Port(cliPort)));
  });
}

JNIEXPORT jlongArray JNICALL
Java_com_kestrelon_simulator_tessel_cli_CliHandler_cliCounters(JNIEnv* env, jobject) {
  CliCounters counters = TheCliService().Counters();
  jlong values[3] = {static_cast<jlong>(counters.sessionsOpen),
                     static_cast<jlong>(counters.loginsSucceeded),
                     static_cast<jlong>(counters.commandsAnswered)};
  jlongArray array = env->NewLongArray(3);
  if (array == nullptr) {
    env->ExceptionClear();
    return nullptr;
  }
  env->SetLongArrayRegion(array, 0, 3, values);
  return array;
}

}  // extern "C"
