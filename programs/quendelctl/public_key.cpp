// The public key that opens a session.
#include "public_key.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cerrno>
#include <cstring>
#include <stdexcept>

#include "arguments.h"
#include "job.h"
#include "platform/process.h"

namespace quendelctl {
namespace {

constexpr char kArgument[] = "KEYFILE";
constexpr char kSshKeygen[] = "/usr/bin/ssh-keygen";
constexpr size_t kMostKeyBytes = 16384;

[[noreturn]] void Refuse(const std::string& file, const std::string& reason) {
  throw CLI::ValidationError(kArgument, (file == "-" ? "the standard input" : file) + reason);
}

class Descriptor {
 public:
  explicit Descriptor(int number) : number_(number) {}
  ~Descriptor() {
    if (number_ >= 0) {
      close(number_);
    }
  }
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  int get() const { return number_; }

 private:
  const int number_;
};

// Whoever owns the target of a link may be read by nobody but himself, so this would hand it on.
void CheckOwner(const std::string& name, const struct stat& status) {
  struct stat entry = {};
  const bool isLink = lstat(name.c_str(), &entry) == 0 && S_ISLNK(entry.st_mode);
  if ((isLink || entry.st_ino != status.st_ino) && status.st_uid != geteuid()) {
    Refuse(name, " is a link to what somebody else owns");
  }
}

// A pipe would be waited for, and a device may have no end.
std::string ReadPlainFile(const std::string& name) {
  const Descriptor file(open(name.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  struct stat status = {};
  if (file.get() < 0 || fstat(file.get(), &status) != 0) {
    throw CLI::ValidationError(kArgument, "cannot read " + name + ": " + strerror(errno));
  }
  if (!S_ISREG(status.st_mode)) {
    Refuse(name, " is not a file");
  }
  CheckOwner(name, status);
  std::string text(kMostKeyBytes + 1, '\0');
  size_t size = 0;
  ssize_t got = 0;
  while (size < text.size() && (got = read(file.get(), &text[size], text.size() - size)) > 0) {
    size += static_cast<size_t>(got);
  }
  if (got < 0) {
    throw CLI::ValidationError(kArgument, "cannot read " + name + ": " + strerror(errno));
  }
  if (size > kMostKeyBytes) {
    Refuse(name, " is longer than " + std::to_string(kMostKeyBytes) + " bytes");
  }
  text.resize(size);
  return text;
}

bool IsControl(char c) {
  const auto byte = static_cast<unsigned char>(c);
  return (byte < 0x20 && byte != '\t') || byte == 0x7F;
}

// Returns the key without its comment: its type and its bytes. Options would stand before the type.
std::string BareKey(const std::string& file, std::string line) {
  if (!line.empty() && line.back() == '\n') {
    line.pop_back();
  }
  if (line.find("PRIVATE KEY-----") != line.npos) {  // everybody on the device could read it
    Refuse(file, " holds a private key");
  }
  if (line.find('\n') != line.npos) {
    Refuse(file, " has more than one line: one public key is needed");
  }
  if (std::any_of(line.begin(), line.end(), IsControl)) {
    Refuse(file, " is not a text");
  }
  constexpr char kBlanks[] = " \t";
  constexpr char kTypeBytes[] = "abcdefghijklmnopqrstuvwxyz0123456789-.@";
  const size_t typeEnd = line.find_first_of(kBlanks);
  const std::string type = line.substr(0, typeEnd);
  if (type.find_first_not_of(kTypeBytes) != type.npos || type.find("-cert-") != type.npos) {
    Refuse(file, " is not a public key, or one with options");
  }
  const size_t begin = std::min(line.find_first_not_of(kBlanks, typeEnd), line.size());
  const size_t end = line.find_first_of(kBlanks, begin);
  return type + " " + line.substr(begin, end - begin) + "\n";
}

// ssh-keygen reads a file, and this one is nowhere but in memory.
Result AskSshKeygen(const std::string& key) {
  const Descriptor memory(memfd_create("public key", MFD_CLOEXEC));
  Result result;
  if (memory.get() < 0 || write(memory.get(), key.data(), key.size()) < 0) {
    throw std::runtime_error(std::string("cannot hand the key to ssh-keygen: ") + strerror(errno));
  }
  const std::string path =
      "/proc/" + std::to_string(getpid()) + "/fd/" + std::to_string(memory.get());
  const int status = ALIBCExec(kSshKeygen, "-l", "-f", path.c_str(), nullptr);
  if (status < 0) {
    throw std::runtime_error(std::string("cannot start ") + kSshKeygen + ": " + strerror(errno));
  }
  result.success = true;
  result.members["accepted"] = status == 0;
  return result;
}

}  // namespace

std::string ReadPublicKey(const std::string& file, const WorkerLimits& limits) {
  std::string text = file == "-" ? ReadText(kArgument, file, kMostKeyBytes) : ReadPlainFile(file);
  const std::string key = BareKey(file, text);
  const Result answer = RunJob(limits, "ssh-keygen", [&] { return AskSshKeygen(key); });
  if (!answer.success) {
    throw std::runtime_error("the key could not be examined: " + answer.lines.at(0));
  }
  if (!answer.members["accepted"].asBool()) {
    Refuse(file, " is not a public key, or one with options");
  }
  return text;
}

}  // namespace quendelctl
