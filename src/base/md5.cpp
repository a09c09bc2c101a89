// MD5 of bytes that come in pieces.
#include "base/md5.h"

#include <cstdio>

// OpenSSL 3 marks these calls as old. The digest only tells whether a text has changed, and it is
// what the state of every installed collector holds.
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"

namespace quendel {

Md5::Md5() {
  MD5_Init(&context_);
}

void Md5::Add(const void* bytes, size_t count) {
  MD5_Update(&context_, bytes, count);
}

void Md5::Finish(char* text) {
  unsigned char digest[MD5_DIGEST_LENGTH];
  MD5_Final(digest, &context_);
  for (const unsigned char byte : digest) {
    text += snprintf(text, 3, "%02x", byte);
  }
}

}  // namespace quendel
