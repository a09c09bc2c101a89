// How fast logs are collected, against programs that do the same work on the same bytes, how much
// memory it takes, and how both grow.
//
// Runs on an appliance of its own; script/bench starts it. With one argument, a folder, it collects
// into that and prints its peak memory in KiB: the benchmarks of memory start it so.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <map>
#include <string>
#include <vector>

#include "quendel.h"

namespace {

namespace fs = std::filesystem;

constexpr char kConfFolder[] = "/usr/arvo/etc/quendel";
constexpr char kUpdateFile[] = "/tmp/quendel/quendel.log.update.conf";
constexpr char kRunFolder[] = "/tmp/run";
constexpr char kProcessor[] = "processor_ms";
constexpr char kPeak[] = "peak_MiB";
constexpr int64_t kGibibyte = int64_t{1} << 30;

constexpr char kFreshState[] =
    "last_hash=\"\"\ntar_log_inode=\"\"\nlast_byte=\"\"\ntotal_byte=\"\"\ninode=\"\"\n";

// Ends the benchmark: figures of half a scenario would be worse than none.
[[noreturn]] void Fail(const std::string& what) {
  perror(what.c_str());
  exit(1);
}

void Require(bool holds, const std::string& what) {
  if (!holds) {
    Fail(what);
  }
}

void WriteText(const std::string& path, const std::string& text) {
  std::ofstream out(path, std::ios::binary);
  out << text << std::flush;
  Require(static_cast<bool>(out), path);
}

// Appends lines as a log has them, about 90 bytes each.
void AppendLines(const std::string& path, int64_t bytes) {
  std::string block;
  for (int i = 0; block.size() < (1 << 20); ++i) {
    block += "2024-03-05T07:08:09.123456+00:00 appliance service[" +
             std::to_string(1000 + i % 9000) + "]: request " + std::to_string(i * 7919 % 1000003) +
             " done\n";
  }
  std::ofstream out(path, std::ios::binary | std::ios::app);
  for (int64_t written = 0; written < bytes; written += static_cast<int64_t>(block.size())) {
    out << block;
  }
  out << std::flush;
  Require(static_cast<bool>(out), path);
}

void ResetFolders() {
  for (const char* folder : {kConfFolder, kRunFolder, "/tmp/quendel"}) {
    fs::remove_all(folder);
    fs::create_directories(folder);
  }
}

void EmptyRunFolder() {
  fs::remove_all(kRunFolder);
  fs::create_directory(kRunFolder);
}

void InstallLog(const std::string& name, const std::string& path) {
  WriteText(std::string(kConfFolder) + "/quendel.log." + name,
            "name=" + name + "\npath=" + path + "\n" + kFreshState);
}

void CollectOnce() {
  Require(QUENDELCollectLog(kRunFolder) == 0, "collect");
}

void Commit() {
  Require(QUENDELUpdateCollectConf(kUpdateFile) == 0, "commit");
}

// Runs a program to its end, its output going to a file.
void RunProgram(std::vector<std::string> words, const std::string& output) {
  std::vector<char*> arguments;
  for (std::string& word : words) {
    arguments.push_back(word.data());
  }
  arguments.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 1, output.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
  pid_t child = 0;
  Require(posix_spawn(&child, arguments[0], &actions, nullptr, arguments.data(), environ) == 0,
          words[0]);
  posix_spawn_file_actions_destroy(&actions);
  int status = -1;
  Require(waitpid(child, &status, 0) == child && status == 0, words[0]);
}

// A log of one collected line and new ones behind it, on a file system of the benchmark's choice.
std::string MakeGrownLog(const std::string& folder, int64_t bytes) {
  ResetFolders();
  fs::remove_all(folder);
  fs::create_directories(folder);
  const std::string log = folder + "/messages";
  WriteText(log, "first line\n");
  InstallLog("m", log);
  CollectOnce();
  Commit();
  AppendLines(log, bytes);
  EmptyRunFolder();
  return log;
}

// Where a log lies for a run that writes below /tmp: there too, or on another file system.
std::string FolderFor(const benchmark::State& state) {
  return state.range(0) == 0 ? "/tmp/logs" : "/volume1/logs";
}

// The processor time, in milliseconds, that this process and the programs it ran have taken.
double ProcessorTime() {
  double milliseconds = 0;
  for (const int who : {RUSAGE_SELF, RUSAGE_CHILDREN}) {
    rusage usage = {};
    Require(getrusage(who, &usage) == 0, "getrusage");
    for (const timeval& time : {usage.ru_utime, usage.ru_stime}) {
      milliseconds +=
          static_cast<double>(time.tv_sec) * 1e3 + static_cast<double>(time.tv_usec) / 1e3;
    }
  }
  return milliseconds;
}

// Times one way to bring a log's bytes into the run folder, which is emptied in between.
template <typename Copy>
void TimeCopy(benchmark::State& state, const Copy& copy) {
  double processor = 0;
  for (auto unused : state) {
    const double before = ProcessorTime();
    copy();
    processor += ProcessorTime() - before;
    state.PauseTiming();
    EmptyRunFolder();
    state.ResumeTiming();
  }
  state.SetBytesProcessed(state.iterations() * kGibibyte);
  state.counters[kProcessor] = processor / static_cast<double>(state.iterations());
}

void DiffCopy(benchmark::State& state) {
  MakeGrownLog(FolderFor(state), kGibibyte);
  TimeCopy(state, [] {
    CollectOnce();
    Require(fs::file_size(std::string(kRunFolder) + "/m") >= kGibibyte, "the new lines");
  });
}

void WholeCopy(benchmark::State& state) {
  const std::string log = MakeGrownLog(FolderFor(state), kGibibyte);
  InstallLog("m", log);
  TimeCopy(state, [] { CollectOnce(); });
}

void Cp(benchmark::State& state) {
  const std::string log = MakeGrownLog(FolderFor(state), kGibibyte);
  TimeCopy(state, [&] {
    RunProgram({"/bin/cp", log, std::string(kRunFolder) + "/m"}, "/dev/null");
  });
}

void Logtail(benchmark::State& state) {
  const std::string log = MakeGrownLog(FolderFor(state), kGibibyte);
  struct stat status = {};
  Require(stat(log.c_str(), &status) == 0, log);
  WriteText("/tmp/offset", std::to_string(status.st_ino) + "\n11\n");
  TimeCopy(state, [&] {
    RunProgram({"/usr/sbin/logtail", "-t", "-f", log, "-o", "/tmp/offset"},
               std::string(kRunFolder) + "/m");
  });
}

// The most memory that this process has held at one time.
int64_t PeakKibibytes() {
  std::ifstream status("/proc/self/status");
  for (std::string word; status >> word;) {
    if (word == "VmHWM:") {
      int64_t kibibytes = 0;
      status >> kibibytes;
      return kibibytes;
    }
  }
  Fail("VmHWM");
}

// The peak memory of a fresh process that collects a log of so many MiB, `whole` or its new lines.
void Memory(benchmark::State& state, bool whole) {
  const char* folder = getenv("QUENDEL_BENCH_DATA");
  const std::string log = MakeGrownLog(folder, state.range(0) << 20);
  if (whole) {
    InstallLog("m", log);
  }
  const std::string run = std::string(folder) + "/run";
  int64_t kibibytes = 0;
  for (auto unused : state) {
    fs::remove_all(run);
    fs::create_directories(run);
    RunProgram({"/proc/self/exe", run}, "/tmp/peak");
    std::ifstream("/tmp/peak") >> kibibytes;
  }
  Require(kibibytes > 0, "the peak memory");
  state.counters[kPeak] = static_cast<double>(kibibytes) / 1024;
  fs::remove_all(folder);
}

void MemoryOfDiffCopy(benchmark::State& state) {
  Memory(state, false);
}

void MemoryOfWholeCopy(benchmark::State& state) {
  Memory(state, true);
}

void InstallLogs(int64_t count) {
  ResetFolders();
  fs::remove_all("/volume1/logs");
  fs::create_directories("/volume1/logs");
  for (int64_t i = 0; i < count; ++i) {
    const std::string name = std::to_string(i);
    const std::string log = "/volume1/logs/" + name;
    WriteText(log, "line one\nline two\n");
    InstallLog(name, log);
  }
}

void CollectNothingNew(benchmark::State& state) {
  InstallLogs(state.range(0));
  CollectOnce();
  Commit();
  for (auto unused : state) {
    CollectOnce();
  }
  Require(!fs::exists(kUpdateFile), "nothing new");
}

void CommitAll(benchmark::State& state) {
  InstallLogs(state.range(0));
  CollectOnce();
  for (auto unused : state) {
    Commit();
  }
}

void OnBothFileSystems(benchmark::internal::Benchmark* bench) {
  bench->ArgName("other_fs")->Arg(0)->Arg(1)->Unit(benchmark::kMillisecond)->UseRealTime();
}

void PerTenfold(benchmark::internal::Benchmark* bench) {
  bench->ArgName("collectors")->RangeMultiplier(10)->Range(10, 10000);
  bench->Unit(benchmark::kMillisecond)->UseRealTime();
}

void PerSize(benchmark::internal::Benchmark* bench) {
  bench->ArgName("MiB")->Arg(1)->Arg(1024)->Arg(4096)->Iterations(1)->Repetitions(1);
  bench->Unit(benchmark::kMillisecond)->UseRealTime();
}

BENCHMARK(Cp)->Apply(OnBothFileSystems);
BENCHMARK(DiffCopy)->Apply(OnBothFileSystems);
BENCHMARK(WholeCopy)->Apply(OnBothFileSystems);
BENCHMARK(Logtail)->Apply(OnBothFileSystems);
BENCHMARK(CollectNothingNew)->Apply(PerTenfold);
BENCHMARK(CommitAll)->Apply(PerTenfold);
BENCHMARK(MemoryOfDiffCopy)->Apply(PerSize);
BENCHMARK(MemoryOfWholeCopy)->Apply(PerSize);

// Keeps the least times of each benchmark's runs, which the machine's other work has disturbed
// least, by the clock and of the processor, and tells them at the end.
class LeastTimes : public benchmark::BenchmarkReporter {
 public:
  bool ReportContext(const Context& context) override {
    PrintBasicContext(&std::cerr, context);
    return true;
  }

