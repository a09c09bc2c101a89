#include "session.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <functional>
#include <sstream>

namespace quendeld {
namespace {

// Reads what the kernel has to say under this name, up to 64 KiB of it.
std::string ReadKernelFile(const std::string& path) {
  std::string text;
  const int file = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (file < 0) {
    return text;
  }
  constexpr size_t kMost = 65536;
  char part[4096];
  ssize_t got = 0;
  while (text.size() < kMost && (got = read(file, part, sizeof part)) > 0) {
    text.append(part, static_cast<size_t>(got));
  }
  close(file);
  return text;
}

bool WriteKernelFile(const std::string& path, const std::string& text) {
  const int file = open(path.c_str(), O_WRONLY | O_CLOEXEC);
  if (file < 0) {
    return false;
  }
  const bool written = write(file, text.data(), text.size()) == static_cast<ssize_t>(text.size());
  close(file);
  return written;
}

void ForEachProcess(const std::function<void(pid_t)>& visit) {
  DIR* folder = opendir("/proc");
  if (folder == nullptr) {
    return;
  }
  while (const dirent* entry = readdir(folder)) {
    const pid_t process = static_cast<pid_t>(strtol(entry->d_name, nullptr, 10));
    if (process > 0) {
      visit(process);
    }
  }
  closedir(folder);
}

// Behind the program's name, which is in parentheses and may hold anything: state, parent, group,
// session.
bool BelongsToSession(pid_t process, pid_t session) {
  const std::string status = ReadKernelFile("/proc/" + std::to_string(process) + "/stat");
  const size_t behind = status.rfind(')');
  if (behind == std::string::npos) {
    return false;
  }
  std::istringstream fields(status.substr(behind + 1));
  char state = 0;
  pid_t parent = 0;
  pid_t group = 0;
  pid_t found = 0;
  return fields >> state >> parent >> group >> found && found == session && state != 'Z';
}

bool IsMarked(pid_t process) {
  const std::string environment = ReadKernelFile("/proc/" + std::to_string(process) + "/environ");
  const std::string mark = std::string(kWorkerMark) + '\0';
  return environment.compare(0, mark.size(), mark) == 0 ||
         environment.find('\0' + mark) != std::string::npos;
}

void Pause() {
  const timespec pause = {0, 10'000'000};
  nanosleep(&pause, nullptr);
}

// The path of this process's control group in the unified hierarchy.
std::string OwnControlGroup() {
  const std::string text = ReadKernelFile("/proc/self/cgroup");
  const size_t line = text.rfind("0::", 0) == 0 ? 0 : text.find("\n0::");
  if (line == std::string::npos) {
    return "";
  }
  const size_t begin = text.find('/', line);
  const std::string path = text.substr(begin, text.find('\n', begin) - begin);
  return path == "/" ? "" : "/sys/fs/cgroup" + path;
}

// systemd marks a group that it leaves to its service. In any other it is not ours to make groups.
bool IsDelegated(const std::string& folder) {
  const char* invocation = getenv("INVOCATION_ID");
  return !folder.empty() && invocation != nullptr && access(folder.c_str(), W_OK) == 0;
}

}  // namespace

std::vector<pid_t> Followers(pid_t session) {
  std::vector<pid_t> followers;
  ForEachProcess([&](pid_t process) {
    if (process != session && BelongsToSession(process, session)) {
      followers.push_back(process);
    }
  });
  return followers;
}

void SignalSession(pid_t session, int number) {
  kill(-session, number);
  kill(-session, SIGCONT);
  for (const pid_t follower : Followers(session)) {  // those in groups of their own
    kill(follower, number);
    kill(follower, SIGCONT);
  }
}

void EndMarkedProcesses() {
  constexpr int kPauses = 100;
  for (int pause = 0; pause < kPauses; ++pause) {
    bool found = false;
    ForEachProcess([&](pid_t process) {
      if (process != getpid() && IsMarked(process)) {
        found = kill(process, SIGKILL) == 0 || found;
      }
    });
    if (!found) {
      return;
    }
    Pause();
  }
}

ControlGroup::ControlGroup(const std::string& name) {
  const std::string own = OwnControlGroup();
  if (IsDelegated(own) && mkdir((own + "/" + name).c_str(), 0755) == 0) {
    folder_ = own + "/" + name;
  }
}

ControlGroup::~ControlGroup() {
  if (!folder_.empty()) {
    rmdir(folder_.c_str());
  }
}

void ControlGroup::Add(pid_t process) const {
  if (!folder_.empty()) {
    WriteKernelFile(folder_ + "/cgroup.procs", std::to_string(process));
  }
}

void ControlGroup::Kill() const {
  if (!folder_.empty()) {
    WriteKernelFile(folder_ + "/cgroup.kill", "1");
  }
}

bool ControlGroup::IsEmpty() const {
  return folder_.empty() ||
         ReadKernelFile(folder_ + "/cgroup.events").find("populated 1") == std::string::npos;
}

}  // namespace quendeld
