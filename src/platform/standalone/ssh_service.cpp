// The device's ssh service: the system's own sshd, started and stopped without a service manager.
#include "platform/standalone/ssh_service.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <chrono>
#include <csignal>
#include <string>
#include <thread>

#include "platform/standalone/file_io.h"
#include "platform/standalone/run_program.h"

namespace platform {
namespace {

constexpr char kSshd[] = "/usr/sbin/sshd";
constexpr char kSshKeygen[] = "/usr/bin/ssh-keygen";
constexpr char kPidFilePath[] = "/run/sshd.pid";
constexpr char kPidFileOption[] = "PidFile=/run/sshd.pid";

// sshd shuts its unprivileged part into this folder, and ends at once where it is missing.
constexpr char kEmptyDir[] = "/run/sshd";
constexpr mode_t kEmptyDirMode = 0755;

constexpr auto kPollInterval = std::chrono::milliseconds(10);
constexpr int kMaxPolls = 500;

bool IsSshd(pid_t process) {
  std::string name;
  return ReadWholeFile(("/proc/" + std::to_string(process) + "/comm").c_str(), name) &&
         name == "sshd\n";
}

// Returns the number of the sshd that runs, 0 when none does. A number that some other process has
// been given meanwhile is none.
pid_t RunningSshd() {
  std::string text;
  if (!ReadWholeFile(kPidFilePath, text)) {
    return 0;
  }
  pid_t process = 0;
  std::from_chars(text.data(), text.data() + text.size(), process);
  return process > 0 && IsSshd(process) ? process : 0;
}

// sshd answers its start before it listens, and its end before it is gone.
bool WaitUntilRunning(bool isWanted) {
  for (int polls = 0; polls < kMaxPolls; ++polls) {
    if ((RunningSshd() != 0) == isWanted) {
      return true;
    }
    std::this_thread::sleep_for(kPollInterval);
  }
  return false;
}

}  // namespace

bool StartSshService() {
  if (RunningSshd() != 0) {
    return true;
  }
  if (mkdir(kEmptyDir, kEmptyDirMode) != 0 && errno != EEXIST) {
    return false;
  }
  // Makes those host keys that are missing.
  if (RunProgram({kSshKeygen, "-A"}) != 0) {
    return false;
  }
  return RunProgram({kSshd, "-o", kPidFileOption}) == 0 && WaitUntilRunning(true);
}

bool StopSshService() {
  const pid_t process = RunningSshd();
  if (process == 0) {
    return true;
  }
  // It may have ended by itself meanwhile.
  return (kill(process, SIGTERM) == 0 || errno == ESRCH) && WaitUntilRunning(false);
}

}  // namespace platform
