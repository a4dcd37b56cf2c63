// Readable dumps of the PDUs an agent receives, answers and sends, written to the engine's log at
// level 1 and above (nothing is formatted below it). Stateless; safe from any thread.
#pragma once

#include "snmp/pdu.h"

namespace tessel {

// The rule that opens and closes each block of the dump.
extern const char* const kDumpDashes;

// One request, response, trap or inform with its bindings: a Response shows the answers it
// carries, anything else the bindings it was sent with.
void DumpPdu(const SnmpPdu& pdu);

// The name of a binding's type as the traffic log and the host show it.
const char* VarBindTypeName(std::uint8_t type);
// A binding's value as text; empty for NULL and the exception values.
std::string VarBindValueText(const VarValue& value);

}  // namespace tessel