  void ReportRuns(const std::vector<Run>& runs) override {
    for (const Run& run : runs) {
      if (run.run_type == Run::RT_Iteration) {
        Keep(run);
      }
    }
  }

  void Finalize() override {
    printf("\n%-34s %12s %12s %10s\n", "Least of the runs", "time/ms", "processor/ms", "peak/MiB");
    for (const auto& [name, least] : least_) {
      printf("%-34s %12.2f %12.2f %10.1f\n", name.c_str(), least.clock, least.processor,
             least.peak);
    }
    printf("\n%-34s %12s %12s\n", "Against cp of the same bytes", "time", "processor");
    for (const char* place : {"other_fs:0", "other_fs:1"}) {
      for (const char* name : {"DiffCopy", "WholeCopy", "Logtail"}) {
        PrintRatio(std::string(name) + "/" + place, std::string("Cp/") + place);
      }
    }
    printf("\n%-34s %12s %12s\n", "Growth per ten times the input", "time", "processor");
    for (const char* name : {"CollectNothingNew", "CommitAll"}) {
      for (int count = 10; count < 10000; count *= 10) {
        const std::string stem = std::string(name) + "/collectors:";
        PrintRatio(stem + std::to_string(10 * count), stem + std::to_string(count));
      }
    }
  }

