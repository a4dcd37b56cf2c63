#include "snmpv3_wire.h"

#include <openssl/core_names.h>
#include <openssl/crypto.h>
#include <openssl/params.h>

#include <algorithm>
#include <cstring>

#include "ber.h"

namespace tessel::bench::v3 {
namespace {

using ber::Concat;
using ber::Integer;
using ber::OctetString;
using ber::Reader;
using ber::Tlv;

constexpr std::int64_t kMaxMessageSize = 65507;
constexpr std::int64_t kUsm = 3;
constexpr std::uint8_t kReportable = 0x04;
constexpr std::size_t kShaSize = 20;
constexpr std::size_t kAesKeySize = 16;
constexpr std::size_t kSaltSize = 8;

Bytes Sha1(std::initializer_list<const Bytes*> parts) {
  Bytes digest(kShaSize);
  std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(),
                                                                  EVP_MD_CTX_free);
  bool ok = context && EVP_DigestInit_ex2(context.get(), EVP_sha1(), nullptr) == 1;
  for (const Bytes* part : parts)
    ok = ok && EVP_DigestUpdate(context.get(), part->data(), part->size()) == 1;
  unsigned int size = 0;
  ok = ok && EVP_DigestFinal_ex(context.get(), digest.data(), &size) == 1;
  return ok ? digest : Bytes{};
}

// The message around msgData: version, header, security parameters. Sets *digestOffset to the
// digest's position in the whole message (when authenticated).
struct Envelope {
  std::uint32_t messageId;
  std::uint8_t flags;
  const Engine* engine;
  std::int64_t time;
  std::string_view user;
  Bytes digest;  // empty, or kDigestSize zeros
  Bytes salt;    // empty, or kSaltSize octets
};

Bytes Wrap(const Envelope& envelope, const Bytes& data, std::size_t* digestOffset) {
  const Bytes version = Integer(3);
  const Bytes messageId = Integer(envelope.messageId);
  const Bytes maxSize = Integer(kMaxMessageSize);
  const Bytes flags = OctetString(&envelope.flags, 1);
  const Bytes model = Integer(kUsm);
  const Bytes header = Tlv(ber::kSequence, Concat({&messageId, &maxSize, &flags, &model}));
  const Bytes engineId = OctetString(envelope.engine->id);
  const Bytes boots = Integer(envelope.engine->boots);
  const Bytes time = Integer(envelope.time);
  const Bytes user = OctetString(reinterpret_cast<const std::uint8_t*>(envelope.user.data()),
                                 envelope.user.size());
  const Bytes prefix = Concat({&engineId, &boots, &time, &user});
  const Bytes digest = OctetString(envelope.digest);
  const Bytes salt = OctetString(envelope.salt);
  const Bytes security = OctetString(Tlv(ber::kSequence, Concat({&prefix, &digest, &salt})));
  const Bytes body = Concat({&version, &header, &security, &data});
  // Inside the security parameters: OCTET STRING header, SEQUENCE header, prefix, digest header.
  const std::size_t securityContents = prefix.size() + digest.size() + salt.size();
  *digestOffset = ber::HeaderSize(body.size()) + version.size() + header.size() +
                  ber::HeaderSize(ber::HeaderSize(securityContents) + securityContents) +
                  ber::HeaderSize(securityContents) + prefix.size() + 2;
  return Tlv(ber::kSequence, body);
}

// The fields of a v3 message up to msgData, with positions kept for the digest check.
struct Parsed {
  std::int64_t messageId = 0;
  std::uint8_t flags = 0;
  Reader engineId{nullptr, 0};
  std::int64_t boots = 0;
  std::int64_t time = 0;
  Reader user{nullptr, 0};
  Reader digest{nullptr, 0};
  Reader salt{nullptr, 0};
  Reader data{nullptr, 0};  // msgData: the rest of the message
};

bool Parse(const std::uint8_t* datagram, std::size_t length, Parsed* out) {
  Reader outer{datagram, length};
  Reader message{nullptr, 0}, header{nullptr, 0}, flags{nullptr, 0}, securityOctets{nullptr, 0};
  Reader security{nullptr, 0};
  std::int64_t version = 0, maxSize = 0, model = 0;
  if (!outer.Expect(ber::kSequence, &message) || !message.NextInteger(&version) || version != 3)
    return false;
  if (!message.Expect(ber::kSequence, &header) || !header.NextInteger(&out->messageId) ||
      !header.NextInteger(&maxSize) || !header.Expect(ber::kOctetString, &flags) ||
      flags.length != 1 || !header.NextInteger(&model) || model != kUsm) {
    return false;
  }
  out->flags = flags.data[0];
  if (!message.Expect(ber::kOctetString, &securityOctets) ||
      !securityOctets.Expect(ber::kSequence, &security) ||
      !security.Expect(ber::kOctetString, &out->engineId) || !security.NextInteger(&out->boots) ||
      !security.NextInteger(&out->time) || !security.Expect(ber::kOctetString, &out->user) ||
      !security.Expect(ber::kOctetString, &out->digest) ||
      !security.Expect(ber::kOctetString, &out->salt)) {
    return false;
  }
  out->data = Reader{message.data + message.position, message.length - message.position};
  return out->messageId >= 0 && out->messageId <= 0x7FFFFFFF;
}

bool FirstName(const std::uint8_t* pdu, std::size_t length, std::vector<std::uint32_t>* oid) {
  Reader outer{pdu, length};
  Reader contents{nullptr, 0}, bindings{nullptr, 0}, binding{nullptr, 0}, name{nullptr, 0};
  std::uint8_t type = 0;
  std::int64_t ignored = 0;
  if (!outer.Next(&type, &contents) || !contents.NextInteger(&ignored) ||
      !contents.NextInteger(&ignored) || !contents.NextInteger(&ignored) ||
      !contents.Expect(ber::kSequence, &bindings) || !bindings.Expect(ber::kSequence, &binding) ||
      !binding.Expect(ber::kObjectIdentifier, &name) || name.length == 0) {
    return false;
  }
  oid->clear();
  std::uint64_t value = 0;
  for (std::size_t i = 0; i < name.length; ++i) {
    value = (value << 7) | (name.data[i] & 0x7F);
    if (name.data[i] & 0x80) continue;
    if (oid->empty()) {
      const std::uint64_t first = std::min<std::uint64_t>(value / 40, 2);
      oid->push_back(static_cast<std::uint32_t>(first));
      value -= first * 40;
    }
    oid->push_back(static_cast<std::uint32_t>(value));
    value = 0;
  }
  return true;
}

}  // namespace

