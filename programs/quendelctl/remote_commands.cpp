// The commands that open and end a remote support session, and show its key.
#include <pwd.h>
#include <syslog.h>

#include <algorithm>
#include <memory>

#include "arguments.h"
#include "base/paths.h"
#include "command.h"
#include "daemon_commands.h"
#include "job.h"
#include "limit_options.h"
#include "public_key.h"
#include "quendel.h"
#include "session_file.h"

namespace quendelctl {
namespace {

constexpr uid_t kSupportUid = 50001;
constexpr size_t kMaxSessionKeyBytes = 65536;
constexpr char kOpenInPart[] =
    "The remote session is open in part only: end it with \"quendelctl remote close\".";

struct CreateArguments {
  std::string user;
  std::string key_file;
  bool stop_sshd = false;
  LimitArguments limits;
};

// The name goes into a key=value file, which would read some names as something else, and the
// session could not be ended for an account that the system's tools refuse to delete.
void CheckUser(const std::string& user) {
  constexpr size_t kMaxUserBytes = 32;
  constexpr char kUserBytes[] = "abcdefghijklmnopqrstuvwxyz_-0123456789";
  const bool isPlain = user.find_first_not_of(kUserBytes) == user.npos;
  const bool beginsWell = !user.empty() && (user[0] == '_' || (user[0] >= 'a' && user[0] <= 'z'));
  if (!isPlain || !beginsWell || user.size() > kMaxUserBytes) {
    throw CLI::ValidationError("USER", "not a name for an account: " + user);
  }
}

// The account of a session is deleted when it ends, or cannot be opened.
bool IsSomebodyElse(const std::string& user) {
  const passwd* const entry = getpwnam(user.c_str());
  return entry != nullptr && entry->pw_uid != kSupportUid;
}

std::vector<std::string> ClearAway(const std::string& user) {
  if (QUENDELSupportAccountUserDelete(user.c_str()) == 0 && RemoveSessionFile()) {
    return {"No remote session was opened."};
  }
  return {kOpenInPart};
}

// An earlier holder of the account may have left keys of their own in its home, or still be there.
bool MakeAccountAfresh(const std::string& user, const std::string& key) {
  return QUENDELSupportAccountUserDelete(user.c_str()) == 0 &&
         QUENDELSupportAccountUserCreate(user.c_str(), key.c_str()) == 0;
}

// The file comes first: whatever happens after it, the session can be ended.
Result OpenSession(const std::string& user, const std::string& key, bool stopSshd) {
  Result result;
  result.lines = {"No remote session was opened."};
  if (IsSomebodyElse(user)) {
    syslog(LOG_ERR, "%s is an account of this device that is not for remote support", user.c_str());
    return result;
  }
  const SessionFile file = WriteSessionFile(user, stopSshd);
  if (file == SessionFile::kExists) {
    syslog(LOG_ERR, "a remote session is open already: %s exists", quendel::kRemoteConfFile);
  }
  if (file != SessionFile::kWritten) {
    return result;
  }
  if (!MakeAccountAfresh(user, key)) {
    result.lines = ClearAway(user);
    return result;
  }
  result.success = true;
  result.lines = {"The remote session is open for the account " + user + "."};
  return result;
}

Result CreateSession(const CreateArguments& arguments) {
  CheckUser(arguments.user);
  const WorkerLimits limits = ReadLimits(arguments.limits);
  const std::string key = ReadPublicKey(arguments.key_file, limits);
  Result result = RunJob(limits, "the tools for accounts",
                         [&] { return OpenSession(arguments.user, key, arguments.stop_sshd); });
  result.members["user"] = arguments.user;
  result.members["stop_sshd"] = arguments.stop_sshd;
  if (!result.success && result.reason != "failed" && IsSessionOpen()) {
    result.lines.emplace_back(kOpenInPart);
  }
  return result;
}

Action DeclareCreate(CLI::App& command) {
  const auto arguments = std::make_shared<CreateArguments>();
  command.add_option("USER", arguments->user, "Name of the support account to make")
      ->required()
      ->type_name("");
  command
      .add_option("KEYFILE", arguments->key_file,
                  "File with the public ssh key that opens it, one line (- is the\n"
                  "standard input)")
      ->required()
      ->type_name("");
  command.add_flag("--stop-sshd", arguments->stop_sshd,
                   "The ssh service runs for this session only: stop it at the end");
  DeclareLimits(command, arguments->limits, WaitFor::kAnswer);
  return [arguments] { return CreateSession(*arguments); };
}

struct CloseArguments {
  std::string id;
  bool failed = false;
  LimitArguments limits;
};

Result EndSession(int id, QuendelActionProgress_t progress) {
  Result result;
  result.success = QUENDELRemoteClose(id, progress) == 0;
  result.lines = {result.success
                      ? "The remote session is closed. The server accepted the report on request " +
                            std::to_string(id) + ": " +
                            (progress == QUENDEL_ACT_PROGRESS_FAILED ? "failed." : "done.")
                      : "The remote session was not closed, or not to its end."};
  return result;
}

Result CloseSession(const CloseArguments& arguments) {
  const int id = ReadNumber("ID", arguments.id);
  const WorkerLimits limits = ReadLimits(arguments.limits);
  const QuendelActionProgress_t progress =
      arguments.failed ? QUENDEL_ACT_PROGRESS_FAILED : QUENDEL_ACT_PROGRESS_DONE;
  if (const std::optional<Result> closed = HaveDaemonCloseSession(id, progress)) {
    return *closed;
  }
  Result result;
  if (IsSessionOpen()) {
    result = RunJob(limits, "the server's answer", [&] { return EndSession(id, progress); });
  } else {
    result.reason = "no-session";
    result.lines = {"No remote session is open."};
  }
  result.members["request_id"] = id;
  result.members["progress"] = progress;
  return result;
}

Action DeclareClose(CLI::App& command) {
  const auto arguments = std::make_shared<CloseArguments>();
  command.add_option("ID", arguments->id, "Number that the server gave the request")
      ->required()
      ->type_name("");
  command.add_flag("--failed", arguments->failed, "Report the session as failed, not as done");
  DeclareLimits(command, arguments->limits, WaitFor::kAnswer);
  return [arguments] { return CloseSession(*arguments); };
}

// The key is a secret: it goes to the standard output, and nowhere else.
Result ShowKey() {
  Result result;
  std::string key(kMaxSessionKeyBytes, '\0');
  if (QUENDELGetRemoteSessionKey(key.data(), static_cast<int>(key.size())) != 0) {
    result.lines = {"There is no session key."};
    return result;
  }
  key.erase(key.find_last_not_of('\0') + 1);
  if (key.size() == kMaxSessionKeyBytes) {
    syslog(LOG_ERR, "the session key may be longer than what was read of it");
    result.lines = {"The session key is too long."};
    return result;
  }
  std::string hex;
  QUENDELBytesToHex(hex, reinterpret_cast<const unsigned char*>(key.data()),
                    static_cast<int>(key.size()));
  const bool isAscii =
      std::all_of(key.begin(), key.end(), [](unsigned char c) { return c < 0x80; });
  result.success = true;
  result.members["key"] = isAscii ? Json::Value(key) : Json::Value();
  result.members["key_hex"] = hex;
  result.bytes = key;
  return result;
}

Action DeclareKey(CLI::App& command) {
  const auto limits = std::make_shared<LimitArguments>();
  DeclareLimits(command, *limits, WaitFor::kAnswer);
  return [limits] { return RunJob(ReadLimits(*limits), "the key", ShowKey); };
}

Action DeclareRemote(CLI::App& command) {
  return DeclareGroup(
      command,
      {
          {"create", "Open a session: make the support account and note how to end it",
           R"(The ssh service is neither started nor asked for: start it before, if it does not run.

Examples:
  quendelctl remote create support staff.pub
  quendelctl remote create support staff.pub --stop-sshd)",
           DeclareCreate},
          {"close", "End the session: delete the account and report to the server",
           R"(Examples:
  quendelctl remote close 17
  quendelctl remote close 17 --failed)",
           DeclareClose},
          {"key", "Show the key of the current session, which is a secret",
           R"(The key's bytes are printed as they are, with no line end of their own; a terminal gets those
escaped that could act on it. Zero bytes at the end are left out.

Examples:
  quendelctl remote key
  quendelctl remote key --json)",
           DeclareKey},
      });
}

}  // namespace

std::vector<Command> RemoteCommands() {
  return {{"remote", "Open and end a session of the vendor's support staff", "", DeclareRemote}};
}

}  // namespace quendelctl
