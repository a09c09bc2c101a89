// The work that the server's actions ask for: files of the device, the end of a support session,
// and switching it off.
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <regex>

#include "base/paths.h"
#include "json.h"
#include "platform/file.h"
#include "platform/key_value.h"
#include "platform/process.h"
#include "quendel.h"
#include "worker/work.h"

namespace quendel_worker {
namespace {

constexpr char kSystemctl[] = "/usr/bin/systemctl";

// Tells whether a path stays in the folder that its text begins with: no "..", no link below it. A
// file that is not there stays in it.
bool StaysInItsFolder(const std::string& path) {
  static const std::regex kFolder("(/var/crash/|/volume[0-9]+/)([^]*)");
  std::smatch parts;
  if (!std::regex_match(path, parts, kFolder)) {
    return true;  // for the library to refuse
  }
  const int folder = open(parts[1].str().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC);
  if (folder < 0) {
    return true;
  }
  open_how how = {};
  how.flags = O_PATH | O_CLOEXEC;
  how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
  const std::string below = parts[2];
  const long file = syscall(SYS_openat2, folder, below.c_str(), &how, sizeof how);
  const bool isRefused = file < 0 && errno != ENOENT && errno != ENOTDIR && errno != ENAMETOOLONG;
  if (file >= 0) {
    close(static_cast<int>(file));
  }
  close(folder);
  const bool climbs = ("/" + below + "/").find("/../") != std::string::npos;
  return !isRefused && !climbs;
}

bool AllStayInTheirFolders(const Json::Value& files) {
  for (const Json::Value& file : files) {
    const std::string path = quendeld::TextOf(file, "file_path");
    if (quendeld::TextOf(file, "file_type") != "debug.dat" && !StaysInItsFolder(path)) {
      syslog(LOG_ERR, "refused to send '%s': it leaves its folder", path.c_str());
      return false;
    }
  }
  return true;
}

}  // namespace

Json::Value Upload(const Json::Value& request) {
  if (QUENDELIsEnable() == 0) {
    return Disabled();
  }
  const Json::Value& files = quendeld::Member(request, "files");
  if (!files.isArray() || !AllStayInTheirFolders(files)) {
    return Failed();
  }
  const int id = static_cast<int>(quendeld::NumberOf(request, "id").value_or(0));
  Json::Value answer = Json::objectValue;
  answer["result"] = QUENDELUploadFile(id, QUENDEL_ACT_PROGRESS_RUN, files);
  return answer;
}

// While nothing may leave the device its door is shut all the same. The rest of the end, the report
// first of all, waits.
Json::Value CloseRemote(const Json::Value& request) {
  if (ALIBCFileExist(quendel::kRemoteConfFile) != 1) {
    Json::Value answer = Failed();
    answer["no_session"] = true;
    return answer;
  }
  if (quendeld::BoolOf(request, "silent") || QUENDELIsEnable() == 0) {
    char account[64] = {};
    if (ALIBCFileGetKeyValue(quendel::kRemoteConfFile, "remote_account", account, sizeof account,
                             0) > 0) {
      QUENDELSupportAccountUserDelete(account);
    }
    return Disabled();
  }
  const int id = static_cast<int>(quendeld::NumberOf(request, "id").value_or(0));
  const int progress = static_cast<int>(quendeld::NumberOf(request, "progress").value_or(0));
  Json::Value answer = Json::objectValue;
  answer["result"] = QUENDELRemoteClose(id, static_cast<QuendelActionProgress_t>(progress));
  return answer;
}

Json::Value TellWhyStopping(const Json::Value& /*request*/) {
  Json::Value answer = Json::objectValue;
  answer["result"] = 0;
  answer["why"] = "";
  FILE* jobs = ALIBCPopen(kSystemctl, "r", "list-jobs", "--no-legend", "--plain",
                          static_cast<const char*>(nullptr));
  if (jobs == nullptr) {
    return answer;
  }
  char line[512];
  while (fgets(line, sizeof line, jobs) != nullptr) {
    if (strstr(line, "reboot.target") != nullptr || strstr(line, "kexec.target") != nullptr) {
      answer["why"] = "reboot";
    } else if (strstr(line, "poweroff.target") != nullptr ||
               strstr(line, "halt.target") != nullptr) {
      answer["why"] = "poweroff";
    }
  }
  ALIBCPclose(jobs);
  return answer;
}

Json::Value SwitchPower(const Json::Value& request) {
  const std::string kind = quendeld::TextOf(request, "kind");
  Json::Value answer = Json::objectValue;
  answer["result"] = ALIBCExec(kSystemctl, kind.c_str(), nullptr, nullptr, nullptr) == 0 ? 0 : -1;
  return answer;
}

}  // namespace quendel_worker
