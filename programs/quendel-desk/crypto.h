// What the desk takes from its TLS library: hashes, random texts, and a certificate of its own.
#ifndef QUENDEL_DESK_CRYPTO_H_
#define QUENDEL_DESK_CRYPTO_H_

#include <gnutls/crypto.h>

#include <string>
#include <string_view>

namespace quendeldesk {

class Sha256 {
 public:
  Sha256();
  Sha256(const Sha256&) = delete;
  Sha256& operator=(const Sha256&) = delete;
  ~Sha256();

  void Add(std::string_view bytes);

  // Returns the hash of what was added since the last call, in 64 lower-case hexadecimal digits.
  std::string Take();

 private:
  gnutls_hash_hd_t handle_ = nullptr;
};

std::string Sha256Of(std::string_view bytes);

// Returns twice so many hexadecimal digits that nobody can guess.
std::string RandomHex(size_t bytes);

// Compares in a time that tells nothing about where the two differ.
bool SameSecret(std::string_view left, std::string_view right);

struct Identity {
  std::string certificate;  // PEM
  std::string key;          // PEM
};

// Makes a key and a self-signed certificate for it. Devices do not check what it says.
Identity MakeIdentity(const std::string& host);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_CRYPTO_H_
