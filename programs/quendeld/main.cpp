// quendeld: the daemon of the remote support service.
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <csignal>
#include <exception>
#include <filesystem>

#include "daemon.h"
#include "quendel/version.h"

namespace quendeld {
namespace {

constexpr char kLockFile[] = "/run/quendel/quendeld.lock";
constexpr int kAlreadyRuns = 3;

// What the loop takes must not come otherwise, and a reader that has gone is no reason to end.
void PrepareSignals() {
  sigset_t taken;
  sigemptyset(&taken);
  for (const int number : {SIGTERM, SIGINT, SIGHUP}) {
    sigaddset(&taken, number);
  }
  sigprocmask(SIG_BLOCK, &taken, nullptr);
  signal(SIGPIPE, SIG_IGN);
  signal(SIGCHLD, SIG_DFL);
}

// One daemon at a time: it holds the lock until it ends, however it ends. One that is killed while
// it starts a worker leaves the lock to that for a moment.
bool TakeLock() {
  constexpr int kTries = 20;
  constexpr useconds_t kPauseMicroseconds = 50'000;
  mkdir("/run/quendel", 0755);
  const int file = open(kLockFile, O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600);
  for (int attempt = 0; file >= 0 && attempt < kTries; ++attempt) {
    if (flock(file, LOCK_EX | LOCK_NB) == 0) {
      return true;
    }
    usleep(kPauseMicroseconds);
  }
  return false;
}

void OccupyStandardDescriptors() {
  while (true) {
    const int null = open("/dev/null", O_RDWR | O_CLOEXEC);
    if (null > STDERR_FILENO || null < 0) {
      close(null);
      return;
    }
    fcntl(null, F_SETFD, 0);
  }
}

// Both are installed as one tree, which may lie anywhere.
std::string WorkerBesideMe() {
  std::error_code error;
  const std::filesystem::path me = std::filesystem::read_symlink("/proc/self/exe", error);
  return (me.parent_path() / QUENDEL_WORKER_FROM_DAEMON).lexically_normal();
}

int Run(const DaemonOptions& options) {
  if (!TakeLock()) {
    syslog(LOG_ERR, "a quendeld runs already");
    return kAlreadyRuns;
  }
  PrepareSignals();
  Loop loop;
  Daemon daemon(loop, options);
  daemon.Start();
  loop.Run();
  syslog(LOG_NOTICE, "quendeld ends");
  return 0;
}

int Main(int argc, char** argv) {
  OccupyStandardDescriptors();
  CLI::App app("quendeld - the daemon of the remote support service", "quendeld");
  DaemonOptions options;
  options.settings = kSettingsFile;
  options.worker = WorkerBesideMe();
  app.add_flag("--foreground", options.foreground, "Log to the standard error output as well");
  app.add_option("--worker", options.worker, "The program that does the work")->type_name("FILE");
  app.set_version_flag("--version", "quendeld " QUENDEL_VERSION, "Print the version and exit");
  CLI11_PARSE(app, argc, argv);
  openlog("quendeld", LOG_PID | (options.foreground ? LOG_PERROR : 0), LOG_DAEMON);
  return Run(options);
}

}  // namespace
}  // namespace quendeld

int main(int argc, char** argv) {
  try {
    return quendeld::Main(argc, argv);
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "cannot run: %s", error.what());
  } catch (...) {
    syslog(LOG_ERR, "cannot run");
  }
  return 1;
}
