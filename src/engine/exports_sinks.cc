// The host gives the engine the trap sinks of its devices, a range of agent IDs at a time, before
// it starts them: the standard traps those devices raise go to these sinks. Thin, like every
// export.
#include <jni.h>

#include <new>

#include "engine/exports_marshal.h"
#include "engine/jni_host.h"
#include "engine/log.h"
#include "notify/standard_traps.h"

namespace tessel {
namespace {

// The result when the host's arrays could not be read or do not cover every sink.
constexpr jint kNotRead = -2;

std::uint32_t NonNegative(std::int32_t value) {
  return value < 0 ? 0U : static_cast<std::uint32_t>(value);
}

struct SinkArrays {
  std::optional<std::vector<std::int32_t>> versions, ports, informs, timeouts, retries;
  std::optional<std::vector<std::string>> hosts, communities, users, contexts;

  std::optional<std::vector<TrapSinkConfig>> Sinks() const {
    if (!versions || !ports || !informs || !timeouts || !retries || !hosts || !communities ||
        !users || !contexts)
      return std::nullopt;
    std::size_t n = versions->size();
    if (ports->size() != n || informs->size() != n || timeouts->size() != n ||
        retries->size() != n || hosts->size() != n || communities->size() != n ||
        users->size() != n || contexts->size() != n)
      return std::nullopt;
    std::vector<TrapSinkConfig> sinks(n);
    for (std::size_t i = 0; i < n; ++i) {
      sinks[i].version = (*versions)[i];
      sinks[i].host = (*hosts)[i];
      sinks[i].port = static_cast<std::uint16_t>((*ports)[i]);
      sinks[i].community = (*communities)[i];
      sinks[i].userName = (*users)[i];
      sinks[i].contextName = (*contexts)[i];
      sinks[i].inform = (*informs)[i] != 0;
      sinks[i].timeout = NonNegative((*timeouts)[i]);
      sinks[i].retries = NonNegative((*retries)[i]);
    }
    return sinks;
  }
};

}  // namespace
}  // namespace tessel

using namespace tessel;

extern "C" {

// -1 when the sinks are set; the index of the first sink whose host does not resolve; -2 when
// the arrays could not be read or differ in length. Versions are 0 (SNMPv1), 1 (SNMPv2c) and
// 3 (SNMPv3); informs holds 1 for an inform sink.
JNIEXPORT jint JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpTrapService_setTrapSinks(
    JNIEnv* env, jobject, jint firstAgentId, jint count, jintArray versions, jobjectArray hosts,
    jintArray ports, jobjectArray communities, jobjectArray users, jobjectArray contexts,
    jintArray informs, jintArray timeouts, jintArray retries) {
  try {
    SinkArrays arrays{IntsFromJava(env, versions),       IntsFromJava(env, ports),
                      IntsFromJava(env, informs),        IntsFromJava(env, timeouts),
                      IntsFromJava(env, retries),        StringsFromJava(env, hosts),
                      StringsFromJava(env, communities), StringsFromJava(env, users),
                      StringsFromJava(env, contexts)};
    std::optional<std::vector<TrapSinkConfig>> sinks = arrays.Sinks();
    if (!sinks) {
      LOG_ERROR("setTrapSinks: the sink arrays are missing or of different lengths\n");
      return kNotRead;
    }
    return SetTrapSinks(firstAgentId, count, *sinks);
  } catch (const std::bad_alloc&) {
    LOG_ERROR("unable to alloc memory \n");
  } catch (...) {
    LOG_ERROR("unexpected failure in a host call\n");
  }
  return kNotRead;
}

}  // extern "C"
