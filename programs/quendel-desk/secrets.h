// What a desk makes for itself when it starts for the first time.
#ifndef QUENDEL_DESK_SECRETS_H_
#define QUENDEL_DESK_SECRETS_H_

#include <string>

#include "crypto.h"
#include "descriptor.h"

namespace quendeldesk {

// The certificate and its key, "certificate.pem" and "key.pem" in the folder. Both are made when
// they are not there; who has others puts them there.
Identity OwnIdentity(const std::string& folder, const std::string& host);

// The word by which programs show that they may ask, "token" in the folder. Made likewise.
std::string OwnToken(const std::string& folder);

// Takes the folder for this process. Throws when another desk has it.
Descriptor LockFolder(const std::string& folder);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_SECRETS_H_
