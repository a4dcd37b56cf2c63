#include "ber.h"

namespace tessel::bench::ber {
namespace {

void AppendLength(Bytes* out, std::size_t length) {
  if (length < 0x80) {
    out->push_back(static_cast<std::uint8_t>(length));
    return;
  }
  int octets = 0;
  for (std::size_t rest = length; rest != 0; rest >>= 8) ++octets;
  out->push_back(static_cast<std::uint8_t>(0x80 | octets));
  for (int i = octets - 1; i >= 0; --i)
    out->push_back(static_cast<std::uint8_t>(length >> (8 * i)));
}

void AppendBase128(Bytes* out, std::uint64_t value) {
  std::uint8_t groups[10];
  int count = 0;
  do {
    groups[count++] = static_cast<std::uint8_t>(value & 0x7F);
    value >>= 7;
  } while (value != 0);
  for (int i = count - 1; i >= 0; --i)
    out->push_back(static_cast<std::uint8_t>(groups[i] | (i > 0 ? 0x80 : 0)));
}

}  // namespace

Bytes Tlv(std::uint8_t type, const Bytes& contents) {
  Bytes out{type};
  AppendLength(&out, contents.size());
  out.insert(out.end(), contents.begin(), contents.end());
  return out;
}

std::size_t HeaderSize(std::size_t contentsLength) {
  std::size_t size = 2;
  if (contentsLength >= 0x80) {
    for (std::size_t rest = contentsLength; rest != 0; rest >>= 8) ++size;
  }
  return size;
}

Bytes Integer(std::int64_t value) {
  Bytes contents;
  for (int i = 7; i >= 0; --i)
    contents.push_back(static_cast<std::uint8_t>(static_cast<std::uint64_t>(value) >> (8 * i)));
  std::size_t start = 0;
  while (start + 1 < contents.size() &&
         ((contents[start] == 0x00 && !(contents[start + 1] & 0x80)) ||
          (contents[start] == 0xFF && (contents[start + 1] & 0x80)))) {
    ++start;
  }
  return Tlv(kInteger,
             Bytes(contents.begin() + static_cast<std::ptrdiff_t>(start), contents.end()));
}

Bytes OctetString(const std::uint8_t* data, std::size_t length) {
  return Tlv(kOctetString, Bytes(data, data + length));
}

bool ObjectIdentifier(const std::vector<std::uint32_t>& oid, Bytes* out) {
  if (oid.size() < 2 || oid[0] > 2 || (oid[0] < 2 && oid[1] >= 40)) return false;
  Bytes contents;
  AppendBase128(&contents, std::uint64_t{oid[0]} * 40 + oid[1]);
  for (std::size_t i = 2; i < oid.size(); ++i) AppendBase128(&contents, oid[i]);
  *out = Tlv(kObjectIdentifier, contents);
  return true;
}

Bytes Concat(std::initializer_list<const Bytes*> parts) {
  Bytes out;
  for (const Bytes* part : parts) out.insert(out.end(), part->begin(), part->end());
  return out;
}

bool Reader::Next(std::uint8_t* type, Reader* contents) {
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

bool Reader::Expect(std::uint8_t type, Reader* contents) {
  std::uint8_t actual = 0;
  return Next(&actual, contents) && actual == type;
}

bool Reader::NextInteger(std::int64_t* value) {
  Reader contents{nullptr, 0};
  if (!Expect(kInteger, &contents) || contents.length == 0 || contents.length > 8) return false;
  std::uint64_t bits = (contents.data[0] & 0x80) ? ~std::uint64_t{0} : 0;
  for (std::size_t i = 0; i < contents.length; ++i) bits = (bits << 8) | contents.data[i];
  *value = static_cast<std::int64_t>(bits);
  return true;
}

}  // namespace tessel::bench::ber
