// Archives that were made while the server was away: "/var/lib/quendel/outbox" holds a folder for
// each, named by the second in which its run began, with the archive in it under its own name.
#ifndef QUENDEL_WORKER_OUTBOX_H_
#define QUENDEL_WORKER_OUTBOX_H_

#include <json/value.h>

#include <cstdint>
#include <string>

namespace quendel_worker {

inline constexpr char kOutbox[] = "/var/lib/quendel/outbox";

// {"archives", "bytes"}
Json::Value DescribeOutbox();

// Puts the archive into the outbox and removes it from its place. It is on the disk when this
// returns. Returns false, and logs why, when it could not be.
bool PutIntoOutbox(const std::string& archive, int64_t started);

}  // namespace quendel_worker

#endif  // QUENDEL_WORKER_OUTBOX_H_
