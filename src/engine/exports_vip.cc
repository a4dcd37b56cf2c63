// The device-address exports: thin functions that convert their arguments, call the address
// manager and convert its statuses. The Windows-named entries work the same way on Linux, on the
// selected adapter (or the interface list).
#include <jni.h>

#include <algorithm>
#include <string>
#include <vector>

#include "engine/engine_state.h"
#include "engine/exports_marshal.h"
#include "engine/jni_host.h"
#include "engine/log.h"
#include "vip/virtual_ips.h"

namespace tessel {
namespace {

std::string Text(JNIEnv* env, jstring text) {
  return JniHost::Instance().ToCpp(env, text).value_or("");
}

std::vector<std::string> Strings(JNIEnv* env, jobjectArray array) {
  return StringsFromJava(env, array).value_or(std::vector<std::string>{});
}

std::vector<std::int32_t> Ints(JNIEnv* env, jintArray array) {
  return IntsFromJava(env, array).value_or(std::vector<std::int32_t>{});
}

// Addresses with the mask as their prefix length; kVipInvalidParameter where it is no mask.
std::vector<std::int32_t> AddWithMask(std::vector<std::string> addresses,
                                      const std::vector<std::int32_t>& isIPv6,
                                      const std::string& mask) {
  std::vector<std::int32_t> statuses(addresses.size(), kVipAdded);
  std::vector<std::string> valid;
  std::vector<std::int32_t> validFlags;
  std::vector<std::size_t> positions;
  for (std::size_t i = 0; i < addresses.size(); ++i) {
    const bool v6 =
        i < isIPv6.size() ? isIPv6[i] == 1 : addresses[i].find(':') != std::string::npos;
    std::optional<std::uint8_t> prefix = PrefixOfMask(mask, v6);
    if (!prefix || addresses[i].find('/') != std::string::npos) {
      statuses[i] = kVipInvalidParameter;
      continue;
    }
    valid.push_back(addresses[i] + "/" + std::to_string(*prefix));
    validFlags.push_back(v6 ? 1 : 0);
    positions.push_back(i);
  }
  const std::vector<std::int32_t> results = TheVirtualIps().Add(valid, validFlags, "");
  for (std::size_t k = 0; k < positions.size(); ++k) statuses[positions[k]] = results[k];
  return statuses;
}

void LogFailures(const char* what, const std::vector<std::string>& addresses,
                 const std::vector<std::int32_t>& statuses, std::int32_t success) {
  for (std::size_t i = 0; i < statuses.size() && i < addresses.size(); ++i) {
    if (statuses[i] != success) {
      LOG_ERROR("\tError in %s virtual ip %s: status %d\n", what, addresses[i].c_str(),
                statuses[i]);
    }
  }
}

}  // namespace
}  // namespace tessel

using namespace tessel;

