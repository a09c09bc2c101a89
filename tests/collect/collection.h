// What the tests of a collection run share: a device with something to collect, collectors that do
// as they are told, and a process group that a run can signal.
#ifndef TESTS_COLLECT_COLLECTION_H_
#define TESTS_COLLECT_COLLECTION_H_

#include <json/value.h>
#include <sys/types.h>

#include <functional>
#include <map>
#include <string>

namespace quendel::test {

// The run directory of a run that starts at the moment that StopTheClock() sets.
constexpr char kRunName[] = "quendel_20240305_070809_0";
constexpr char kRunDir[] = "/tmp/quendel_20240305_070809_0";
constexpr char kArchive[] = "/tmp/quendel_20240305_070809_0.tar.xz";
constexpr long kStart = 1709622489;  // 2024-03-05 07:08:09 UTC

// Makes the library see kStart as the current time.
void StopTheClock();

// Installs a log of two lines, "first" and "second", as "messages", and a user-defined collector,
// the shell script "raid". Neither was ever collected.
void InstallCollectors(const std::string& raid = "echo '{\"disks\":4}'");

// The collectors' settings files by path, byte for byte.
std::map<std::string, std::string> CollectorConf();

// A series of one performance sample.
Json::Value PerfSeries();

// The call that a child of this kind ("udc" or "log") makes.
const char* CollectorOf(const std::string& kind);

// What a child can do instead: one that never ends, one that does nothing, one that ends when there
// is a file "/tmp/end", one that dies.
int Hang(const char* directory);
int DoNothing(const char* directory);
int EndWhenTold(const char* directory);
int Die(const char* directory);

// The process id of a run's child of this kind, as its marker file names it; 0 when there is none.
pid_t ChildOf(const std::string& kind);

// Waits until a child of this process, or the run's child of this kind, has ended, and leaves it to
// be reaped.
void AwaitAnyChild();
void AwaitChild(const std::string& kind);

// Blocks or unblocks SIGTERM, and tells how this process stands to it: "default", "ignored" or
// "handled", and "blocked" or "unblocked".
void MaskSigterm(int how);
std::string SigtermState();

// How work ended that was done by a process of its own, in a session and group of its own.
struct Ending {
  int result = 0;                  // what the work returned, unless a signal ended it
  int signal = 0;                  // the signal that ended it, or 0
  bool group_got_sigterm = false;  // whether SIGTERM was sent to the whole group
};
Ending InAGroupOfItsOwn(const std::function<int()>& work);

}  // namespace quendel::test

#endif  // TESTS_COLLECT_COLLECTION_H_
