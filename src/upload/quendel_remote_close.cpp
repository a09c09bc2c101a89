// Ends a support session at the server's request.
#include <string>

#include "base/json_text.h"
#include "base/log.h"
#include "base/paths.h"
#include "conf/hash_value.h"
#include "platform/api_runner.h"
#include "platform/key_value.h"
#include "platform/owned.h"
#include "quendel/conf.h"
#include "quendel/conversation.h"
#include "quendel/upload.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_remote_close";

constexpr int kHashPairs = 1024;

// What whoever opened the session left in its file.
struct Session {
  bool stop_sshd = false;
  std::string account;
};

// A session ends as done or as failed.
bool IsClosing(QuendelActionProgress_t progress) {
  return progress == QUENDEL_ACT_PROGRESS_DONE || progress == QUENDEL_ACT_PROGRESS_FAILED;
}

// Without memory for the name of an account, the account must not pass for one that is not there.
bool ReadSession(Session& session) try {
  platform::OwnedHash hash(kHashPairs);
  if (!hash) {
    QUENDEL_LOG("Fail to allocate memory for alibc hash");
    return false;
  }
  if (ALIBCFileGetPair(kRemoteConfFile, hash.slot()) < 0) {
    QUENDEL_LOG("Failed to get quendel key configuration file");
    return false;
  }
  session.stop_sshd = HashValue(hash.get(), "stop_sshd_after_complete") == "yes";
  session.account = HashValue(hash.get(), "remote_account");
  return true;
} catch (...) {
  QUENDEL_LOG("Fail to allocate memory for alibc hash");
  return false;
}

bool ReportEnd(int actionId, QuendelActionProgress_t progress) try {
  return QUENDELUpdateActRequestProgress(actionId, progress, Json::Value(Json::objectValue)) >= 0;
} catch (...) {
  return false;
}

bool StopSshd() try {
  Json::Value params(Json::objectValue);
  params["enable_ssh"] = false;
  Json::Value reply;
  ARVO::APIRunner::Exec(reply, "ARVO.Core.Terminal", 3, "set", params, "admin");
  return JsonBool(reply, "success");
} catch (...) {
  return false;
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELRemoteClose(int actionId, QuendelActionProgress_t progress) {
  if (!IsClosing(progress)) {
    QUENDEL_LOG("Bad parameter");
    return -1;
  }
  Session session;
  if (!ReadSession(session)) {
    return -1;
  }
  if (!session.account.empty() && QUENDELSupportAccountUserDelete(session.account.c_str()) < 0) {
    QUENDEL_LOG("Delete support account failed");
    return -1;
  }
  if (!ReportEnd(actionId, progress)) {
    QUENDEL_LOG("Failed to update progress to server");
    return -1;
  }
  if (session.stop_sshd && !StopSshd()) {
    QUENDEL_LOG("Failed to stop ssh service");
  }
  // Deliberate: the remover of directories is used on a file; it takes either.
  if (QUENDELRecursiveRmdir(kRemoteConfFile) < 0) {
    QUENDEL_LOG("Failed to rm dir '%s'", kRemoteConfFile);
    return -1;
  }
  return 0;
}
