// What runs and uploads that died leave behind.
#ifndef QUENDEL_WORKER_LEFTOVERS_H_
#define QUENDEL_WORKER_LEFTOVERS_H_

#include <filesystem>
#include <set>

namespace quendel_worker {

// The directories under /tmp that only a collection run of this user can have made.
std::set<std::filesystem::path> RunDirectories();

}  // namespace quendel_worker

#endif  // QUENDEL_WORKER_LEFTOVERS_H_
