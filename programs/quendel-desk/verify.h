// Whether the database and the files agree, and a copy of both.
#ifndef QUENDEL_DESK_VERIFY_H_
#define QUENDEL_DESK_VERIFY_H_

#include <string>
#include <vector>

#include "desk.h"

namespace quendeldesk {

struct VerifyReport {
  long long files = 0;  // that the database names
  uint64_t bytes = 0;
  std::vector<std::string> faults;  // in words
};

// Reads every file and compares it with what the database says of it; `quick` compares sizes only.
// A desk may be serving meanwhile.
VerifyReport Verify(Archive& archive, bool quick);

// Writes a copy to a folder that must not be there; it is a desk's folder of its own. Files that
// come in meanwhile are not in it.
void Backup(Archive& archive, const std::string& folder);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_VERIFY_H_
