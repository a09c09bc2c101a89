// MD5 of bytes that come in pieces.
#ifndef BASE_MD5_H_
#define BASE_MD5_H_

#include <openssl/md5.h>

#include <cstddef>

namespace quendel {

class Md5 {
 public:
  // What Finish() writes: 32 digits and a NUL.
  static constexpr size_t kTextBytes = 2 * MD5_DIGEST_LENGTH + 1;

  Md5();
  void Add(const void* bytes, size_t count);

  // Writes the digest of all bytes added, in lowercase hexadecimal digits. Nothing may be added
  // then.
  void Finish(char* text);

 private:
  MD5_CTX context_;
};

}  // namespace quendel

#endif  // BASE_MD5_H_
