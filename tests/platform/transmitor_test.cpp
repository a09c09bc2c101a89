// The performance figures of this device.
#include "platform/transmitor.h"

#include <gmock/gmock.h>
#include <json/writer.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <ctime>
#include <string>
#include <vector>

#include "platform/error.h"
#include "support/appliance.h"

using namespace quendel::test;

namespace {

Json::Value CurrentRequest() {
  Json::Value request;
  request["request"] = "curr";
  return request;
}

// The "data" of an answer.
Json::Value Figures() {
  Transmitor transmitor("localhost");
  EXPECT_EQ(transmitor.Transmit(CurrentRequest()), 0);
  Json::Value reply;
  EXPECT_EQ(transmitor.GetDataJson(reply), 0);
  EXPECT_EQ(reply["success"], true);
  EXPECT_EQ(reply.size(), 2U);
  return reply["data"];
}

// The element of a list whose "name" is this, or null.
Json::Value Named(const Json::Value& list, const std::string& name) {
  for (const Json::Value& element : list) {
    if (element["name"] == name) {
      return element;
    }
  }
  return Json::Value();
}

// Expects that an object has at least these members and that each is a number.
void ExpectNumbers(const Json::Value& object, const std::vector<std::string>& names) {
  for (const std::string& name : names) {
    EXPECT_TRUE(object.isMember(name) && object[name].isNumeric()) << name;
  }
}

// Puts a text in the place of one of the kernel's files.
void Pretend(const std::string& path, const std::string& text) {
  const std::string pretended = "/tmp/pretended" + path;
  WriteFile(pretended, text);
  ASSERT_EQ(mount(pretended.c_str(), path.c_str(), nullptr, MS_BIND, nullptr), 0) << path;
}

const std::vector<std::string> kDiskNumbers = {"reads",     "read_bytes",  "read_ms",
                                               "writes",    "write_bytes", "write_ms",
                                               "in_flight", "busy_ms",     "queue_ms"};

}  // namespace

TEST(TransmitorTest, AnswersForEveryCategory) {
  const Json::Value figures = Figures();
  EXPECT_EQ(figures.getMemberNames(), (Json::Value::Members{"DiskIO", "Memory", "Network",
                                                            "SpaceIO", "System", "iSCSI", "time"}));
  EXPECT_TRUE(figures["iSCSI"].isArray());
  EXPECT_TRUE(figures["iSCSI"].empty());
}

TEST(TransmitorTest, TellsTheTime) {
  const time_t before = time(nullptr);
  const time_t told = Figures()["time"].asInt64();
  EXPECT_GE(told, before);
  EXPECT_LE(told, time(nullptr));
}

TEST(TransmitorTest, RefusesAnotherHost) {
  Transmitor transmitor("elsewhere");
  EXPECT_LT(transmitor.Transmit(CurrentRequest()), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0100);
  Json::Value reply("kept");
  EXPECT_LT(transmitor.GetDataJson(reply), 0);
  EXPECT_EQ(reply, "kept");
}

TEST(TransmitorTest, RefusesAnotherRequest) {
  Json::Value more = CurrentRequest();
  more["more"] = 1;
  Json::Value other;
  other["request"] = "history";
  Json::Value number;
  number["request"] = 1;
  Json::Value empty(Json::objectValue);
  for (const Json::Value& request : {more, other, number, empty, Json::Value(), Json::Value("curr"),
                                     Json::Value(1), Json::Value(Json::arrayValue)}) {
    Transmitor transmitor("localhost");
    EXPECT_LT(transmitor.Transmit(request), 0) << request.toStyledString();
    Json::Value reply;
    EXPECT_LT(transmitor.GetDataJson(reply), 0);
  }
}

TEST(TransmitorTest, HasNoAnswerBeforeARequest) {
  Transmitor transmitor("localhost");
  Json::Value reply;
  EXPECT_LT(transmitor.GetDataJson(reply), 0);
  EXPECT_EQ(ALIBCErrGet(), 0x0a00);
}

