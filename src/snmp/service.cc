#include "snmp/service.h"

#include "base/clock.h"
#include "engine/log.h"

namespace tessel {

bool InitSnmpGeneralServices() {
  LOG_TRACE("\n\t@@@@@ Inside InitSnmpGeneralServices() @@@@@ \n");
  // Agent uptimes and the SNMPv3 engine time count from here.
  SetClockBase();
  return true;
}

void StopSnmpGeneralServices() {}

}  // namespace tessel
