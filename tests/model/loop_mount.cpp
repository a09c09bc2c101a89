// File systems of their own kinds, on loop devices.
#include "model/loop_mount.h"

#include <gmock/gmock.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>

#include "support/appliance.h"

namespace quendel::test {
namespace {

// mkfs.xfs wants 300 MiB. The images have holes: they cost what is written to them.
constexpr off_t kImageBytes = off_t{300} << 20;

// An appliance's /dev has no loop devices; the machine may still give it some.
void MakeLoopDevices() {
  constexpr unsigned kMiscMajor = 10;
  constexpr unsigned kLoopControlMinor = 237;
  constexpr unsigned kLoopMajor = 7;
  mknod("/dev/loop-control", S_IFCHR | 0600, makedev(kMiscMajor, kLoopControlMinor));
  for (unsigned i = 0; i < 64; ++i) {
    const std::string path = "/dev/loop" + std::to_string(i);
    mknod(path.c_str(), S_IFBLK | 0600, makedev(kLoopMajor, i));
  }
}

}  // namespace

std::string MountFileSystem(const std::string& type, const std::string& folder) {
  const std::string tool = "/usr/sbin/mkfs." + type;
  EXPECT_TRUE(Exists(tool)) << "script/bootstrap installs what makes " << type;
  const std::string image = "/tmp/" + type + ".img";
  WriteFile(image, "");
  EXPECT_EQ(truncate(image.c_str(), kImageBytes), 0);
  EXPECT_EQ(system((tool + " -q " + image + " >/dev/null 2>&1").c_str()), 0) << tool;
  std::filesystem::create_directories(folder);
  MakeLoopDevices();
  const std::string mount = "/bin/mount -t " + type + " -o loop " + image + " " + folder;
  const bool isMounted = system((mount + " 2>/tmp/mount.txt").c_str()) == 0;
  RemoveFile(image);  // what is mounted keeps it
  return isMounted ? ""
                   : "This machine mounts no " + type +
                         " on a loop device here: " + ReadFile("/tmp/mount.txt");
}

}  // namespace quendel::test
