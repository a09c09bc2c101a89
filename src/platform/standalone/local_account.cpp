// The device's own accounts, changed by the system's account tools.
#include "platform/local_account.h"

#include <dirent.h>
#include <pwd.h>
#include <sys/types.h>

#include <cerrno>
#include <charconv>
#include <csignal>
#include <memory>
#include <string>
#include <vector>

#include "base/paths.h"
#include "platform/standalone/error_code.h"
#include "platform/standalone/file_io.h"
#include "platform/standalone/result_record.h"
#include "platform/standalone/run_program.h"

namespace platform {
namespace {

constexpr int kSupportKind = 5;
constexpr uid_t kSupportUid = 50001;
constexpr char kSupportUidText[] = "50001";
constexpr char kSupportGidText[] = "100";
constexpr char kSupportShell[] = "/bin/sh";

// No password matches this one, and it does not lock the account: a key still lets in.
constexpr char kNoPassword[] = "*";

// Below are the accounts that the system itself needs. Another one that it needs is far above.
constexpr uid_t kFirstOwnUid = 1000;
constexpr uid_t kNobodyUid = 65534;
constexpr size_t kMaxNameBytes = 32;

constexpr int kMaxPasses = 10;

constexpr char kUserAdd[] = "/usr/sbin/useradd";
constexpr char kUserMod[] = "/usr/sbin/usermod";
constexpr char kUserDel[] = "/usr/sbin/userdel";

bool IsNameByte(char c) {
  return (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '_' || c == '-';
}

// Names are what the account tools take. Above all, none of them is taken for an option.
bool IsAccountName(const char* name) {
  if (name == nullptr || name[0] == '-' || (name[0] >= '0' && name[0] <= '9')) {
    return false;
  }
  size_t length = 0;
  while (IsNameByte(name[length])) {
    ++length;
  }
  return name[length] == '\0' && length > 0 && length <= kMaxNameBytes;
}

// What became of looking an account up.
enum class Lookup { kFound, kAbsent, kFailed };

Lookup FindUid(const char* name, uid_t& uid) {
  std::vector<char> texts(1024);
  passwd entry;
  passwd* found = nullptr;
  int error = 0;
  while ((error = getpwnam_r(name, &entry, texts.data(), texts.size(), &found)) == ERANGE) {
    texts.resize(texts.size() * 2);
  }
  if (error != 0) {
    errno = error;
    return Lookup::kFailed;
  }
  if (found == nullptr) {
    return Lookup::kAbsent;
  }
  uid = entry.pw_uid;
  return Lookup::kFound;
}

int FailForTool() {
  errno = EIO;
  return Fail(kErrorAccountTool);
}

int AddSupportAccount(const char* name) {
  const int status =
      RunProgram({kUserAdd, "--no-create-home", "--no-user-group", "--uid", kSupportUidText,
                  "--gid", kSupportGidText, "--home-dir", quendel::kSupportHome, "--shell",
                  kSupportShell, "--password", kNoPassword, name});
  return status == 0 ? 0 : FailForTool();
}

// An earlier session may have left the account in any state.
int RestoreSupportAccount(const char* name) {
  const int status =
      RunProgram({kUserMod, "--gid", kSupportGidText, "--home", quendel::kSupportHome, "--shell",
                  kSupportShell, "--password", kNoPassword, "--expiredate", "", name});
  return status == 0 ? 0 : FailForTool();
}

int PrepareSupportAccount(const char* name) {
  uid_t uid = 0;
  switch (FindUid(name, uid)) {
    case Lookup::kAbsent:
      return AddSupportAccount(name);
    case Lookup::kFound:
      break;
    case Lookup::kFailed:
      return Fail(kErrorUnreadable);
  }
  if (uid != kSupportUid) {
    errno = EPERM;
    return Fail(kErrorRefused);
  }
  return RestoreSupportAccount(name);
}

bool Contains(const std::string& text, const std::string& part) {
  return text.find(part) != std::string::npos;
}

// Tells whether a process is the user's. One that has ended, so that only its parent has yet to be
// told, is nobody's; but its first thread alone may have ended. The owner of its folder does not
// tell: a process that changed its user has root's there.
bool BelongsTo(const std::string& process, const char* uidText) {
  std::string status;
  if (!ReadWholeFile(("/proc/" + process + "/status").c_str(), status)) {
    return false;
  }
  const bool hasEnded = Contains(status, "\nState:\tZ") && Contains(status, "\nThreads:\t1\n");
  return !hasEnded && Contains(status, std::string("\nUid:\t") + uidText + "\t");
}

// Returns false when there was none to be ended.
bool EndSupportProcesses() {
  bool hasFound = false;
  const std::unique_ptr<DIR, int (*)(DIR*)> processes(opendir("/proc"), closedir);
  while (const dirent* const entry = processes ? readdir(processes.get()) : nullptr) {
    const std::string name = entry->d_name;
    pid_t process = 0;
    std::from_chars(name.data(), name.data() + name.size(), process);
    if (process > 0 && BelongsTo(name, kSupportUidText)) {
      hasFound = true;
      kill(process, SIGKILL);
    }
  }
  return hasFound;
}

// A support session that is still open would outlive its account. A process that forks while the
// list is read may leave a child that is not in it.
void EndSupportSessions() {
  int passes = 0;
  while (passes < kMaxPasses && EndSupportProcesses()) {
    ++passes;
  }
}

// Returns a core error code, kErrorNone when the account is gone.
ErrorCode DeleteAccount(const char* name) {
  if (!IsAccountName(name)) {
    return kErrorBadArgument;
  }
  uid_t uid = 0;
  const Lookup lookup = FindUid(name, uid);
  if (lookup != Lookup::kFound) {
    return lookup == Lookup::kAbsent ? kErrorNoSuchAccount : kErrorUnreadable;
  }
  if (uid < kFirstOwnUid || uid == kNobodyUid) {
    return kErrorRefused;
  }
  if (uid != kSupportUid) {
    return RunProgram({kUserDel, name}) == 0 ? kErrorNone : kErrorAccountTool;
  }
  EndSupportSessions();
  return RunProgram({kUserDel, "--force", name}) == 0 ? kErrorNone : kErrorAccountTool;
}

}  // namespace
}  // namespace platform

int ARVOLocalAccountUserPrepareForQuendel(const char* user, int kind) try {
  if (!platform::IsAccountName(user) || kind != platform::kSupportKind) {
    return platform::FailForArgument();
  }
  return platform::PrepareSupportAccount(user);
} catch (...) {
  return platform::FailForException();
}

int ARVOLocalAccountUserDelete(const char* const* names, int count, ALIBCMRESULT* result) try {
  if (names == nullptr || count < 0 || result == nullptr) {
    return platform::FailForArgument();
  }
  result->coreErrors.clear();
  for (int i = 0; i < count; ++i) {
    const platform::ErrorCode error = platform::DeleteAccount(names[i]);
    if (error != platform::kErrorNone) {
      platform::Fail(error);
      result->coreErrors.push_back(error);
    }
  }
  return result->coreErrors.empty() ? 0 : -1;
} catch (...) {
  return platform::FailForException();
}