Bytes PasswordToKey(std::string_view password) {
  if (password.empty()) return {};
  std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(),
                                                                  EVP_MD_CTX_free);
  if (!context || EVP_DigestInit_ex2(context.get(), EVP_sha1(), nullptr) != 1) return {};
  std::uint8_t block[64];
  std::size_t index = 0;
  for (std::size_t done = 0; done < (1u << 20); done += sizeof block) {
    for (std::uint8_t& octet : block)
      octet = static_cast<std::uint8_t>(password[index++ % password.size()]);
    if (EVP_DigestUpdate(context.get(), block, sizeof block) != 1) return {};
  }
  Bytes key(kShaSize);
  unsigned int size = 0;
  if (EVP_DigestFinal_ex(context.get(), key.data(), &size) != 1) return {};
  return key;
}

Bytes LocalizeKey(const Bytes& key, const Bytes& engineId) { return Sha1({&key, &engineId, &key}); }

Bytes EncodeDiscovery(std::uint32_t messageId) {
  const Bytes noVariables = Tlv(ber::kSequence, {});
  const Bytes requestId = Integer(messageId);
  const Bytes zero = Integer(0);
  const Bytes pdu = Tlv(kPduGet, Concat({&requestId, &zero, &zero, &noVariables}));
  const Bytes empty = OctetString(Bytes{});
  const Bytes scoped = Tlv(ber::kSequence, Concat({&empty, &empty, &pdu}));
  const Engine unknown;
  std::size_t digestOffset = 0;
  return Wrap({messageId, kReportable, &unknown, 0, "", {}, {}}, scoped, &digestOffset);
}

bool DecodeEngine(const std::uint8_t* data, std::size_t length, std::uint32_t* messageId,
                  Engine* engine) {
  Parsed parsed;
  if (!Parse(data, length, &parsed) || parsed.engineId.length == 0) return false;
  *messageId = static_cast<std::uint32_t>(parsed.messageId);
  engine->id.assign(parsed.engineId.data, parsed.engineId.data + parsed.engineId.length);
  engine->boots = parsed.boots;
  engine->time = parsed.time;
  return true;
}