extern "C" {

JNIEXPORT jint JNICALL Java_com_kestrelon_simulator_tessel_utils_VIPUtils_addVirtualIP(
    JNIEnv* env, jobject, jstring address, jint isIPv6, jstring subnetMask) {
  return Guarded<jint>(kVipFailed, [&] {
    std::vector<std::string> addresses{Text(env, address)};
    std::vector<std::int32_t> statuses = AddWithMask(addresses, {isIPv6}, Text(env, subnetMask));
    LogFailures("adding", addresses, statuses, kVipAdded);
    return statuses[0];
  });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_utils_VIPUtils_deleteVirtualIP(
    JNIEnv* env, jobject, jstring address, jint isIPv6) {
  GuardedVoid([&] {
    std::vector<std::string> addresses{Text(env, address)};
    std::vector<std::int32_t> flags{isIPv6};
    LogFailures("deleting", addresses, TheVirtualIps().Remove(addresses, flags), kVipRemoved);
  });
}

JNIEXPORT jint JNICALL
Java_com_kestrelon_simulator_tessel_utils_VIPUtils_deleteAllVirtualIPs(JNIEnv*, jobject) {
  GuardedVoid([] { TheVirtualIps().RemoveAll(); });
  return 1;
}

JNIEXPORT jintArray JNICALL
Java_com_kestrelon_simulator_tessel_utils_VIPUtils_addVirtualIpsForWindows(JNIEnv* env, jobject,
                                                                           jobjectArray addresses,
                                                                           jintArray isIPv6,
                                                                           jstring subnetMask) {
  return Guarded<jintArray>(nullptr, [&] {
    std::vector<std::string> texts = Strings(env, addresses);
    std::vector<std::int32_t> statuses =
        AddWithMask(texts, Ints(env, isIPv6), Text(env, subnetMask));
    LogFailures("adding", texts, statuses, kVipAdded);
    return IntsToJava(env, statuses);
  });
}

JNIEXPORT jintArray JNICALL
Java_com_kestrelon_simulator_tessel_utils_VIPUtils_deleteVirtualIpsForWindows(
    JNIEnv* env, jobject, jobjectArray addresses, jintArray isIPv6) {
  return Guarded<jintArray>(nullptr, [&] {
    std::vector<std::string> texts = Strings(env, addresses);
    std::vector<std::int32_t> statuses = TheVirtualIps().Remove(texts, Ints(env, isIPv6));
    LogFailures("deleting", texts, statuses, kVipRemoved);
    return IntsToJava(env, statuses);
  });
}

// Each added address reports the address base (at least 100), any other the status of its
// failure (kVipAlreadyExists, kVipNoSuchInterface, ...): all of them are below 100.
JNIEXPORT jintArray JNICALL
Java_com_kestrelon_simulator_tessel_utils_VIPUtils_addVirtualIpsForLinuxSolaris(
    JNIEnv* env, jobject, jobjectArray addresses, jstring interfaceName, jintArray isIPv6, jstring,
    jint) {
  return Guarded<jintArray>(nullptr, [&] {
    std::vector<std::string> texts = Strings(env, addresses);
    std::int32_t base = std::max(gv_virtualIpBase.load(), 100);
    gv_virtualIpBase = base;
    std::vector<std::int32_t> statuses =
        TheVirtualIps().Add(texts, Ints(env, isIPv6), Text(env, interfaceName));
    LogFailures("adding", texts, statuses, kVipAdded);
    for (std::int32_t& status : statuses) {
      if (status == kVipAdded) status = base;
    }
    return IntsToJava(env, statuses);
  });
}

// One status per element of countOnly: 1 when removed, gone, or not the engine's to remove.
JNIEXPORT jintArray JNICALL
Java_com_kestrelon_simulator_tessel_utils_VIPUtils_deleteVirtualIpsForLinuxSolaris(
    JNIEnv* env, jobject, jobjectArray countOnly, jstring, jobjectArray addresses, jintArray isIPv6,
    jstring, jint) {
  return Guarded<jintArray>(nullptr, [&] {
    const std::size_t count = Strings(env, countOnly).size();
    std::vector<std::string> texts = Strings(env, addresses);
    texts.resize(std::min(texts.size(), count));
    std::vector<std::int32_t> statuses = TheVirtualIps().Remove(texts, Ints(env, isIPv6));
    LogFailures("deleting", texts, statuses, kVipRemoved);
    statuses.resize(count, kVipRemoved);
    gv_virtualIpBase -= static_cast<std::int32_t>(count);
    return IntsToJava(env, statuses);
  });
}

JNIEXPORT jint JNICALL Java_com_kestrelon_simulator_tessel_utils_VIPUtils_SetInterfaceVector(
    JNIEnv* env, jobject, jobjectArray interfaceNames) {
  return Guarded<jint>(0, [&] {
    return static_cast<jint>(TheVirtualIps().SetInterfaces(Strings(env, interfaceNames)));
  });
}

}  // extern "C"
