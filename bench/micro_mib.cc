// Micro-benchmarks of the MIB tree lookup every binding of a request starts with: the cell that
// answers a Get of an instance and a GetNext, in the micro agent's two-cell tree and with a few
// hundred more groups registered after it. The read lock is held across the loop, as a request
// holds it across its bindings.
#include <benchmark/benchmark.h>

#include <string>

#include "micro_agent.h"
#include "snmp/mib_tree.h"
#include "snmp/pdu.h"
#include "snmp_wire.h"

namespace tessel::bench {
namespace {

void Lookup(benchmark::State& state, std::uint8_t pduType, const std::string& oidText,
            const std::string& expectedLabel) {
  MicroAgent agent(static_cast<int>(state.range(0)));
  state.counters["cells"] = RegisteredCellCount();
  Oid oid;
  if (!ParseOid(oidText, &oid)) {
    state.SkipWithError("unusable OID");
    return;
  }
  MibTreeReadLock lock;
  const TreeCell* cell = nullptr;
  for (auto _ : state) {
    std::uint8_t errorCode = 0;
    cell = GetTreeCell(pduType, oid, &errorCode);
    benchmark::DoNotOptimize(cell);
  }
  if (cell == nullptr || cell->label != expectedLabel)
    state.SkipWithError("the lookup found another cell");
}

// ifDescr.3: a binary search, then the column check of the table.
void BM_MibLookupGet(benchmark::State& state) {
  Lookup(state, kGetRequest, "1.3.6.1.2.1.2.2.1.2.3", "ifEntry");
}
BENCHMARK(BM_MibLookupGet)->Arg(0)->Arg(254);

// GetNext of ifDescr.4, the column's last row: the table's cell answers (its handler then moves
// on to the next column).
void BM_MibLookupGetNext(benchmark::State& state) {
  Lookup(state, kGetNextRequest, "1.3.6.1.2.1.2.2.1.2.4", "ifEntry");
}
BENCHMARK(BM_MibLookupGetNext)->Arg(0)->Arg(254);

}  // namespace
}  // namespace tessel::bench