bool DecodeMessageId(const std::uint8_t* data, std::size_t length, std::uint32_t* messageId) {
  Parsed parsed;
  if (!Parse(data, length, &parsed)) return false;
  *messageId = static_cast<std::uint32_t>(parsed.messageId);
  return true;
}

bool Peer::Init(const User& user, const Engine& engine, const RequestTemplate& pdu,
                std::int64_t engineClockNs) {
  user_ = user;
  engine_ = engine;
  engineClockNs_ = engineClockNs;
  const Bytes empty = OctetString(Bytes{});
  const Bytes contextEngineId = OctetString(engine.id);
  const Bytes contents = Concat({&contextEngineId, &empty, &pdu.bytes});
  scoped_.bytes = Tlv(ber::kSequence, contents);
  scoped_.requestIdOffset = scoped_.bytes.size() - pdu.bytes.size() + pdu.requestIdOffset;
  const auto level = static_cast<std::uint8_t>(user.level);
  if (level & 1) {
    const Bytes authKey = LocalizeKey(user.authKey, engine.id);
    std::unique_ptr<EVP_MAC, decltype(&EVP_MAC_free)> hmac(EVP_MAC_fetch(nullptr, "HMAC", nullptr),
                                                           EVP_MAC_free);
    if (!hmac || authKey.size() != kShaSize) return false;
    mac_.reset(EVP_MAC_CTX_new(hmac.get()));
    char sha1[] = "SHA1";
    const OSSL_PARAM params[] = {OSSL_PARAM_construct_utf8_string(OSSL_MAC_PARAM_DIGEST, sha1, 0),
                                 OSSL_PARAM_construct_end()};
    if (!mac_ || EVP_MAC_init(mac_.get(), authKey.data(), authKey.size(), params) != 1)
      return false;
  }
  if (level & 2) {
    const Bytes privKey = LocalizeKey(user.privKey, engine.id);
    encrypt_.reset(EVP_CIPHER_CTX_new());
    decrypt_.reset(EVP_CIPHER_CTX_new());
    if (privKey.size() < kAesKeySize || !encrypt_ || !decrypt_ ||
        EVP_EncryptInit_ex2(encrypt_.get(), EVP_aes_128_cfb128(), privKey.data(), nullptr,
                            nullptr) != 1 ||
        EVP_DecryptInit_ex2(decrypt_.get(), EVP_aes_128_cfb128(), privKey.data(), nullptr,
                            nullptr) != 1) {
      return false;
    }
  }
  return true;
}

// HMAC-SHA-96 of the message with its digest field taken as zeros.
bool Peer::Digest(const std::uint8_t* data, std::size_t length, std::size_t digestOffset,
                  std::uint8_t* digest) {
  static const std::uint8_t kZeros[kDigestSize] = {};
  std::uint8_t full[EVP_MAX_MD_SIZE];
  std::size_t size = 0;
  if (digestOffset + kDigestSize > length || EVP_MAC_init(mac_.get(), nullptr, 0, nullptr) != 1 ||
      EVP_MAC_update(mac_.get(), data, digestOffset) != 1 ||
      EVP_MAC_update(mac_.get(), kZeros, kDigestSize) != 1 ||
      EVP_MAC_update(mac_.get(), data + digestOffset + kDigestSize,
                     length - digestOffset - kDigestSize) != 1 ||
      EVP_MAC_final(mac_.get(), full, &size, sizeof full) != 1 || size < kDigestSize) {
    return false;
  }
  std::memcpy(digest, full, kDigestSize);
  return true;
}

// AES-128-CFB with the IV boots ‖ time ‖ salt (big-endian).
bool Peer::Crypt(EVP_CIPHER_CTX* context, std::int64_t boots, std::int64_t time,
                 const std::uint8_t* salt, const std::uint8_t* in, std::size_t length,
                 std::uint8_t* out) {
  std::uint8_t iv[16];
  for (int i = 0; i < 4; ++i) {
    iv[i] = static_cast<std::uint8_t>(static_cast<std::uint64_t>(boots) >> (24 - 8 * i));
    iv[4 + i] = static_cast<std::uint8_t>(static_cast<std::uint64_t>(time) >> (24 - 8 * i));
  }
  std::memcpy(iv + 8, salt, kSaltSize);
  int written = 0;
  int last = 0;
  return EVP_CipherInit_ex2(context, nullptr, nullptr, iv, -1, nullptr) == 1 &&
         EVP_CipherUpdate(context, out, &written, in, static_cast<int>(length)) == 1 &&
         EVP_CipherFinal_ex(context, out + written, &last) == 1 &&
         static_cast<std::size_t>(written + last) == length;
}

