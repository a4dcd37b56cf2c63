// Micro-benchmarks of the engine's message codec: parsing a typical Get and encoding its reply.
#include <benchmark/benchmark.h>

#include "micro_agent.h"
#include "snmp/message.h"
#include "snmp/pdu.h"
#include "snmp_wire.h"

namespace tessel::bench {
namespace {

void BM_ParseGetRequest(benchmark::State& state) {
  const std::vector<std::uint8_t> request = EncodeMicroRequest(kPduGet, "1.3.6.1.2.1.1.5.0");
  for (auto _ : state) {
    SnmpPdu pdu;
    int result = ParseSnmpMessage(request.data(), request.size(), &pdu);
    if (result != 1) state.SkipWithError("the Get request did not parse");
    benchmark::DoNotOptimize(pdu);
  }
}
BENCHMARK(BM_ParseGetRequest);

void BM_EncodeGetResponse(benchmark::State& state) {
  const std::vector<std::uint8_t> request = EncodeMicroRequest(kPduGet, "1.3.6.1.2.1.1.5.0");
  SnmpPdu pdu;
  if (ParseSnmpMessage(request.data(), request.size(), &pdu) != 1) {
    state.SkipWithError("the Get request did not parse");
    return;
  }
  pdu.type = kGetResponse;
  VarBind answer = pdu.requestVarBinds.at(0);
  answer.value = VarValue::Octets(kAsnOctetString, "r1");
  pdu.responseVarBinds = {answer};
  std::vector<std::uint8_t> reply(kMaxSnmpMessage);
  for (auto _ : state) {
    std::size_t length = reply.size();
    if (!CreateSnmpMessage(nullptr, 0, reply.data(), &length, &pdu))
      state.SkipWithError("no reply encoded");
    benchmark::DoNotOptimize(reply.data());
  }
}
BENCHMARK(BM_EncodeGetResponse);

}  // namespace
}  // namespace tessel::bench
