#include "snmp_wire.h"

#include <charconv>

#include "ber.h"

namespace tessel::bench {

using ber::Bytes;
using ber::Concat;
using ber::Integer;
using ber::Reader;
using ber::Tlv;

bool EncodePduTemplate(std::uint8_t pduType, const std::vector<std::uint32_t>& oid,
                       int nonRepeaters, int maxRepetitions, RequestTemplate* out) {
  Bytes name;
  if (!ber::ObjectIdentifier(oid, &name)) return false;
  const Bytes null{0x05, 0x00};
  const Bytes bindings = Tlv(0x30, Tlv(0x30, Concat({&name, &null})));
  const bool bulk = pduType == kPduGetBulk;
  const Bytes requestId = Integer(1 << 23);  // four octets, patched per request
  const Bytes first = Integer(bulk ? nonRepeaters : 0);
  const Bytes second = Integer(bulk ? maxRepetitions : 0);
  const Bytes contents = Concat({&requestId, &first, &second, &bindings});
  out->bytes = Tlv(pduType, contents);
  out->requestIdOffset = ber::HeaderSize(contents.size()) + 2;
  return out->bytes.size() <= kMaxRequestSize;
}

bool EncodeRequestTemplate(int version, const std::string& community, std::uint8_t pduType,
                           const std::vector<std::uint32_t>& oid, int nonRepeaters,
                           int maxRepetitions, RequestTemplate* out) {
  RequestTemplate pdu;
  if (!EncodePduTemplate(pduType, oid, nonRepeaters, maxRepetitions, &pdu)) return false;
  const Bytes versionField = Integer(version);
  const Bytes communityField = Tlv(0x04, Bytes(community.begin(), community.end()));
  const Bytes body = Concat({&versionField, &communityField, &pdu.bytes});
  out->bytes = Tlv(0x30, body);
  out->requestIdOffset = (out->bytes.size() - pdu.bytes.size()) + pdu.requestIdOffset;
  return out->bytes.size() <= kMaxRequestSize;
}

void PatchRequestId(std::uint8_t* message, const RequestTemplate& request,
                    std::uint32_t requestId) {
  for (int i = 0; i < 4; ++i) {
    message[request.requestIdOffset + static_cast<std::size_t>(i)] =
        static_cast<std::uint8_t>(requestId >> (24 - 8 * i));
  }
}

bool DecodePdu(const std::uint8_t* data, std::size_t length, ReplySummary* out) {
  Reader reader{data, length};
  Reader pdu{nullptr, 0};
  std::uint8_t type = 0;
  std::int64_t requestId = 0;
  if (!reader.Next(&type, &pdu) || type < 0xA0 || type > 0xA8) return false;
  out->pduType = type;
  if (!pdu.NextInteger(&requestId) || !pdu.NextInteger(&out->errorStatus)) return false;
  out->requestId =
      requestId < 0 || requestId > 0xFFFFFFFF ? 0 : static_cast<std::uint32_t>(requestId);
  return true;
}

bool FindCommunityPdu(const std::uint8_t* data, std::size_t length, std::size_t* pduOffset) {
  Reader datagram{data, length};
  Reader message{nullptr, 0};
  Reader community{nullptr, 0};
  std::int64_t version = 0;
  if (!datagram.Expect(0x30, &message)) return false;
  if (!message.NextInteger(&version) || (version != 0 && version != 1)) return false;
  if (!message.Expect(0x04, &community) || message.AtEnd()) return false;
  *pduOffset = static_cast<std::size_t>(message.data - data) + message.position;
  return true;
}

bool AnswerInform(std::uint8_t* datagram, std::size_t length) {
  std::size_t pdu = 0;
  if (!FindCommunityPdu(datagram, length, &pdu) || datagram[pdu] != kPduInform) return false;
  datagram[pdu] = kPduResponse;
  return true;
}

bool DecodeReply(const std::uint8_t* data, std::size_t length, ReplySummary* out) {
  std::size_t pdu = 0;
  return FindCommunityPdu(data, length, &pdu) && DecodePdu(data + pdu, length - pdu, out);
}

bool ParseOid(const std::string& text, std::vector<std::uint32_t>* oid) {
  oid->clear();
  const char* cursor = text.data();
  const char* end = text.data() + text.size();
  if (cursor != end && *cursor == '.') ++cursor;
  while (cursor < end) {
    std::uint32_t value = 0;
    auto [next, error] = std::from_chars(cursor, end, value);
    if (error != std::errc() || (next != end && *next != '.')) return false;
    oid->push_back(value);
    cursor = next == end ? end : next + 1;
    if (next != end && cursor == end) return false;  // trailing dot
  }
  return oid->size() >= 2;
}

}  // namespace tessel::bench
