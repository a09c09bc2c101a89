// The file that tells how the remote session that is open has to be ended.
#include "session_file.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include "base/paths.h"

namespace quendelctl {
namespace {

bool WriteAll(int file, const std::string& text) {
  size_t written = 0;
  while (written < text.size()) {
    const ssize_t count = write(file, text.data() + written, text.size() - written);
    if (count < 0) {
      return false;
    }
    written += static_cast<size_t>(count);
  }
  return true;
}

// Makes a temporary file, with mode 0600, that holds the text and has reached the disk. Returns its
// path, or an empty text with errno set.
std::string WriteTemporary(const std::string& text) {
  std::string path = std::string(quendel::kSettingsDir) + "/.quendel.remote.conf.XXXXXX";
  const int file = mkostemp(path.data(), O_CLOEXEC);
  if (file < 0) {
    return "";
  }
  if (WriteAll(file, text) && fsync(file) == 0) {
    close(file);
    return path;
  }
  const int error = errno;
  close(file);
  unlink(path.c_str());
  errno = error;
  return "";
}

bool SyncFolder() {
  const int folder = open(quendel::kSettingsDir, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (folder < 0) {
    return false;
  }
  const bool synced = fsync(folder) == 0;
  close(folder);
  return synced;
}

SessionFile Fail() {
  syslog(LOG_ERR, "cannot write %s: %m", quendel::kRemoteConfFile);
  return SessionFile::kFailed;
}

}  // namespace

SessionFile WriteSessionFile(const std::string& account, bool stopSshd) {
  const std::string temporary =
      WriteTemporary("remote_account=" + account +
                     "\nstop_sshd_after_complete=" + (stopSshd ? "yes" : "no") + "\n");
  if (temporary.empty()) {
    return Fail();
  }
  if (renameat2(AT_FDCWD, temporary.c_str(), AT_FDCWD, quendel::kRemoteConfFile,
                RENAME_NOREPLACE) != 0) {
    const int error = errno;
    unlink(temporary.c_str());
    errno = error;
    return error == EEXIST ? SessionFile::kExists : Fail();
  }
  if (!SyncFolder()) {
    Fail();
    unlink(quendel::kRemoteConfFile);
    return SessionFile::kFailed;
  }
  return SessionFile::kWritten;
}

bool IsSessionOpen() {
  struct stat status = {};
  return lstat(quendel::kRemoteConfFile, &status) == 0 || (errno != ENOENT && errno != ENOTDIR);
}

bool RemoveSessionFile() {
  if (unlink(quendel::kRemoteConfFile) != 0) {
    syslog(LOG_ERR, "cannot remove %s: %m", quendel::kRemoteConfFile);
    return false;
  }
  return true;
}

}  // namespace quendelctl
