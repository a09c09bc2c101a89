// File systems of their own kinds, on loop devices: what /tmp and /volume1 of an appliance are made
// of never gives a file the number of one that is gone.
#ifndef TESTS_MODEL_LOOP_MOUNT_H_
#define TESTS_MODEL_LOOP_MOUNT_H_

#include <string>

namespace quendel::test {

// Makes a file system of this type, "ext4", "xfs" or "btrfs", and mounts it at a folder, which is
// made; it goes with the appliance. Returns why there is none: this machine gives an appliance no
// loop devices or does not know the type. Empty when it is mounted. A missing tool fails the test.
std::string MountFileSystem(const std::string& type, const std::string& folder);

}  // namespace quendel::test

#endif  // TESTS_MODEL_LOOP_MOUNT_H_