TEST(TransmitorTest, GivesAnAnswerOnce) {
  Transmitor transmitor("localhost");
  Json::Value reply;
  transmitor.Transmit(CurrentRequest());
  EXPECT_EQ(transmitor.GetDataJson(reply), 0);
  EXPECT_LT(transmitor.GetDataJson(reply), 0);
  EXPECT_TRUE(reply.isMember("data"));
  // A request that fails takes the answer before it away.
  transmitor.Transmit(CurrentRequest());
  transmitor.Transmit(Json::Value());
  EXPECT_LT(transmitor.GetDataJson(reply), 0);
}

TEST(TransmitorTest, ReadsTheSystem) {
  Pretend("/proc/uptime", "4711.99 100.00\n");
  Pretend("/proc/loadavg", "0.25 1.50 12.00 3/90 1234\n");
  Pretend("/proc/stat",
          "cpu  100 200 300 400 500 600 700 800 9 9\ncpu0 1 2 3\nintr 71 1 2\nctxt 72\n"
          "btime 1\nprocesses 73\nprocs_running 4\nprocs_blocked 5\nsoftirq 1\n");
  const Json::Value system = Figures()["System"];
  EXPECT_EQ(system["uptime_s"], 4711U);
  EXPECT_EQ(system["load_1"], 0.25);
  EXPECT_EQ(system["load_5"], 1.5);
  EXPECT_EQ(system["load_15"], 12.0);
  EXPECT_EQ(system["interrupts"], 71U);
  EXPECT_EQ(system["context_switches"], 72U);
  EXPECT_EQ(system["forks"], 73U);
  EXPECT_EQ(system["processes_running"], 4U);
  EXPECT_EQ(system["processes_blocked"], 5U);
  EXPECT_EQ(system["cpu_count"], Json::Int64{sysconf(_SC_NPROCESSORS_ONLN)});
  EXPECT_EQ(system.size(), 11U);
  // The kernel counts ticks; the figures are milliseconds.
  const auto tick = static_cast<Json::UInt64>(1000 / sysconf(_SC_CLK_TCK));
  const Json::Value cpu = system["cpu"];
  Json::UInt64 ticks = 100;
  for (const char* name : {"user_ms", "nice_ms", "system_ms", "idle_ms", "iowait_ms", "irq_ms",
                           "softirq_ms", "steal_ms"}) {
    EXPECT_EQ(cpu[name], ticks * tick) << name;
    ticks += 100;
  }
  EXPECT_EQ(cpu.size(), 8U);
}

TEST(TransmitorTest, ReadsTheMemory) {
  Pretend("/proc/meminfo",
          "MemTotal:       24684084 kB\nMemFree: 1 kB\nMemAvailable: 2 kB\nBuffers: 3 kB\n"
          "Cached: 4 kB\nSwapCached: 99 kB\nSwapTotal: 5 kB\nSwapFree: 6 kB\nDirty: 7 kB\n"
          "Shmem: 8 kB\nSReclaimable: 9 kB\n");
  const Json::Value memory = Figures()["Memory"];
  EXPECT_EQ(memory["total_bytes"], Json::UInt64{24684084} * 1024);
  EXPECT_EQ(memory["free_bytes"], 1024U);
  EXPECT_EQ(memory["available_bytes"], 2048U);
  EXPECT_EQ(memory["buffers_bytes"], 3072U);
  EXPECT_EQ(memory["cached_bytes"], 4096U);
  EXPECT_EQ(memory["swap_total_bytes"], 5120U);
  EXPECT_EQ(memory["swap_free_bytes"], 6144U);
  EXPECT_EQ(memory["dirty_bytes"], 7168U);
  EXPECT_EQ(memory["shared_bytes"], 8192U);
  EXPECT_EQ(memory["reclaimable_bytes"], 9216U);
  EXPECT_EQ(memory.size(), 10U);
}

