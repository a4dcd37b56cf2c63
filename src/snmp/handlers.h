// The read and write handlers of registered cells: they split a requested OID into the texts the
// host expects, ask the host through the value adapters, and convert between value texts and
// SNMP values by the column's registered data type and syntax. They never fail a request
// themselves; they report through the error code (an SNMP error status or exception code).
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "snmp/mib_tree.h"
#include "snmp/var_value.h"

namespace tessel {

std::optional<VarValue> ScalarProcessReadReq(std::uint8_t pduType, Oid* oid,
                                             std::uint8_t* errorCode, const TesselStruct& target);
std::optional<VarValue> ScalarProcessWriteReq(const Oid& oid, const VarValue& value,
                                              std::uint8_t* errorCode, const TesselStruct& target);
std::optional<VarValue> TableProcessReadReq(std::uint8_t pduType, Oid* oid, std::uint8_t* errorCode,
                                            const TesselStruct& target);
std::optional<VarValue> TableProcessWriteReq(const Oid& oid, const VarValue& value,
                                             std::uint8_t* errorCode, const TesselStruct& target);

}  // namespace tessel
