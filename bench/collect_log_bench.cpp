// How fast logs are collected, against programs that do the same work on the same bytes, how much
// memory it takes, and how both grow.
//
// Runs on an appliance of its own; script/bench starts it. With one argument, a folder, it collects
// into that and prints its peak memory in KiB: the benchmarks of memory start it so.
#include <benchmark/benchmark.h>
#include <sys/resource.h>
#include <sys/stat.h>
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
#include "scene.h"
#include "support/appliance_only.h"

using namespace bench;

namespace {

namespace fs = std::filesystem;

// What InstallLogs() writes into each log.
constexpr char kTwoLines[] = "line one\nline two\n";

constexpr char kUpdateFile[] = "/tmp/quendel/quendel.log.update.conf";
constexpr char kRunFolder[] = "/tmp/run";
constexpr char kProcessor[] = "processor_ms";
constexpr char kPeak[] = "peak_MiB";

void ResetFolders() {
  for (const char* folder : {"/usr/arvo/etc/quendel", kRunFolder, "/tmp/quendel"}) {
    MakeEmptyFolder(folder);
  }
}

void CollectOnce() {
  Require(QUENDELCollectLog(kRunFolder) == 0, "collect");
}

// A collection that gives a log up is none the less a good one.
void RequireCollected(const std::string& folder, int64_t bytes) {
  Require(fs::file_size(folder + "/m") >= static_cast<uintmax_t>(bytes), "the lines");
}

void Commit() {
  Require(QUENDELUpdateCollectConf(kUpdateFile) == 0, "commit");
}

// A log of one collected line and new ones behind it, on a file system of the benchmark's choice.
std::string MakeGrownLog(const std::string& folder, int64_t bytes) {
  ResetFolders();
  MakeEmptyFolder(folder);
  const std::string log = folder + "/messages";
  WriteText(log, "first line\n");
  InstallLog("m", log);
  CollectOnce();
  Commit();
  AppendLines(log, bytes);
  MakeEmptyFolder(kRunFolder);
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
    MakeEmptyFolder(kRunFolder);
    state.ResumeTiming();
  }
  state.SetBytesProcessed(state.iterations() * kGibibyte);
  state.counters[kProcessor] = processor / static_cast<double>(state.iterations());
}

void DiffCopy(benchmark::State& state) {
  MakeGrownLog(FolderFor(state), kGibibyte);
  TimeCopy(state, [] {
    CollectOnce();
    RequireCollected(kRunFolder, kGibibyte);
  });
}

void WholeCopy(benchmark::State& state) {
  const std::string log = MakeGrownLog(FolderFor(state), kGibibyte);
  InstallLog("m", log);
  TimeCopy(state, [] {
    CollectOnce();
    RequireCollected(kRunFolder, kGibibyte);
  });
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
  Require(false, "VmHWM");
  return 0;
}

// The peak memory of a fresh process that collects a log of so many MiB, `whole` or its new lines.
void Memory(benchmark::State& state, bool whole) {
  const char* folder = getenv("QUENDEL_BENCH_DATA");
  const std::string log = MakeGrownLog(folder, state.range(0) * kMebibyte);
  if (whole) {
    InstallLog("m", log);
  }
  const std::string run = std::string(folder) + "/run";
  int64_t kibibytes = 0;
  for (auto unused : state) {
    MakeEmptyFolder(run);
    RunProgram({"/proc/self/exe", run}, "/tmp/peak");
    RequireCollected(run, state.range(0) * kMebibyte);
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

std::string LogNumber(int64_t number) {
  return "/volume1/logs/" + std::to_string(number);
}

// Lets the collectors forget what they know of so many logs.
void ForgetLogs(int64_t count) {
  for (int64_t i = 0; i < count; ++i) {
    InstallLog(std::to_string(i), LogNumber(i));
  }
}

void InstallLogs(int64_t count) {
  ResetFolders();
  MakeEmptyFolder("/volume1/logs");
  for (int64_t i = 0; i < count; ++i) {
    WriteText(LogNumber(i), kTwoLines);
  }
  ForgetLogs(count);
}

void RequireCommitted(const std::string& name) {
  std::ifstream conf(ConfOf(name));
  for (std::string line; std::getline(conf, line);) {
    if (line == "total_byte=" + std::to_string(strlen(kTwoLines))) {
      return;
    }
  }
  Require(false, "the state of " + name);
}

void CollectNothingNew(benchmark::State& state) {
  InstallLogs(state.range(0));
  CollectOnce();
  Commit();
  RequireCommitted("0");
  for (auto unused : state) {
    CollectOnce();
  }
  Require(!fs::exists(kUpdateFile), "nothing new");
}

// Each time the state is new to every collector: one that is told what it knows writes nothing.
void CommitAll(benchmark::State& state) {
  InstallLogs(state.range(0));
  CollectOnce();
  for (auto unused : state) {
    Commit();
    state.PauseTiming();
    RequireCommitted("0");
    ForgetLogs(state.range(0));
    sync();  // the commit waits for the disk with its own files only
    state.ResumeTiming();
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
    printf("\n%-34s %12s\n", "Peak memory against 1 MiB of log", "peak");
    for (const char* name : {"MemoryOfDiffCopy", "MemoryOfWholeCopy"}) {
      for (const char* size : {"1024", "4096"}) {
        PrintPeakRatio(name, size);
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

  void PrintPeakRatio(const std::string& stem, const std::string& size) const {
    const std::string name = stem + "/MiB:" + size;
    const std::string base = stem + "/MiB:1";
    if (least_.count(name) != 0 && least_.count(base) != 0) {
      printf("%-34s %12.2f\n", name.c_str(), least_.at(name).peak / least_.at(base).peak);
    }
  }

  std::map<std::string, Least> least_;
};

}  // namespace

int main(int argc, char** argv) {
  quendel::test::EndUnlessOnAppliance("script/bench");
  if (argc == 2 && argv[1][0] == '/') {
    const bool collected = QUENDELCollectLog(argv[1]) == 0;
    printf("%ld\n", static_cast<long>(PeakKibibytes()));
    return collected ? 0 : 1;
  }
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
    return 2;
  }
  LeastTimes reporter;
  benchmark::RunSpecifiedBenchmarks(&reporter);
  return 0;
}
