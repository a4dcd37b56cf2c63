// The host-facing send of one notification with its outcome: unlike the void notification
// exports, it tells the host why a notification was not sent and which inform ID an inform got,
// so that the control interface can answer its client. Thin, like every export.
#include <jni.h>

#include <array>
#include <new>

#include "engine/exports_marshal.h"
#include "engine/jni_host.h"
#include "engine/log.h"
#include "notify/notifier.h"

namespace tessel {
namespace {

// The outcome when the request could not even be read (no memory, a failed conversion).
constexpr std::int32_t kNotRead = -1;

// The host numbers the outcomes as they are declared; a new one goes at the end.
static_assert(static_cast<int>(NotifyResult::kSent) == 0 &&
              static_cast<int>(NotifyResult::kUnresolved) == 3 &&
              static_cast<int>(NotifyResult::kRefused) == 6 &&
              static_cast<int>(NotifyResult::kNotSent) == 7);

std::string Text(JNIEnv* env, jstring text) {
  return JniHost::Instance().ToCpp(env, text).value_or("");
}

// Seconds and counts from the host are never negative here.
std::uint32_t NonNegative(jint value) { return value < 0 ? 0U : static_cast<std::uint32_t>(value); }

}  // namespace
}  // namespace tessel

using namespace tessel;

extern "C" {

// {result, informId}: result is the NotifyResult in its declaration order (0 is sent), or -1
// when the request could not be read; informId is the inform's ID, 0 for a trap.
JNIEXPORT jintArray JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SnmpTrapService_sendNotification(
    JNIEnv* env, jobject, jint pduType, jint version, jstring host, jint port, jstring community,
    jstring userName, jstring contextName, jstring enterprise, jint generic, jint specific,
    jstring trapOid, jobjectArray oids, jintArray types, jobjectArray values, jint agentId,
    jstring agentText, jint timeout, jint retries) {
  std::array<std::int32_t, 2> outcome{kNotRead, 0};
  try {
    NotificationRequest request;
    request.pduType = static_cast<std::uint8_t>(pduType);
    request.version = version;
    request.managerHost = Text(env, host);
    request.managerPort = port;
    request.community = Text(env, community);
    request.userName = Text(env, userName);
    request.contextName = Text(env, contextName);
    request.enterprise = Text(env, enterprise);
    request.genericTrap = generic;
    request.specificTrap = specific;
    request.trapOid = Text(env, trapOid);
    request.bindings = {StringsFromJava(env, oids), IntsFromJava(env, types),
                        StringsFromJava(env, values)};
    request.agentId = agentId;
    request.agentText = Text(env, agentText);
    request.timeout = NonNegative(timeout);
    request.retries = NonNegative(retries);
    NotifyOutcome sent = SendNotification(request);
    outcome = {static_cast<std::int32_t>(sent.result), static_cast<std::int32_t>(sent.informId)};
  } catch (const std::bad_alloc&) {
    LOG_ERROR("unable to alloc memory \n");
  } catch (...) {
    LOG_ERROR("unexpected failure in a host call\n");
  }
  return IntsToJava(env, outcome);
}

}  // extern "C"
