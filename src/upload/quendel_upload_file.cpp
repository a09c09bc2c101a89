// The upload action: the server asks for crash dumps and debug data, and gets them.
#include <regex.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstring>
#include <ctime>
#include <string>
#include <vector>

#include "base/json_text.h"
#include "base/log.h"
#include "base/ownership.h"
#include "base/paths.h"
#include "platform/file.h"
#include "platform/process.h"
#include "quendel/conversation.h"
#include "quendel/upload.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_upload_file";

constexpr char kDumpType[] = "coredump";
constexpr char kDebugType[] = "debug.dat";
constexpr char kDumpPattern[] = "^(/var/crash/|/volume[0-9]+/)@.+\\.core$";
constexpr Json::ArrayIndex kMaxFiles = 5;

// The name of a prepared file, its NUL included.
constexpr size_t kMaxPathBytes = 1024;

constexpr unsigned int kPrivateMode = 0700;
constexpr char kCollectorTool[] = "/usr/arvo/bin/arvomsg_collector2";

bool MatchesDumpPattern(const char* path) {
  regex_t pattern;
  if (regcomp(&pattern, kDumpPattern, REG_EXTENDED | REG_NOSUB) != 0) {
    return false;
  }
  const bool matches = regexec(&pattern, path, 0, nullptr, 0) == 0;
  regfree(&pattern);
  return matches;
}

// The server is not authenticated, so nothing is touched before every path has passed.
bool PathsAreValid(const Json::Value& files) try {
  if (!files.isArray() && !files.isNull()) {
    QUENDEL_LOG("Invalid file path '%s'", "");
    return false;
  }
  for (const Json::Value& file : files) {
    if (JsonText(file, "file_type") == kDebugType) {
      continue;
    }
    const std::string path = JsonText(file, "file_path");
    if (!MatchesDumpPattern(path.c_str())) {
      QUENDEL_LOG("Invalid file path '%s'", path.c_str());
      return false;
    }
  }
  return true;
} catch (...) {
  return false;
}

// Where a request's files are prepared.
struct Preparation {
  const char* temp_dir = "";  // is removed at the end; of two kinds of file, the last one's
  std::string file;           // the one that was prepared last
};

// What is not there is no danger: the next step finds out.
bool IsOursOrNothing(const char* directory) {
  return IsOurDirectory(directory) || errno == ENOENT;
}

bool MakeDirectory(const char* path) {
  // Before the platform could make it, who may follow a link that somebody puts there meanwhile.
  mkdir(kWorkRoot, kPrivateMode);
  if (!IsOursOrNothing(kWorkRoot) || ARVOFSMkdirP(path, 0, 1, -1, -1, kPrivateMode) < 0 ||
      !IsOursOrNothing(kWorkRoot) || !IsOursOrNothing(path)) {
    QUENDEL_LOG("Fail to ARVOFSMkdirP for '%s'", path);
    return false;
  }
  return true;
}

// A copy that cannot be moved must not stay beside the dump, where nobody would ever remove it.
bool MoveCompressedDump(const std::string& compressed) {
  if (ALIBCExec("/bin/mv", compressed.c_str(), kDumpDir, nullptr, nullptr) != 0) {
    QUENDEL_LOG("Fail to move coredump");
    if (ALIBCExecl("/bin/rm", platform::kRunFlags, "-rf", compressed.c_str(), nullptr) == -1) {
      QUENDEL_LOG("Fail to remove temp log zip [%s]", compressed.c_str());  // [sic]
    }
    return false;
  }
  return true;
}

bool PrepareDump(const std::string& dump, Preparation& preparation) {
  if (!MakeDirectory(kDumpDir)) {
    return false;
  }
  preparation.temp_dir = kDumpDir;
  const std::string compressed = dump + ".xz";
  if (compressed.size() >= kMaxPathBytes) {
    return false;  // a name cut to its buffer could be that of the dump, which would then be moved
  }
  if (ALIBCExec("/bin/xz", "-kf", dump.c_str(), nullptr, nullptr) != 0) {
    QUENDEL_LOG("Fail to compress coredump");
    return false;
  }
  if (!MoveCompressedDump(compressed)) {
    return false;
  }
  preparation.file = std::string(kDumpDir) + "/" + basename(compressed.c_str());
  return true;
}

