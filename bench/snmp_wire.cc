#include "snmp_wire.h"

#include <charconv>

namespace tessel::bench {
namespace {

using Bytes = std::vector<std::uint8_t>;

void AppendLength(Bytes* out, std::size_t length) {
  if (length < 0x80) {
    out->push_back(static_cast<std::uint8_t>(length));
    return;
  }
  int octets = 0;
  for (std::size_t rest = length; rest != 0; rest >>= 8) ++octets;
  out->push_back(static_cast<std::uint8_t>(0x80 | octets));
  for (int i = octets - 1; i >= 0; --i) out->push_back(static_cast<std::uint8_t>(length >> (8 * i)));
}

Bytes Tlv(std::uint8_t type, const Bytes& contents) {
  Bytes out{type};
  AppendLength(&out, contents.size());
  out.insert(out.end(), contents.begin(), contents.end());
  return out;
}

// Minimal two's complement contents.
Bytes Integer(std::int64_t value) {
  Bytes contents;
  for (int i = 7; i >= 0; --i) contents.push_back(static_cast<std::uint8_t>(static_cast<std::uint64_t>(value) >> (8 * i)));
  std::size_t start = 0;
  while (start + 1 < contents.size() &&
         ((contents[start] == 0x00 && !(contents[start + 1] & 0x80)) ||
          (contents[start] == 0xFF && (contents[start + 1] & 0x80)))) {
    ++start;
  }
  return Tlv(0x02, Bytes(contents.begin() + static_cast<std::ptrdiff_t>(start), contents.end()));
}

void AppendBase128(Bytes* out, std::uint64_t value) {
  std::uint8_t groups[10];
  int count = 0;
  do {
    groups[count++] = static_cast<std::uint8_t>(value & 0x7F);
    value >>= 7;
  } while (value != 0);
  for (int i = count - 1; i >= 0; --i) out->push_back(static_cast<std::uint8_t>(groups[i] | (i > 0 ? 0x80 : 0)));
}

bool ObjectIdentifier(const std::vector<std::uint32_t>& oid, Bytes* out) {
  if (oid.size() < 2 || oid[0] > 2 || (oid[0] < 2 && oid[1] >= 40)) return false;
  Bytes contents;
  AppendBase128(&contents, std::uint64_t{oid[0]} * 40 + oid[1]);
  for (std::size_t i = 2; i < oid.size(); ++i) AppendBase128(&contents, oid[i]);
  *out = Tlv(0x06, contents);
  return true;
}

Bytes Concat(std::initializer_list<const Bytes*> parts) {
  Bytes out;
  for (const Bytes* part : parts) out.insert(out.end(), part->begin(), part->end());
  return out;
}

// A reader over one definite-length TLV sequence.
struct Reader {
  const std::uint8_t* data;
  std::size_t length;
  std::size_t position = 0;

  // Enters the next TLV: returns its contents as a new reader and steps past it.
  bool Next(std::uint8_t* type, Reader* contents) {
    if (position + 2 > length) return false;
    *type = data[position++];
    std::size_t size = data[position++];
    if (size & 0x80) {
      const std::size_t octets = size & 0x7F;
      if (octets == 0 || octets > 4 || position + octets > length) return false;
      size = 0;
      for (std::size_t i = 0; i < octets; ++i) size = (size << 8) | data[position++];
    }
    if (size > length - position) return false;
    *contents = Reader{data + position, size};
    position += size;
    return true;
  }

  bool NextInteger(std::int64_t* value) {
    std::uint8_t type = 0;
    Reader contents{nullptr, 0};
    if (!Next(&type, &contents) || type != 0x02 || contents.length == 0 || contents.length > 8) return false;
    std::uint64_t bits = (contents.data[0] & 0x80) ? ~std::uint64_t{0} : 0;
    for (std::size_t i = 0; i < contents.length; ++i) bits = (bits << 8) | contents.data[i];
    *value = static_cast<std::int64_t>(bits);
    return true;
  }
};

}  // namespace

bool EncodeRequestTemplate(int version, const std::string& community, std::uint8_t pduType,
                           const std::vector<std::uint32_t>& oid, int nonRepeaters, int maxRepetitions,
                           RequestTemplate* out) {
  Bytes name;
  if (!ObjectIdentifier(oid, &name)) return false;
  const Bytes null{0x05, 0x00};
  const Bytes bindings = Tlv(0x30, Tlv(0x30, Concat({&name, &null})));
  const bool bulk = pduType == kPduGetBulk;
  const Bytes requestId = Integer(1 << 23);  // four octets, patched per request
  const Bytes first = Integer(bulk ? nonRepeaters : 0);
  const Bytes second = Integer(bulk ? maxRepetitions : 0);
  const Bytes pdu = Tlv(pduType, Concat({&requestId, &first, &second, &bindings}));
  const Bytes versionField = Integer(version);
  const Bytes communityField = Tlv(0x04, Bytes(community.begin(), community.end()));
  const Bytes body = Concat({&versionField, &communityField, &pdu});
  out->bytes = Tlv(0x30, body);
  if (out->bytes.size() > kMaxRequestSize) return false;
  const std::size_t pduHeader = pdu.size() - (requestId.size() + first.size() + second.size() + bindings.size());
  out->requestIdOffset =
      (out->bytes.size() - body.size()) + versionField.size() + communityField.size() + pduHeader + 2;
  return true;
}

void PatchRequestId(std::uint8_t* message, const RequestTemplate& request, std::uint32_t requestId) {
  for (int i = 0; i < 4; ++i) {
    message[request.requestIdOffset + static_cast<std::size_t>(i)] = static_cast<std::uint8_t>(requestId >> (24 - 8 * i));
  }
}

bool DecodeReply(const std::uint8_t* data, std::size_t length, ReplySummary* out) {
  Reader datagram{data, length};
  Reader message{nullptr, 0};
  Reader community{nullptr, 0};
  Reader pdu{nullptr, 0};
  std::uint8_t type = 0;
  std::int64_t version = 0;
  std::int64_t requestId = 0;
  if (!datagram.Next(&type, &message) || type != 0x30) return false;
  if (!message.NextInteger(&version) || (version != 0 && version != 1)) return false;
  if (!message.Next(&type, &community) || type != 0x04) return false;
  if (!message.Next(&type, &pdu) || type < 0xA0 || type > 0xA8) return false;
  out->pduType = type;
  if (!pdu.NextInteger(&requestId) || !pdu.NextInteger(&out->errorStatus)) return false;
  out->requestId = requestId < 0 || requestId > 0xFFFFFFFF ? 0 : static_cast<std::uint32_t>(requestId);
  return true;
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
