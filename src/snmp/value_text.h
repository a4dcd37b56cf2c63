// Value texts: the conversions between SNMP values and the texts in which the host keeps them,
// chosen by a column's registered data type and syntax. Pure functions; safe from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "snmp/var_value.h"

namespace tessel {

// A host's value text as an SNMP value of the column's data type (and syntax, which may be
// empty); nothing when the text does not convert.
std::optional<VarValue> TextToVarValue(std::uint8_t dataType, const std::string& syntax,
                                       const std::string& text);
// A value as the text the host is given for a Set of a column of that data type; nothing when
// the type is not supported or the value has not the form of the type.
std::optional<std::string> VarValueToText(std::uint8_t dataType, const VarValue& value);
// Checks an 8- or 11-octet DateAndTime value and renders it; nothing when it is invalid.
std::optional<std::string> DateAndTimeToText(const std::string& octets);
// The text a Set of a column (data type and syntax, which may be empty) gives the host, or
// nothing with *errorCode set: wrongType when the value has not the column's form, badValue for
// an invalid DateAndTime, genErr when the value cannot be rendered.
std::optional<std::string> SetValueText(std::uint8_t dataType, const std::string& syntax,
                                        const VarValue& value, std::uint8_t* errorCode);

}  // namespace tessel
