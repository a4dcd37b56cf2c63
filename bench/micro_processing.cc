// Micro-benchmarks of one request datagram through ProcessSnmpMessage (parse, community check,
// PDU processing against the in-memory host, reply encoding) with no sockets involved.
#include <benchmark/benchmark.h>

#include "micro_agent.h"
#include "snmp/message.h"
#include "snmp/pdu.h"
#include "snmp_wire.h"

namespace tessel::bench {
namespace {

void RunRequest(benchmark::State& state, const std::vector<std::uint8_t>& request) {
  MicroAgent agent;
  std::vector<std::uint8_t> reply(kMaxSnmpMessage);
  std::size_t replyBytes = 0;
  for (auto _ : state) {
    std::size_t length = reply.size();
    if (ProcessSnmpMessage(request.data(), request.size(), reply.data(), &length,
                           agent.Session()) != kMessageReply) {
      state.SkipWithError("the agent did not answer");
      break;
    }
    replyBytes = length;
    benchmark::DoNotOptimize(reply.data());
  }
  // An error reply is faster than an answer; make one visible instead of reporting it as speed.
  ReplySummary summary;
  if (!DecodeReply(reply.data(), replyBytes, &summary) || summary.errorStatus != 0) {
    state.SkipWithError("the reply carries an error status");
  }
  SnmpPdu parsed;
  if (ParseSnmpMessage(reply.data(), replyBytes, &parsed) == 1) {
    state.counters["bindings"] = static_cast<double>(parsed.requestVarBinds.size());
  }
  state.counters["reply_bytes"] = static_cast<double>(replyBytes);
}

void BM_ProcessGet(benchmark::State& state) {
  RunRequest(state, EncodeMicroRequest(kPduGet, "1.3.6.1.2.1.1.5.0"));
}
BENCHMARK(BM_ProcessGet);

void BM_ProcessGetNext(benchmark::State& state) {
  RunRequest(state, EncodeMicroRequest(kPduGetNext, "1.3.6.1.2.1.1"));
}
BENCHMARK(BM_ProcessGetNext);

void BM_ProcessGetBulk(benchmark::State& state) {
  RunRequest(state,
             EncodeMicroRequest(kPduGetBulk, "1.3.6.1.2.1.2.2", static_cast<int>(state.range(0))));
}
BENCHMARK(BM_ProcessGetBulk)->Arg(10)->Arg(50);

}  // namespace
}  // namespace tessel::bench
