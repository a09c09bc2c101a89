// The device's figures as they stand now, from what the kernel tells in /proc and /sys.
#include "platform/standalone/performance_figures.h"

#include <dirent.h>
#include <mntent.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <memory>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/standalone/file_io.h"

namespace platform {
namespace {

constexpr Json::UInt64 kBytesPerKibibyte = 1024;
constexpr Json::UInt64 kBytesPerSector = 512;  // whatever the disk's own sectors are
constexpr Json::UInt64 kMillisecondsPerSecond = 1000;

// A figure's name, and where in its line of numbers it stands.
struct Field {
  const char* name;
  size_t place;
  Json::UInt64 unit;
};

constexpr Field kDiskFields[] = {
    {"reads", 0, 1},
    {"read_bytes", 2, kBytesPerSector},
    {"read_ms", 3, 1},
    {"writes", 4, 1},
    {"write_bytes", 6, kBytesPerSector},
    {"write_ms", 7, 1},
    {"in_flight", 8, 1},
    {"busy_ms", 9, 1},
    {"queue_ms", 10, 1},
};

constexpr Field kNetworkFields[] = {
    {"rx_bytes", 0, 1}, {"rx_packets", 1, 1}, {"rx_errors", 2, 1},  {"rx_dropped", 3, 1},
    {"tx_bytes", 8, 1}, {"tx_packets", 9, 1}, {"tx_errors", 10, 1}, {"tx_dropped", 11, 1},
};

// A figure's name here and in the kernel's file.
struct NamedFigure {
  const char* name;
  std::string_view kernelName;
};

constexpr NamedFigure kMemoryFigures[] = {
    {"total_bytes", "MemTotal:"},
    {"free_bytes", "MemFree:"},
    {"available_bytes", "MemAvailable:"},
    {"buffers_bytes", "Buffers:"},
    {"cached_bytes", "Cached:"},
    {"shared_bytes", "Shmem:"},
    {"reclaimable_bytes", "SReclaimable:"},
    {"dirty_bytes", "Dirty:"},
    {"swap_total_bytes", "SwapTotal:"},
    {"swap_free_bytes", "SwapFree:"},
};

constexpr NamedFigure kSystemFigures[] = {
    {"interrupts", "intr"},
    {"context_switches", "ctxt"},
    {"forks", "processes"},
    {"processes_running", "procs_running"},
    {"processes_blocked", "procs_blocked"},
};

constexpr const char* kCpuTimes[] = {"user_ms",   "nice_ms", "system_ms",  "idle_ms",
                                     "iowait_ms", "irq_ms",  "softirq_ms", "steal_ms"};

// Takes the next word, what stands between blanks, off the front of a text; empty at the end.
std::string_view TakeWord(std::string_view& text) {
  text.remove_prefix(std::min(text.find_first_not_of(" \t\n"), text.size()));
  const std::string_view word = text.substr(0, text.find_first_of(" \t\n"));
  text.remove_prefix(word.size());
  return word;
}

std::string_view TakeLine(std::string_view& text) {
  const std::string_view line = text.substr(0, text.find('\n'));
  text.remove_prefix(std::min(line.size() + 1, text.size()));
  return line;
}

Json::UInt64 NumberIn(std::string_view word) {
  Json::UInt64 number = 0;
  std::from_chars(word.data(), word.data() + word.size(), number);
  return number;
}

std::vector<Json::UInt64> NumbersIn(std::string_view text) {
  std::vector<Json::UInt64> numbers;
  for (std::string_view word = TakeWord(text); !word.empty(); word = TakeWord(text)) {
    numbers.push_back(NumberIn(word));
  }
  return numbers;
}

// An empty text stands for a file that cannot be read.
std::string TextOf(const std::string& path) {
  std::string text;
  return ReadWholeFile(path.c_str(), text) ? text : std::string();
}

template <size_t count>
void AddFields(const Field (&fields)[count], const std::vector<Json::UInt64>& numbers,
               Json::Value& figures) {
  for (const Field& field : fields) {
    if (field.place < numbers.size()) {
      figures[field.name] = numbers[field.place] * field.unit;
    }
  }
}

// Adds those figures of a file of lines "name number" that are wanted.
template <size_t count>
void AddNamed(const NamedFigure (&wanted)[count], std::string_view text, Json::UInt64 unit,
              Json::Value& figures) {
  while (!text.empty()) {
    std::string_view line = TakeLine(text);
    const std::string_view name = TakeWord(line);
    for (const NamedFigure& figure : wanted) {
      if (figure.kernelName == name) {
        figures[figure.name] = NumberIn(TakeWord(line)) * unit;
      }
    }
  }
}

Json::Value CpuTimes(std::string_view stat) {
  Json::Value times(Json::objectValue);
  std::string_view line = TakeLine(stat);
  TakeWord(line);
  const std::vector<Json::UInt64> ticks = NumbersIn(line);
  const auto ticksPerSecond = static_cast<Json::UInt64>(sysconf(_SC_CLK_TCK));
  for (size_t i = 0; i < std::min(ticks.size(), std::size(kCpuTimes)); ++i) {
    times[kCpuTimes[i]] = ticks[i] * kMillisecondsPerSecond / ticksPerSecond;
  }
  return times;
}

void AddLoad(std::string_view loadavg, Json::Value& system) {
  for (const char* name : {"load_1", "load_5", "load_15"}) {
    const std::string_view word = TakeWord(loadavg);
    if (!word.empty()) {
      system[name] = strtod(std::string(word).c_str(), nullptr);
    }
  }
}

Json::Value SystemFigures() {
  Json::Value system(Json::objectValue);
  const std::string uptime = TextOf("/proc/uptime");
  if (!uptime.empty()) {
    system["uptime_s"] = NumberIn(uptime);
  }
  AddLoad(TextOf("/proc/loadavg"), system);
  const std::string stat = TextOf("/proc/stat");
  AddNamed(kSystemFigures, stat, 1, system);
  system["cpu_count"] = static_cast<Json::Int64>(sysconf(_SC_NPROCESSORS_ONLN));
  system["cpu"] = CpuTimes(stat);
  return system;
}

Json::Value MemoryFigures() {
  Json::Value memory(Json::objectValue);
  AddNamed(kMemoryFigures, TextOf("/proc/meminfo"), kBytesPerKibibyte, memory);
  return memory;
}

// An interface's line begins with its name and a colon; the two lines of headings have no colon.
Json::Value NetworkFigures() {
  Json::Value interfaces(Json::arrayValue);
  const std::string text = TextOf("/proc/net/dev");
  for (std::string_view rest = text; !rest.empty();) {
    std::string_view line = TakeLine(rest);
    const size_t colon = line.find(':');
    if (colon == std::string_view::npos) {
      continue;
    }
    std::string_view name = line.substr(0, colon);
    Json::Value figures(Json::objectValue);
    figures["name"] = std::string(TakeWord(name));
    AddFields(kNetworkFields, NumbersIn(line.substr(colon + 1)), figures);
    interfaces.append(figures);
  }
  return interfaces;
}

std::vector<std::string> NamesIn(const char* path) {
  std::vector<std::string> names;
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(opendir(path), closedir);
  for (const dirent* entry = stream ? readdir(stream.get()) : nullptr; entry != nullptr;
       entry = readdir(stream.get())) {
    if (entry->d_name[0] != '.') {
      names.emplace_back(entry->d_name);
    }
  }
  std::sort(names.begin(), names.end());
  return names;
}

// A disk without a size is a place for one that is not there.
Json::Value DiskFigures() {
  Json::Value disks(Json::arrayValue);
  for (const std::string& name : NamesIn("/sys/block")) {
    const std::string folder = "/sys/block/" + name;
    const Json::UInt64 sectors = NumberIn(TextOf(folder + "/size"));
    if (sectors == 0) {
      continue;
    }
    Json::Value figures(Json::objectValue);
    figures["name"] = name;
    figures["size_bytes"] = sectors * kBytesPerSector;
    AddFields(kDiskFields, NumbersIn(TextOf(folder + "/stat")), figures);
    disks.append(figures);
  }
  return disks;
}

// Whether the source of a file system is "host:/path" or "//host/share".
bool IsOfAServer(std::string_view source) {
  return source.substr(0, 2) == "//" || source.find(":/") != std::string_view::npos;
}

// A volume is a file system on a local block device, or whatever is mounted as "/volume<n>" and
// does not come from a server: one that has gone away would hold the answer up.
bool IsVolume(const mntent& mount) {
  const std::string_view directory = mount.mnt_dir;
  constexpr std::string_view kDevicePrefix = "/dev/";
  constexpr std::string_view kVolumePrefix = "/volume";
  if (std::string_view(mount.mnt_fsname).substr(0, kDevicePrefix.size()) == kDevicePrefix) {
    return true;
  }
  return !IsOfAServer(mount.mnt_fsname) &&
         directory.substr(0, kVolumePrefix.size()) == kVolumePrefix &&
         directory.size() > kVolumePrefix.size() &&
         directory.find_first_not_of("0123456789", kVolumePrefix.size()) == std::string_view::npos;
}

void AddSpace(const struct statvfs& space, Json::Value& figures) {
  const Json::UInt64 unit = space.f_frsize;
  figures["total_bytes"] = space.f_blocks * unit;
  figures["free_bytes"] = space.f_bfree * unit;
  figures["available_bytes"] = space.f_bavail * unit;
  figures["files"] = static_cast<Json::UInt64>(space.f_files);
  figures["free_files"] = static_cast<Json::UInt64>(space.f_ffree);
}

// One file system counts once, under the first place that it is mounted at.
void AddVolume(const mntent& mount, std::set<dev_t>& seen, Json::Value& volumes) {
  struct stat status;
  struct statvfs space;
  if (!IsVolume(mount) || stat(mount.mnt_dir, &status) != 0 ||
      statvfs(mount.mnt_dir, &space) != 0 || !seen.insert(status.st_dev).second) {
    return;
  }
  Json::Value figures(Json::objectValue);
  figures["name"] = mount.mnt_dir;
  figures["device"] = mount.mnt_fsname;
  figures["type"] = mount.mnt_type;
  AddSpace(space, figures);
  char path[64];
  snprintf(path, sizeof(path), "/sys/dev/block/%u:%u/stat", major(status.st_dev),
           minor(status.st_dev));
  AddFields(kDiskFields, NumbersIn(TextOf(path)), figures);
  volumes.append(figures);
}

Json::Value SpaceFigures() {
  constexpr size_t kMountLineBytes = 8192;
  Json::Value volumes(Json::arrayValue);
  const std::unique_ptr<FILE, int (*)(FILE*)> mounts(setmntent("/proc/self/mounts", "re"),
                                                     endmntent);
  std::vector<char> line(kMountLineBytes);
  mntent mount;
  std::set<dev_t> seen;
  while (mounts && getmntent_r(mounts.get(), &mount, line.data(), kMountLineBytes) != nullptr) {
    AddVolume(mount, seen, volumes);
  }
  return volumes;
}

}  // namespace

Json::Value CurrentFigures() {
  Json::Value figures(Json::objectValue);
  figures["time"] = static_cast<Json::Int64>(time(nullptr));
  figures["System"] = SystemFigures();
  figures["DiskIO"] = DiskFigures();
  figures["SpaceIO"] = SpaceFigures();
  figures["Network"] = NetworkFigures();
  figures["Memory"] = MemoryFigures();
  figures["iSCSI"] = Json::Value(Json::arrayValue);  // a plain Linux has no target of its own
  return figures;
}

}  // namespace platform
