// What collection runs that died have left behind.
#ifndef QUENDELCTL_LEFTOVERS_H_
#define QUENDELCTL_LEFTOVERS_H_

#include <string>
#include <vector>

namespace quendelctl {

// Returns the paths of the collectors' markers, the archives and the run directories that dead runs
// left: those that this user owns and that have the very shape of a run's. While the collectors of
// a run live, by a program that does not take the collection lock, there are none. Hold the lock.
std::vector<std::string> FindLeftovers();

// Notes that a run directory, with the archive beside it, was kept on purpose.
void MarkAsKept(const std::string& directory);

// Removes the markers of collectors that do not live any more.
void RemoveStaleMarkers();

}  // namespace quendelctl

#endif  // QUENDELCTL_LEFTOVERS_H_
