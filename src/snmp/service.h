// The SNMP service: what runs while agents answer requests (the engine clock base now; the
// receive and worker threads join it later). Started and stopped by the engine lifecycle, from
// one host thread at a time.
#pragma once

namespace tessel {

// Starts the service; false when it cannot run.
bool InitSnmpGeneralServices();
// Stops whatever InitSnmpGeneralServices started; harmless when nothing runs.
void StopSnmpGeneralServices();

}  // namespace tessel
