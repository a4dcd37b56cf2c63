#include "notify/trap_pdu.h"

#include <arpa/inet.h>

#include <algorithm>

#include "engine/log.h"
#include "snmp/ber.h"
#include "snmp/pdu_codec.h"

namespace tessel {
namespace {

VarBind Binding(const Oid& name, VarValue value) {
  VarBind binding;
  binding.name = name;
  binding.value = std::move(value);
  return binding;
}

const VarBind* FindBinding(const VarBindList& bindings, const Oid& name) {
  auto found = std::find_if(bindings.begin(), bindings.end(),
                            [&](const VarBind& binding) { return binding.name == name; });
  return found == bindings.end() ? nullptr : &*found;
}

// snmpTraps.(g + 1) for a standard trap, or nothing.
std::optional<std::int32_t> StandardTrapNumber(const Oid& trapOid) {
  if (trapOid.size() != kSnmpTrapsOid.size() + 1 ||
      !std::equal(kSnmpTrapsOid.begin(), kSnmpTrapsOid.end(), trapOid.begin()))
    return std::nullopt;
  std::uint32_t last = trapOid.back();
  if (last < 1 || last > 6) return std::nullopt;
  return static_cast<std::int32_t>(last - 1);
}

// The enterprise-specific trap enterprise.0.specific names the enterprise and the number; any
// other trap OID is read as enterprise.specific.
void SplitEnterpriseTrap(const Oid& trapOid, SnmpPdu* trap) {
  trap->genericTrap = kEnterpriseSpecific;
  trap->specificTrap = trapOid.empty() ? 0 : static_cast<std::int32_t>(trapOid.back());
  trap->enterprise.assign(trapOid.begin(), trapOid.end() - (trapOid.empty() ? 0 : 1));
  if (!trap->enterprise.empty() && trap->enterprise.back() == 0) trap->enterprise.pop_back();
}

// Appends TLVs to a message buffer; a field that does not fit fails the whole message.
class MessageWriter {
 public:
  MessageWriter() : buffer_(kMaxSnmpMessage), remaining_(kMaxSnmpMessage) {}

  template <typename Write>
  MessageWriter& Add(Write write) {
    if (cursor_ != nullptr) cursor_ = write(cursor_, &remaining_);
    return *this;
  }
  MessageWriter& Integer(std::int32_t value) {
    return Add([&](std::uint8_t* at, std::int32_t* room) {
      return AsnBuildInt(at, room, kAsnInteger, value);
    });
  }
  MessageWriter& Octets(std::uint8_t type, const std::string& octets) {
    return Add([&](std::uint8_t* at, std::int32_t* room) {
      return AsnBuildString(at, room, type, reinterpret_cast<const std::uint8_t*>(octets.data()),
                            octets.size());
    });
  }
  // A constructed header in its fixed four-octet form, filled in by Close.
  std::uint8_t* Open(std::uint8_t type) {
    std::uint8_t* header = cursor_;
    Add([&](std::uint8_t* at, std::int32_t* room) { return AsnBuildSequence(at, room, type, 0); });
    return header;
  }
  void Close(std::uint8_t* header, std::uint8_t type) {
    if (cursor_ != nullptr && !FillHeader(header, type, cursor_)) cursor_ = nullptr;
  }
  std::vector<std::uint8_t> Take() {
    if (cursor_ == nullptr) return {};
    buffer_.resize(static_cast<std::size_t>(cursor_ - buffer_.data()));
    return std::move(buffer_);
  }

