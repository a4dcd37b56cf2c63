// The calls that fetch and store values at the host, one per host method, and the mapping of the
// host's error texts to engine error codes. Called concurrently from request threads.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "engine/host_bridge.h"

namespace tessel {

// The engine error code for a host error text ("-1" is no error, reported as 0).
std::uint8_t GetSnmpErrorStatus(const std::string& errorText);

// Each returns the value text, or nothing with *errorCode set (noSuchInstance when the host gave
// no answer). On success *errorCode is 0.
std::optional<std::string> AdapterGetOidVal(const HostValueQuery& query, std::uint8_t* errorCode);
std::optional<std::string> AdapterGetNextOidVal(const HostValueQuery& query,
                                                std::uint8_t* errorCode);
std::optional<std::string> AdapterSetOidVal(const HostValueQuery& query, std::uint8_t* errorCode);
std::optional<std::string> AdapterTableGetOidVal(const HostValueQuery& query,
                                                 std::uint8_t* errorCode);
// Also gives the answered column-and-instance text (relative to the entry OID, no leading dot).
std::optional<std::string> AdapterTableGetNextOidVal(const HostValueQuery& query,
                                                     std::string* columnAndInstance,
                                                     std::uint8_t* errorCode);
std::optional<std::string> AdapterTableSetOidVal(const HostValueQuery& query,
                                                 std::uint8_t* errorCode);

}  // namespace tessel