bool PrepareDebugArchive(Preparation& preparation) {
  if (!MakeDirectory(kDebugDir)) {
    return false;
  }
  preparation.temp_dir = kDebugDir;
  if (ALIBCExec(kCollectorTool, kDebugDir, nullptr, nullptr, nullptr) != 0) {
    QUENDEL_LOG("Fail to do log collector %s %s", kCollectorTool, kDebugDir);
    return false;
  }
  // Deliberate: this archive lies beside the temporary directory and stays when that is removed.
  preparation.file = std::string(kDebugDir) + ".zip";
  const char* const archive = preparation.file.c_str();
  if (!IsOurFileOrNothing(archive) ||
      ALIBCExecl("/usr/bin/zip", platform::kRunFlags, "-q", "-9", "-UN=UTF8", "-E", "-yf", "-r",
                 archive, kDebugDir, nullptr) < 0) {
    QUENDEL_LOG("Fail to zip attachment %s", archive);
    return false;
  }
  return true;
}

// Prepares one file by its type. Returns false when the file is given up.
bool PrepareFile(const std::string& path, const std::string& type, Preparation& preparation) try {
  if (type == kDumpType) {
    return PrepareDump(path, preparation);
  }
  if (type == kDebugType) {
    return PrepareDebugArchive(preparation);
  }
  QUENDEL_LOG("Get unknown upload file type: \"%s\".", type.c_str());
  return false;
} catch (...) {
  return false;
}

std::vector<QUENDELSendDataParam_t> PrepareFiles(const Json::Value& files,
                                                 Preparation& preparation) {
  std::vector<QUENDELSendDataParam_t> prepared;
  for (const Json::Value& file : files) {
    // Up to the first NUL, as the pattern saw it: the tools must be given no other text.
    const std::string path = JsonText(file, "file_path").c_str();
    QUENDELSendDataParam_t item;
    item.fileuuid = JsonText(file, "file_uuid");
    item.type = JsonText(file, "file_type");
    item.timestamp = static_cast<uint64_t>(time(nullptr));
    if (!PrepareFile(path, item.type, preparation)) {
      QUENDEL_LOG("Prepare uploaded file failed [%s]:[%s]", item.type.c_str(), path.c_str());
      continue;
    }
    item.path = preparation.file;
    prepared.push_back(item);
  }
  return prepared;
}

bool ReportNoFile(int actionId) try {
  return QUENDELUpdateActRequestProgress(actionId, QUENDEL_ACT_PROGRESS_NO_FILE,
                                         Json::Value(Json::objectValue)) >= 0;
} catch (...) {
  return false;
}

// Does everything the request asks for.
// Deliberate: of two kinds of file, the kind prepared first leaves its own directory.
int AnswerRequest(int actionId, const Json::Value& files, Preparation& preparation) try {
  if (!PathsAreValid(files)) {
    QUENDEL_LOG("Validate filepath failed");
    return -1;
  }
  if (files.size() > kMaxFiles) {
    QUENDEL_LOG("Upload files exceed the max limit");
    return -1;
  }
  const std::vector<QUENDELSendDataParam_t> prepared = PrepareFiles(files, preparation);
  if (prepared.empty()) {
    if (!ReportNoFile(actionId)) {
      QUENDEL_LOG("Failed to update progress to server");
      return -1;
    }
    return 0;
  }
  if (QUENDELSendUploadData(actionId, prepared) < 0) {
    QUENDEL_LOG("Send collect data fail");
    return -1;
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Send collect data fail");
  return -1;
}

void RemoveTempDir(const char* tempDir) {
  if (*tempDir == '\0') {
    return;
  }
  if (ALIBCExecl("/bin/rm", platform::kRunFlags, "-rf", tempDir, nullptr) == -1) {
    QUENDEL_LOG("Fail to remove temp logs [%s]", tempDir);
  }
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELUploadFile(int actionId, QuendelActionProgress_t progress, const Json::Value& files) {
  if (progress != QUENDEL_ACT_PROGRESS_RUN) {
    return 0;
  }
  Preparation preparation;
  const int result = AnswerRequest(actionId, files, preparation);
  RemoveTempDir(preparation.temp_dir);
  return result;
}