 private:
  std::vector<std::uint8_t> buffer_;
  std::int32_t remaining_;
  std::uint8_t* cursor_ = buffer_.data();
};

void WriteV1TrapFields(MessageWriter& writer, const SnmpPdu& pdu) {
  writer.Add([&](std::uint8_t* at, std::int32_t* room) {
    return AsnBuildObjid(at, room, kAsnObjectId, pdu.enterprise.data(), pdu.enterprise.size());
  });
  writer.Octets(kAsnIpAddress,
                std::string(std::begin(pdu.agentAddress), std::end(pdu.agentAddress)));
  writer.Integer(pdu.genericTrap).Integer(pdu.specificTrap);
  writer.Add([&](std::uint8_t* at, std::int32_t* room) {
    return AsnBuildUnsignedInt(at, room, kAsnTimeTicks, pdu.timeStamp);
  });
}

void WritePdu(MessageWriter& writer, const SnmpPdu& pdu) {
  std::uint8_t* body = writer.Open(pdu.type);
  if (pdu.type == kTrapV1) {
    WriteV1TrapFields(writer, pdu);
  } else {
    writer.Integer(pdu.requestId).Integer(0).Integer(0);
  }
  std::uint8_t* list = writer.Open(kAsnSequence);
  for (const VarBind& binding : pdu.requestVarBinds) {
    writer.Add([&](std::uint8_t* at, std::int32_t* room) {
      return BuildVarOp(at, binding.name.data(), binding.name.size(), binding.value, room);
    });
  }
  writer.Close(list, kAsnSequence);
  writer.Close(body, pdu.type);
}

}  // namespace

AgentAddress AgentAddressOf(const std::string& deviceAddress) {
  AgentAddress address{};
  if (inet_pton(AF_INET, deviceAddress.c_str(), address.data()) != 1) address.fill(0);
  return address;
}

SnmpPdu BuildV1Trap(const Oid& enterprise, const AgentAddress& agentAddress,
                    std::int32_t genericTrap, std::int32_t specificTrap, std::uint32_t timeStamp,
                    VarBindList bindings) {
  SnmpPdu pdu;
  pdu.version = kSnmpV1;
  pdu.type = kTrapV1;
  pdu.enterprise = enterprise;
  std::copy(agentAddress.begin(), agentAddress.end(), pdu.agentAddress);
  pdu.genericTrap = genericTrap;
  pdu.specificTrap = specificTrap;
  pdu.timeStamp = timeStamp;
  if (const VarBind* upTime = FindBinding(bindings, kSysUpTimeOid))
    pdu.timeStamp = static_cast<std::uint32_t>(upTime->value.number);
  pdu.requestVarBinds = std::move(bindings);
  return pdu;
}

SnmpPdu BuildV2Notification(std::uint8_t type, std::uint32_t upTime, const Oid& trapOid,
                            VarBindList bindings) {
  SnmpPdu pdu;
  pdu.version = kSnmpV2c;
  pdu.type = type;
  pdu.requestVarBinds.reserve(bindings.size() + 2);
  pdu.requestVarBinds.push_back(Binding(kSysUpTimeOid, VarValue::Unsigned(kAsnTimeTicks, upTime)));
  pdu.requestVarBinds.push_back(Binding(kSnmpTrapOid, VarValue::ObjectId(trapOid)));
  for (VarBind& binding : bindings) pdu.requestVarBinds.push_back(std::move(binding));
  return pdu;
}

SnmpPdu BuildStandardV1Trap(std::int32_t genericTrap, const AgentAddress& device,
                            std::uint32_t upTime) {
  return BuildV1Trap(kSnmpTrapsOid, device, genericTrap, 0, upTime, {});
}

SnmpPdu ConvertV1TrapToV2(const SnmpPdu& trap) {
  Oid trapOid;
  if (trap.genericTrap >= 0 && trap.genericTrap < kEnterpriseSpecific) {
    trapOid = kSnmpTrapsOid;
    trapOid.push_back(static_cast<std::uint32_t>(trap.genericTrap) + 1u);
  } else {
    trapOid = trap.enterprise;
    trapOid.push_back(0);
    trapOid.push_back(static_cast<std::uint32_t>(trap.specificTrap));
  }
  SnmpPdu pdu = BuildV2Notification(kTrapV2, trap.timeStamp, trapOid, trap.requestVarBinds);
  pdu.version = trap.version;
  pdu.community = trap.community;
  pdu.requestId = trap.requestId;
  return pdu;
}

std::optional<SnmpPdu> ConvertV2TrapToV1(const SnmpPdu& notification, const AgentAddress& device) {
  const VarBindList& bindings = notification.requestVarBinds;
  if (bindings.size() < 2 || bindings[0].name != kSysUpTimeOid ||
      bindings[1].name != kSnmpTrapOid || bindings[1].value.type != kAsnObjectId) {
    LOG_ERROR("The notification has no sysUpTime.0 and snmpTrapOID.0 to translate\n");
    return std::nullopt;
  }
  const Oid& trapOid = bindings[1].value.oid;
  SnmpPdu trap;
  if (std::optional<std::int32_t> generic = StandardTrapNumber(trapOid)) {
    trap.genericTrap = *generic;
    const VarBind* enterprise = FindBinding(bindings, kSnmpTrapEnterpriseOid);
    trap.enterprise = enterprise && enterprise->value.type == kAsnObjectId ? enterprise->value.oid
                                                                           : kSnmpTrapsOid;
  } else {
    SplitEnterpriseTrap(trapOid, &trap);
  }
  AgentAddress address = device;
  const VarBind* given = FindBinding(bindings, kSnmpTrapAddressOid);
  if (given && given->value.type == kAsnIpAddress && given->value.octets.size() == 4)
    std::copy(given->value.octets.begin(), given->value.octets.end(), address.begin());
  std::copy(address.begin(), address.end(), trap.agentAddress);
  trap.timeStamp = static_cast<std::uint32_t>(bindings[0].value.number);
  for (auto it = bindings.begin() + 2; it != bindings.end(); ++it) {
    if (it->value.type != kAsnCounter64) trap.requestVarBinds.push_back(*it);
  }
  trap.version = kSnmpV1;
  trap.type = kTrapV1;
  trap.community = notification.community;
  return trap;
}

std::optional<SnmpPdu> NotificationForVersion(const SnmpPdu& pdu, std::int32_t version,
                                              const AgentAddress& device) {
  std::optional<SnmpPdu> converted;
  if (version == kSnmpV1 && pdu.type != kTrapV1) {
    if (pdu.type != kTrapV2) return std::nullopt;  // SNMPv1 has no InformRequest
    converted = ConvertV2TrapToV1(pdu, device);
  } else if (version != kSnmpV1 && pdu.type == kTrapV1) {
    converted = ConvertV1TrapToV2(pdu);
  } else {
    converted = pdu;
  }
  if (converted) converted->version = version;
  return converted;
}

std::vector<std::uint8_t> EncodeNotificationPdu(const SnmpPdu& pdu) {
  MessageWriter writer;
  WritePdu(writer, pdu);
  return writer.Take();
}

std::vector<std::uint8_t> EncodeNotification(const SnmpPdu& pdu) {
  MessageWriter writer;
  std::uint8_t* message = writer.Open(kAsnSequence);
  writer.Integer(pdu.version).Octets(kAsnOctetString, pdu.community);
  WritePdu(writer, pdu);
  writer.Close(message, kAsnSequence);
  std::vector<std::uint8_t> encoded = writer.Take();
  if (encoded.empty()) LOG_ERROR("Send Trap Message is failed....\n");
  return encoded;
}

}  // namespace tessel