TEST(TransmitorTest, ReadsTheNetwork) {
  // The kernel does not let its own file be covered, only the folder.
  WriteFile("/tmp/net/dev",
            "Inter-|   Receive          |  Transmit\n face |bytes packets errs|bytes\n"
            "    lo: 1 2 3 4 5 6 7 8 9 10 11 12 13 14 15 16\n"
            "eth0:18446744073709551615 2 3 4 0 0 0 0 9 10 11 12 0 0 0 0\n");
  ASSERT_EQ(mount("/tmp/net", "/proc/self/net", nullptr, MS_BIND, nullptr), 0);
  const Json::Value network = Figures()["Network"];
  ASSERT_EQ(network.size(), 2U);
  const Json::Value lo = network[0];
  EXPECT_EQ(lo["name"], "lo");
  EXPECT_EQ(lo["rx_bytes"], 1U);
  EXPECT_EQ(lo["rx_packets"], 2U);
  EXPECT_EQ(lo["rx_errors"], 3U);
  EXPECT_EQ(lo["rx_dropped"], 4U);
  EXPECT_EQ(lo["tx_bytes"], 9U);
  EXPECT_EQ(lo["tx_packets"], 10U);
  EXPECT_EQ(lo["tx_errors"], 11U);
  EXPECT_EQ(lo["tx_dropped"], 12U);
  EXPECT_EQ(lo.size(), 9U);
  EXPECT_EQ(network[1]["name"], "eth0");
  EXPECT_EQ(network[1]["rx_bytes"].asUInt64(), 18446744073709551615U);
}

TEST(TransmitorTest, ReadsTheDisks) {
  mkdir("/tmp/block", 0700);
  WriteFile("/tmp/block/sdb/size", "2000\n");
  WriteFile("/tmp/block/sdb/stat", "   1 2 3 4 5 6 7 8 9 10 11 12 13\n");
  WriteFile("/tmp/block/sda/size", "4000000000\n");
  WriteFile("/tmp/block/loop0/size", "0\n");
  WriteFile("/tmp/block/loop0/stat", "0 0 0 0 0 0 0 0 0 0 0\n");
  ASSERT_EQ(mount("/tmp/block", "/sys/block", nullptr, MS_BIND, nullptr), 0);
  const Json::Value disks = Figures()["DiskIO"];
  ASSERT_EQ(disks.size(), 2U);
  EXPECT_EQ(disks[0]["name"], "sda");
  EXPECT_EQ(disks[0]["size_bytes"].asUInt64(), Json::UInt64{4000000000} * 512);
  EXPECT_EQ(disks[0].size(), 2U);  // what cannot be read is left out
  const Json::Value sdb = disks[1];
  EXPECT_EQ(sdb["name"], "sdb");
  EXPECT_EQ(sdb["reads"], 1U);
  EXPECT_EQ(sdb["read_bytes"], 3U * 512);
  EXPECT_EQ(sdb["read_ms"], 4U);
  EXPECT_EQ(sdb["writes"], 5U);
  EXPECT_EQ(sdb["write_bytes"], 7U * 512);
  EXPECT_EQ(sdb["write_ms"], 8U);
  EXPECT_EQ(sdb["in_flight"], 9U);
  EXPECT_EQ(sdb["busy_ms"], 10U);
  EXPECT_EQ(sdb["queue_ms"], 11U);
  EXPECT_EQ(sdb.size(), 11U);
}

TEST(TransmitorTest, ReadsTheSpaceOfVolumes) {
  mkdir("/volume7", 0700);
  ASSERT_EQ(mount("seven", "/volume7", "tmpfs", 0, "size=1m,nr_inodes=100"), 0);
  WriteFile("/volume7/file", std::string(100000, 'x'));
  const Json::Value volume = Named(Figures()["SpaceIO"], "/volume7");
  ASSERT_TRUE(volume.isObject());
  struct statvfs space;
  ASSERT_EQ(statvfs("/volume7", &space), 0);
  EXPECT_EQ(volume["device"], "seven");
  EXPECT_EQ(volume["type"], "tmpfs");
  EXPECT_EQ(volume["total_bytes"], 1024U * 1024U);
  EXPECT_EQ(volume["free_bytes"], Json::UInt64{space.f_bfree * space.f_frsize});
  EXPECT_LT(volume["free_bytes"].asUInt64(), 1024U * 1024U - 100000U);
  EXPECT_EQ(volume["available_bytes"], Json::UInt64{space.f_bavail * space.f_frsize});
  EXPECT_EQ(volume["files"], 100U);
  EXPECT_EQ(volume["free_files"], Json::UInt64{space.f_ffree});
  EXPECT_EQ(volume.size(), 8U);  // no device, no input and output of it
}

