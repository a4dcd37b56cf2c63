#include "snmp/value_adapters.h"

#include <cstddef>

#include "engine/log.h"
#include "snmp/pdu.h"
#include "snmp/var_value.h"

namespace tessel {
namespace {

using HostMethod = HostAnswer (HostBridge::*)(const HostValueQuery&);

// The host's error numbers, by position, as engine error codes. The host numbers the v2
// exceptions and the v1 statuses in one list; 6 has no meaning and counts as genErr.
constexpr std::uint8_t kHostErrorCodes[] = {kTooBig,
                                            kNoSuchObject,
                                            kNoSuchInstance,
                                            kEndOfMibView,
                                            kBadValue,
                                            kReadOnly,
                                            kGenErr,
                                            kNoAccess,
                                            8,
                                            9,
                                            10,
                                            11,
                                            12,
                                            13,
                                            14,
                                            15,
                                            16,
                                            17,
                                            18};

// The element of the answer at index, when the host gave one.
const std::optional<std::string>* Element(const HostAnswer& answer, std::size_t index) {
  if (!answer || index >= answer->size() || !(*answer)[index]) return nullptr;
  return &(*answer)[index];
}

// Reads [value, ..., error] where the error text is at errorIndex. A host that answers nothing
// (or a null value) has no such instance; a host error drops the value.
std::optional<std::string> ReadAnswer(const HostAnswer& answer, std::size_t errorIndex,
                                      std::uint8_t* errorCode) {
  const std::optional<std::string>* value = Element(answer, 0);
  if (value == nullptr) {
    LOG_TRACE("NULL returned from the host\n");
    *errorCode = kNoSuchInstance;
    return std::nullopt;
  }
  const std::optional<std::string>* error = Element(answer, errorIndex);
  *errorCode = error == nullptr ? 0 : GetSnmpErrorStatus(**error);
  if (*errorCode != 0) return std::nullopt;
  return *value;
}

HostAnswer CallHost(HostMethod method, const HostValueQuery& query) {
  HostBridge* host = InstalledHost();
  if (host == nullptr) {
    LOG_ERROR("No host installed for the value call of %s\n", query.label.c_str());
    return std::nullopt;
  }
  return (host->*method)(query);
}

std::optional<std::string> Ask(HostMethod method, const HostValueQuery& query,
                               std::uint8_t* errorCode) {
  return ReadAnswer(CallHost(method, query), 1, errorCode);
}

}  // namespace

std::uint8_t GetSnmpErrorStatus(const std::string& errorText) {
  if (errorText == "-1") return 0;
  // A code is written plainly, without leading zeros to pad it.
  std::optional<std::uint64_t> number =
      errorText.size() <= 2 ? ParseDecimal(errorText, std::size(kHostErrorCodes) - 1)
                            : std::nullopt;
  return number ? kHostErrorCodes[*number] : static_cast<std::uint8_t>(kGenErr);
}

std::optional<std::string> AdapterGetOidVal(const HostValueQuery& query, std::uint8_t* errorCode) {
  return Ask(&HostBridge::ScalarGetOidVal, query, errorCode);
}

std::optional<std::string> AdapterGetNextOidVal(const HostValueQuery& query,
                                                std::uint8_t* errorCode) {
  return Ask(&HostBridge::ScalarGetNextOidVal, query, errorCode);
}

std::optional<std::string> AdapterSetOidVal(const HostValueQuery& query, std::uint8_t* errorCode) {
  return Ask(&HostBridge::SetOidVal, query, errorCode);
}

std::optional<std::string> AdapterTableGetOidVal(const HostValueQuery& query,
                                                 std::uint8_t* errorCode) {
  return Ask(&HostBridge::TableGetOidVal, query, errorCode);
}

std::optional<std::string> AdapterTableGetNextOidVal(const HostValueQuery& query,
                                                     std::string* columnAndInstance,
                                                     std::uint8_t* errorCode) {
  HostAnswer answer = CallHost(&HostBridge::TableGetNextOidVal, query);
  std::optional<std::string> value = ReadAnswer(answer, 2, errorCode);
  const std::optional<std::string>* answered = Element(answer, 1);
  *columnAndInstance = value && answered != nullptr ? **answered : std::string();
  return value;
}

std::optional<std::string> AdapterTableSetOidVal(const HostValueQuery& query,
                                                 std::uint8_t* errorCode) {
  return Ask(&HostBridge::TableSetOidVal, query, errorCode);
}

}  // namespace tessel
