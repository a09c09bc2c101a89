// The command that carries out a request for files.
#include <regex.h>
#include <sys/random.h>

#include <cerrno>
#include <memory>
#include <new>
#include <system_error>

#include "arguments.h"
#include "command.h"
#include "job.h"
#include "limit_options.h"
#include "quendel.h"

namespace quendelctl {
namespace {

constexpr char kDebugArchive[] = "debug.dat";
// The library's rule. It would refuse the whole request as well, and say less.
constexpr char kDumpPattern[] = "^(/var/crash/|/volume[0-9]+/)@.+\\.core$";

struct UploadArguments {
  std::string id;
  std::vector<std::string> files;
  std::vector<std::string> uuids;
  LimitArguments limits;
};

// Returns a random UUID, of version 4 and variant 1.
std::string NewUuid() {
  unsigned char bytes[16];
  if (getrandom(bytes, sizeof bytes, 0) != sizeof bytes) {
    throw std::system_error(errno, std::generic_category(), "cannot make a UUID");
  }
  bytes[6] = static_cast<unsigned char>((bytes[6] & 0x0F) | 0x40);
  bytes[8] = static_cast<unsigned char>((bytes[8] & 0x3F) | 0x80);
  std::string uuid;
  QUENDELBytesToHex(uuid, bytes, sizeof bytes);
  for (const size_t dash : {8U, 13U, 18U, 23U}) {
    uuid.insert(dash, 1, '-');
  }
  return uuid;
}

Json::Value RequestFor(const UploadArguments& arguments) {
  Json::Value files = Json::arrayValue;
  for (size_t i = 0; i < arguments.files.size(); ++i) {
    const bool isArchive = arguments.files[i] == kDebugArchive;
    Json::Value file;
    file["file_type"] = isArchive ? kDebugArchive : "coredump";
    file["file_path"] = isArchive ? "" : arguments.files[i];
    file["file_uuid"] = arguments.uuids.empty() ? NewUuid() : arguments.uuids[i];
    files.append(file);
  }
  return files;
}

bool IsCrashDump(const std::string& path) {
  regex_t pattern;
  if (regcomp(&pattern, kDumpPattern, REG_EXTENDED | REG_NOSUB) != 0) {
    throw std::bad_alloc();
  }
  const bool matches = regexec(&pattern, path.c_str(), 0, nullptr, 0) == 0;
  regfree(&pattern);
  return matches;
}

// Nothing else of the device can be asked for.
void CheckFiles(const std::vector<std::string>& files) {
  constexpr size_t kMostFiles = 5;
  for (const std::string& file : files) {
    if (file != kDebugArchive && !IsCrashDump(file)) {
      throw CLI::ValidationError(
          "FILE", file + " is neither debug.dat nor /var/crash/@NAME.core or /volumeN/@NAME.core");
    }
  }
  if (files.size() > kMostFiles) {
    throw CLI::ValidationError("FILE", "at most five can be sent at once");
  }
}

Result Upload(int id, const Json::Value& files) {
  Result result;
  result.success = QUENDELUploadFile(id, QUENDEL_ACT_PROGRESS_RUN, files) == 0;
  result.lines = {"Request " + std::to_string(id) +
                  (result.success ? " is answered. It asked for:" : " failed. It asked for:")};
  for (const Json::Value& file : files) {
    const std::string path = file["file_path"].asString();
    result.lines.push_back("  " + file["file_uuid"].asString() + "  " +
                           file["file_type"].asString() + (path.empty() ? "" : "  " + path));
  }
  result.members["request_id"] = id;
  result.members["files"] = files;
  return result;
}

Result CarryOut(const UploadArguments& arguments) {
  const int id = ReadNumber("ID", arguments.id);
  CheckFiles(arguments.files);
  if (!arguments.uuids.empty() && arguments.uuids.size() != arguments.files.size()) {
    throw CLI::ValidationError("--uuid", "needed once for each FILE, or not at all");
  }
  const Json::Value files = RequestFor(arguments);
  return RunJob(ReadLimits(arguments.limits), "the upload to end",
                [&] { return Upload(id, files); });
}

Action DeclareUpload(CLI::App& command) {
  const auto arguments = std::make_shared<UploadArguments>();
  command.add_option("ID", arguments->id, "Number that the server gave the request")
      ->required()
      ->type_name("");
  command
      .add_option("FILE", arguments->files,
                  "Absolute path of a crash dump, or the word debug.dat for debug\n"
                  "data collected now; at most five")
      ->required()
      ->type_name("");
  command
      .add_option("--uuid", arguments->uuids,
                  "The server's identifier of a file: once for each FILE, in their\n"
                  "order; made up if not given")
      ->type_name("UUID")
      ->allow_extra_args(false);
  DeclareLimits(command, arguments->limits, WaitFor::kTransfer);
  return [arguments] { return CarryOut(*arguments); };
}

}  // namespace

std::vector<Command> UploadCommands() {
  return {
      {"upload", "Send the server files that it asked for",
       R"(A crash dump is /var/crash/@NAME.core or /volumeN/@NAME.core, where N is a number and NAME may
have folders in it: nothing else of the device is ever sent. One path that is neither is a wrong
command line, and nothing is sent.

A file that cannot be prepared drops out: its reason is logged. When no file is left, the server
is told so, which counts as success.

Examples:
  quendelctl upload 17 /var/crash/@demo.core
  quendelctl upload 17 debug.dat --uuid 3f0c9a52-8f0e-4c59-9d3b-1f2a7c6e5d40)",
       DeclareUpload},
  };
}

}  // namespace quendelctl