TEST(TransmitorTest, CountsAFileSystemOnce) {
  mkdir("/volume7", 0700);
  mkdir("/volume8", 0700);
  ASSERT_EQ(mount("seven", "/volume7", "tmpfs", 0, nullptr), 0);
  ASSERT_EQ(mount("/volume7", "/volume8", nullptr, MS_BIND, nullptr), 0);
  const Json::Value volumes = Figures()["SpaceIO"];
  EXPECT_TRUE(Named(volumes, "/volume7").isObject());
  EXPECT_TRUE(Named(volumes, "/volume8").isNull());
}

TEST(TransmitorTest, LeavesOtherFileSystemsOut) {
  for (const char* path : {"/volume", "/volume7x", "/tmp/volume7", "/volumes"}) {
    mkdir(path, 0700);
    ASSERT_EQ(mount("other", path, "tmpfs", 0, nullptr), 0);
  }
  const Json::Value volumes = Figures()["SpaceIO"];
  for (const char* path : {"/volume", "/volume7x", "/tmp/volume7", "/volumes", "/proc"}) {
    EXPECT_TRUE(Named(volumes, path).isNull()) << path;
  }
}

// One that has gone away would not answer.
TEST(TransmitorTest, AsksNoFileSystemOfAServer) {
  mkdir("/volume7", 0700);
  for (const char* source : {"server:/export", "user@server:/export", "//server/share"}) {
    ASSERT_EQ(mount(source, "/volume7", "tmpfs", 0, nullptr), 0);
    EXPECT_TRUE(Named(Figures()["SpaceIO"], "/volume7").isNull()) << source;
    ASSERT_EQ(umount("/volume7"), 0);
  }
}

TEST(TransmitorTest, DecodesNamesOfVolumes) {
  mkdir("/volume7", 0700);
  ASSERT_EQ(mount("/dev/not here", "/volume7", "tmpfs", 0, nullptr), 0);
  EXPECT_EQ(Named(Figures()["SpaceIO"], "/volume7")["device"], "/dev/not here");
}

TEST(TransmitorTest, TellsTheInputAndOutputBelowAVolume) {
  // The machine's own disk is shown wherever its folders are.
  struct stat status;
  mkdir("/volume7", 0700);
  ASSERT_EQ(mount("seven", "/volume7", "tmpfs", 0, nullptr), 0);
  ASSERT_EQ(stat("/volume7", &status), 0);
  const std::string number =
      std::to_string(major(status.st_dev)) + ":" + std::to_string(minor(status.st_dev));
  WriteFile("/tmp/dev/" + number + "/stat", "1 2 3 4 5 6 7 8 9 10 11\n");
  ASSERT_EQ(mount("/tmp/dev", "/sys/dev/block", nullptr, MS_BIND, nullptr), 0);
  const Json::Value volume = Named(Figures()["SpaceIO"], "/volume7");
  ExpectNumbers(volume, kDiskNumbers);
  EXPECT_EQ(volume["write_bytes"], 7U * 512);
}

TEST(TransmitorTest, LeavesOutWhatCannotBeRead) {
  for (const char* path : {"/proc/uptime", "/proc/loadavg", "/proc/stat", "/proc/meminfo"}) {
    ASSERT_EQ(mount("/dev/null", path, nullptr, MS_BIND, nullptr), 0);
  }
  const Json::Value figures = Figures();
  EXPECT_EQ(figures["System"].getMemberNames(), (Json::Value::Members{"cpu", "cpu_count"}));
  EXPECT_TRUE(figures["System"]["cpu"].isObject());
  EXPECT_TRUE(figures["System"]["cpu"].empty());
  EXPECT_TRUE(figures["Memory"].isObject());
  EXPECT_TRUE(figures["Memory"].empty());
}

TEST(TransmitorTest, ReadsTheRealKernel) {
  const Json::Value figures = Figures();
  EXPECT_GT(figures["System"]["uptime_s"].asUInt64(), 0U);
  EXPECT_GT(figures["System"]["cpu"]["user_ms"].asUInt64(), 0U);
  EXPECT_GT(figures["System"]["forks"].asUInt64(), 0U);
  EXPECT_GT(figures["Memory"]["total_bytes"].asUInt64(), 1024U * 1024U);
  EXPECT_TRUE(Named(figures["Network"], "lo").isObject());
}
