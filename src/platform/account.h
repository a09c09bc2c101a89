// The cloud account that the device's owner signed in to.
#ifndef PLATFORM_ACCOUNT_H_
#define PLATFORM_ACCOUNT_H_

#include <cstddef>

namespace platform {

// The layout of the record that ARVOMYHUBAccountGet() fills, in bytes from its start. Three
// NUL-terminated texts are of use here; the rest is the platform's own.
constexpr size_t kAccountRecordBytes = 20256;
constexpr size_t kAccountEmailOffset = 0;
constexpr size_t kAccountFieldAOffset = 8192;
constexpr size_t kAccountFieldBOffset = 12288;

}  // namespace platform

extern "C" {

// Fills a zeroed record of platform::kAccountRecordBytes bytes with the signed-in account.
// A text that does not fit the room up to the next one is cut.
// Returns 0, or negative when no account is signed in or it cannot be read.
int ARVOMYHUBAccountGet(void* record);
}

#endif  // PLATFORM_ACCOUNT_H_
