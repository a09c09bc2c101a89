// What the desk takes from its TLS library: hashes, random texts, and a certificate of its own.
#include "crypto.h"

#include <gnutls/gnutls.h>
#include <gnutls/x509.h>

#include <ctime>
#include <memory>
#include <stdexcept>
#include <vector>

namespace quendeldesk {
namespace {

constexpr size_t kSha256Bytes = 32;
constexpr time_t kDay = 24L * 60 * 60;
constexpr time_t kYears = 20L * 365 * kDay;

void Require(int result, const char* what) {
  if (result < 0) {
    throw std::runtime_error(std::string(what) + ": " + gnutls_strerror(result));
  }
}

std::string Hex(const unsigned char* bytes, size_t size) {
  constexpr char kDigits[] = "0123456789abcdef";
  std::string text;
  text.reserve(2 * size);
  for (size_t i = 0; i < size; ++i) {
    text += kDigits[bytes[i] >> 4];
    text += kDigits[bytes[i] & 15];
  }
  return text;
}

struct FreeKey {
  void operator()(gnutls_x509_privkey_t key) const { gnutls_x509_privkey_deinit(key); }
};
struct FreeCertificate {
  void operator()(gnutls_x509_crt_t crt) const { gnutls_x509_crt_deinit(crt); }
};
using Key = std::unique_ptr<gnutls_x509_privkey_int, FreeKey>;
using Certificate = std::unique_ptr<gnutls_x509_crt_int, FreeCertificate>;

Key MakeKey() {
  gnutls_x509_privkey_t key = nullptr;
  Require(gnutls_x509_privkey_init(&key), "cannot make a key");
  Key owned(key);
  Require(gnutls_x509_privkey_generate(key, GNUTLS_PK_ECDSA,
                                       GNUTLS_CURVE_TO_BITS(GNUTLS_ECC_CURVE_SECP256R1), 0),
          "cannot make a key");
  return owned;
}

Certificate SignCertificate(gnutls_x509_privkey_t key, const std::string& host) {
  gnutls_x509_crt_t crt = nullptr;
  Require(gnutls_x509_crt_init(&crt), "cannot make a certificate");
  Certificate owned(crt);
  unsigned char serial[16];
  Require(gnutls_rnd(GNUTLS_RND_NONCE, serial, sizeof(serial)), "cannot make a certificate");
  serial[0] &= 0x7f;  // a serial number is positive
  const time_t now = time(nullptr);
  const auto size = static_cast<unsigned>(host.size());
  gnutls_x509_crt_set_version(crt, 3);
  gnutls_x509_crt_set_serial(crt, serial, sizeof(serial));
  gnutls_x509_crt_set_activation_time(crt, now - kDay);
  gnutls_x509_crt_set_expiration_time(crt, now + kYears);
  gnutls_x509_crt_set_dn_by_oid(crt, GNUTLS_OID_X520_COMMON_NAME, 0, host.c_str(), size);
  gnutls_x509_crt_set_subject_alt_name(crt, GNUTLS_SAN_DNSNAME, host.c_str(), size, 0);
  gnutls_x509_crt_set_key(crt, key);
  Require(gnutls_x509_crt_sign2(crt, crt, key, GNUTLS_DIG_SHA256, 0), "cannot make a certificate");
  return owned;
}

template <auto Export, typename Object>
std::string Pem(Object object) {
  gnutls_datum_t pem = {nullptr, 0};
  Require(Export(object, GNUTLS_X509_FMT_PEM, &pem), "cannot write a certificate");
  std::string text(reinterpret_cast<const char*>(pem.data), pem.size);
  gnutls_free(pem.data);
  return text;
}

}  // namespace

Sha256::Sha256() {
  Require(gnutls_hash_init(&handle_, GNUTLS_DIG_SHA256), "cannot hash");
}

Sha256::~Sha256() {
  gnutls_hash_deinit(handle_, nullptr);
}

void Sha256::Add(std::string_view bytes) {
  Require(gnutls_hash(handle_, bytes.data(), bytes.size()), "cannot hash");
}

std::string Sha256::Take() {
  unsigned char digest[kSha256Bytes];
  gnutls_hash_output(handle_, digest);
  return Hex(digest, sizeof(digest));
}

std::string Sha256Of(std::string_view bytes) {
  Sha256 hash;
  hash.Add(bytes);
  return hash.Take();
}

std::string RandomHex(size_t bytes) {
  std::vector<unsigned char> random(bytes);
  Require(gnutls_rnd(GNUTLS_RND_RANDOM, random.data(), bytes), "no random numbers");
  return Hex(random.data(), bytes);
}

bool SameSecret(std::string_view left, std::string_view right) {
  return left.size() == right.size() && gnutls_memcmp(left.data(), right.data(), left.size()) == 0;
}

Identity MakeIdentity(const std::string& host) {
  const Key key = MakeKey();
  const Certificate certificate = SignCertificate(key.get(), host);
  return {Pem<gnutls_x509_crt_export2>(certificate.get()),
          Pem<gnutls_x509_privkey_export2>(key.get())};
}

}  // namespace quendeldesk
