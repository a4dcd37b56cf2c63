// Micro-benchmarks of the engine's message codec: parsing a request and encoding its response,
// for a Get of sysName.0 and a GetBulk of ifTable (10 repetitions). The responses are the micro
// agent's own replies, parsed back, so the encoder is timed on what it really sends.
#include <benchmark/benchmark.h>

#include <algorithm>

#include "micro_agent.h"
#include "snmp/message.h"
#include "snmp/pdu.h"
#include "snmp_wire.h"

namespace tessel::bench {
namespace {

std::vector<std::uint8_t> GetRequest() { return EncodeMicroRequest(kPduGet, "1.3.6.1.2.1.1.5.0"); }

std::vector<std::uint8_t> GetBulkRequest() {
  return EncodeMicroRequest(kPduGetBulk, "1.3.6.1.2.1.2.2", 10);
}

void ParseRequest(benchmark::State& state, const std::vector<std::uint8_t>& request) {
  SnmpPdu pdu;
  for (auto _ : state) {
    pdu = SnmpPdu();
    if (ParseSnmpMessage(request.data(), request.size(), &pdu) != 1) {
      state.SkipWithError("the request did not parse");
      break;
    }
    benchmark::DoNotOptimize(pdu);
  }
  state.counters["bindings"] = static_cast<double>(pdu.requestVarBinds.size());
}

void BM_ParseGetRequest(benchmark::State& state) { ParseRequest(state, GetRequest()); }
BENCHMARK(BM_ParseGetRequest);

void BM_ParseGetBulkRequest(benchmark::State& state) { ParseRequest(state, GetBulkRequest()); }
BENCHMARK(BM_ParseGetBulkRequest);

// The response PDU the micro agent answers request with, and that reply's bytes.
bool AgentResponse(const std::vector<std::uint8_t>& request, SnmpPdu* pdu,
                   std::vector<std::uint8_t>* reply) {
  MicroAgent agent;
  reply->resize(kMaxSnmpMessage);
  std::size_t length = reply->size();
  if (ProcessSnmpMessage(request.data(), request.size(), reply->data(), &length, agent.Session()) !=
      kMessageReply) {
    return false;
  }
  reply->resize(length);
  if (ParseSnmpMessage(reply->data(), reply->size(), pdu) != 1 || pdu->errorStatus != 0)
    return false;
  pdu->responseVarBinds = pdu->requestVarBinds;
  return true;
}

void EncodeResponse(benchmark::State& state, const std::vector<std::uint8_t>& request) {
  SnmpPdu pdu;
  std::vector<std::uint8_t> expected;
  if (!AgentResponse(request, &pdu, &expected)) {
    state.SkipWithError("the micro agent did not answer");
    return;
  }
  std::vector<std::uint8_t> reply(kMaxSnmpMessage);
  std::size_t length = 0;
  for (auto _ : state) {
    length = reply.size();
    if (!CreateSnmpMessage(nullptr, 0, reply.data(), &length, &pdu)) {
      state.SkipWithError("no response encoded");
      break;
    }
    benchmark::DoNotOptimize(reply.data());
  }
  // Anything but the agent's own bytes would time some other message.
  if (!std::equal(reply.begin(), reply.begin() + static_cast<std::ptrdiff_t>(length),
                  expected.begin(), expected.end())) {
    state.SkipWithError("the encoded response differs from the agent's reply");
  }
  state.counters["bindings"] = static_cast<double>(pdu.responseVarBinds.size());
  state.counters["bytes"] = static_cast<double>(length);
}

void BM_EncodeGetResponse(benchmark::State& state) { EncodeResponse(state, GetRequest()); }
BENCHMARK(BM_EncodeGetResponse);

void BM_EncodeGetBulkResponse(benchmark::State& state) { EncodeResponse(state, GetBulkRequest()); }
BENCHMARK(BM_EncodeGetBulkResponse);

}  // namespace
}  // namespace tessel::bench
