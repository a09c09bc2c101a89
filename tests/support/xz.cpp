// The .xz format, without starting a program.
#include "support/xz.h"

#include <lzma.h>

#include <cstdint>
#include <limits>

namespace quendel::test {
namespace {

// Runs all of `input` through a coder. Returns nothing when it does not come to the stream's end.
std::optional<std::string> Code(lzma_stream& stream, const std::string& input) {
  std::string output;
  uint8_t block[1 << 14];
  stream.next_in = reinterpret_cast<const uint8_t*>(input.data());
  stream.avail_in = input.size();
  lzma_ret result = LZMA_OK;
  while (result == LZMA_OK) {
    stream.next_out = block;
    stream.avail_out = sizeof block;
    result = lzma_code(&stream, LZMA_FINISH);
    output.append(reinterpret_cast<char*>(block), sizeof block - stream.avail_out);
  }
  lzma_end(&stream);
  return result == LZMA_STREAM_END ? std::optional<std::string>(output) : std::nullopt;
}

}  // namespace

std::string Xz(const std::string& plain) {
  lzma_stream stream = LZMA_STREAM_INIT;
  if (lzma_easy_encoder(&stream, 0, LZMA_CHECK_CRC64) != LZMA_OK) {
    return {};
  }
  return Code(stream, plain).value_or("");
}

std::optional<std::string> Unxz(const std::string& bytes) {
  lzma_stream stream = LZMA_STREAM_INIT;
  constexpr uint64_t kAnyMemory = std::numeric_limits<uint64_t>::max();
  if (lzma_stream_decoder(&stream, kAnyMemory, LZMA_CONCATENATED) != LZMA_OK) {
    return std::nullopt;
  }
  return Code(stream, bytes);
}

}  // namespace quendel::test