std::size_t Peer::Encode(std::uint32_t requestId, std::int64_t nowNs, std::uint64_t salt,
                         std::uint8_t* out, std::size_t capacity) {
  const auto level = static_cast<std::uint8_t>(user_.level);
  Bytes scoped = scoped_.bytes;
  PatchRequestId(scoped.data(), scoped_, requestId);
  const std::int64_t time = engine_.time + (nowNs - engineClockNs_) / 1000000000;
  Envelope envelope{
      requestId, static_cast<std::uint8_t>(level | kReportable), &engine_, time, user_.name, {},
      {}};
  Bytes data;
  if (level & 2) {
    envelope.salt.resize(kSaltSize);
    for (std::size_t i = 0; i < kSaltSize; ++i)
      envelope.salt[i] = static_cast<std::uint8_t>(salt >> (56 - 8 * i));
    Bytes cipher(scoped.size());
    if (!Crypt(encrypt_.get(), engine_.boots, time, envelope.salt.data(), scoped.data(),
               scoped.size(), cipher.data())) {
      return 0;
    }
    data = OctetString(cipher);
  } else {
    data = std::move(scoped);
  }
  if (level & 1) envelope.digest.assign(kDigestSize, 0);
  std::size_t digestOffset = 0;
  const Bytes message = Wrap(envelope, data, &digestOffset);
  if (message.size() > capacity) return 0;
  std::memcpy(out, message.data(), message.size());
  if ((level & 1) && !Digest(out, message.size(), digestOffset, out + digestOffset)) return 0;
  return message.size();
}

bool Peer::Decode(const std::uint8_t* data, std::size_t length, ReplySummary* out,
                  std::vector<std::uint32_t>* reportOid) {
  Parsed parsed;
  if (!Parse(data, length, &parsed)) return false;
  const std::uint8_t level = parsed.flags & 3;
  if (level == 2) return false;  // privacy without authentication
  if (level & 1) {
    std::uint8_t digest[kDigestSize];
    if (!mac_ || parsed.digest.length != kDigestSize ||
        !Digest(data, length, static_cast<std::size_t>(parsed.digest.data - data), digest) ||
        CRYPTO_memcmp(digest, parsed.digest.data, kDigestSize) != 0) {
      return false;
    }
  }
  Reader scoped{nullptr, 0};
  if (level & 2) {
    Reader cipher{nullptr, 0};
    if (!decrypt_ || parsed.salt.length != kSaltSize ||
        !parsed.data.Expect(ber::kOctetString, &cipher))
      return false;
    scratch_.resize(cipher.length);
    if (!Crypt(decrypt_.get(), parsed.boots, parsed.time, parsed.salt.data, cipher.data,
               cipher.length, scratch_.data())) {
      return false;
    }
    Reader plain{scratch_.data(), scratch_.size()};
    if (!plain.Expect(ber::kSequence, &scoped)) return false;
  } else if (!parsed.data.Expect(ber::kSequence, &scoped)) {
    return false;
  }
  Reader contextEngineId{nullptr, 0}, contextName{nullptr, 0};
  if (!scoped.Expect(ber::kOctetString, &contextEngineId) ||
      !scoped.Expect(ber::kOctetString, &contextName)) {
    return false;
  }
  const std::uint8_t* pdu = scoped.data + scoped.position;
  const std::size_t pduLength = scoped.length - scoped.position;
  if (!DecodePdu(pdu, pduLength, out)) return false;
  const auto messageId = static_cast<std::uint32_t>(parsed.messageId);
  if (out->pduType == kPduReport) {
    out->requestId = messageId;
    if (reportOid != nullptr && !FirstName(pdu, pduLength, reportOid)) reportOid->clear();
    return true;
  }
  return level == static_cast<std::uint8_t>(user_.level) && out->requestId == messageId;
}

}  // namespace tessel::bench::v3
