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

// A host's value text as an SNMP value of the column's data type (and syntax, which may be
// empty); nothing when the text does not convert.
std::optional<VarValue> TextToVarValue(std::uint8_t dataType, const std::string& syntax,
                                       const std::string& text);
// A value as the text the host is given for a Set of a column of that data type; nothing when
// the type is not supported or the value has not the form of the type.
std::optional<std::string> VarValueToText(std::uint8_t dataType, const VarValue& value);
// Checks an 8- or 11-octet DateAndTime value and renders it; nothing when it is invalid.
std::optional<std::string> DateAndTimeToText(const std::string& octets);

}  // namespace tessel