 private:
  struct Least {
    double clock = 0;
    double processor = 0;
    double peak = 0;
  };

  static double Counter(const Run& run, const char* name, double otherwise) {
    const auto found = run.counters.find(name);
    return found == run.counters.end() ? otherwise : found->second.value;
  }

  void Keep(const Run& run) {
    const auto [entry, isFirst] =
        least_.emplace(run.run_name.function_name + "/" + run.run_name.args, Least());
    Least& least = entry->second;
    const double processor = Counter(run, kProcessor, run.GetAdjustedCPUTime());
    least.clock =
        isFirst ? run.GetAdjustedRealTime() : std::min(least.clock, run.GetAdjustedRealTime());
    least.processor = isFirst ? processor : std::min(least.processor, processor);
    least.peak = Counter(run, kPeak, 0);
  }

  void PrintRatio(const std::string& name, const std::string& base) const {
    if (least_.count(name) != 0 && least_.count(base) != 0) {
      const Least& least = least_.at(name);
      const Least& unit = least_.at(base);
      printf("%-34s %12.2f %12.2f\n", name.c_str(), least.clock / unit.clock,
             least.processor / unit.processor);
    }
  }

  std::map<std::string, Least> least_;
};

}  // namespace

int main(int argc, char** argv) {
  if (argc == 2 && argv[1][0] == '/') {
    const bool collected = QUENDELCollectLog(argv[1]) == 0;
    printf("%ld\n", static_cast<long>(PeakKibibytes()));
    return collected ? 0 : 1;
  }
  benchmark::Initialize(&argc, argv);
  LeastTimes reporter;
  benchmark::RunSpecifiedBenchmarks(&reporter);
  return 0;
}
