// What the server got of a log.
#ifndef TESTS_QUENDELD_RECEIVED_H_
#define TESTS_QUENDELD_RECEIVED_H_

#include <set>
#include <string>

namespace quendel::test {

// Returns what the collections that arrived hold of the log "one", one after the other, each with
// what its archives hold behind that; the n-th is left unpacked in "/tmp/received/n". The requests
// in these files do not count.
std::string Received(const std::set<std::string>& refused = {});

}  // namespace quendel::test

#endif  // TESTS_QUENDELD_RECEIVED_H_
