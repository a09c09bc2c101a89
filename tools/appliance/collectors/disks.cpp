// A user-defined collector: the room on the device's file systems, as JSON.
#include <json/json.h>
#include <mntent.h>
#include <sys/statvfs.h>

#include <cstdio>
#include <iostream>
#include <memory>

namespace {

struct CloseTable {
  void operator()(FILE* table) const { endmntent(table); }
};

Json::Value DescribeVolume(const mntent& entry, const struct statvfs& status) {
  Json::Value volume;
  volume["mounted_on"] = entry.mnt_dir;
  volume["type"] = entry.mnt_type;
  volume["size_bytes"] = Json::UInt64{status.f_blocks} * status.f_frsize;
  volume["read_only"] = (status.f_flag & ST_RDONLY) != 0;
  return volume;
}

}  // namespace

int main() {
  const std::unique_ptr<FILE, CloseTable> table(setmntent("/proc/self/mounts", "re"));
  if (!table) {
    perror("disks: /proc/self/mounts");
    return 1;
  }
  Json::Value volumes(Json::arrayValue);
  while (const mntent* entry = getmntent(table.get())) {
    struct statvfs status = {};
    if (statvfs(entry->mnt_dir, &status) == 0 && status.f_blocks > 0) {
      volumes.append(DescribeVolume(*entry, status));
    }
  }
  std::cout << volumes << '\n';
  return std::cout.flush() ? 0 : 1;
}
