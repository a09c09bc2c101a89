// What a desk makes for itself when it starts for the first time.
#include "secrets.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <cerrno>
#include <cstdio>
#include <fstream>
#include <optional>
#include <sstream>
#include <stdexcept>
#include <system_error>

namespace quendeldesk {
namespace {

constexpr size_t kTokenBytes = 32;

[[noreturn]] void Fail(const std::string& what) {
  throw std::system_error(errno, std::generic_category(), what);
}

std::optional<std::string> ReadWhole(const std::string& path) {
  const std::ifstream file(path, std::ios::binary);
  if (!file.is_open()) {
    return std::nullopt;
  }
  std::ostringstream text;
  text << file.rdbuf();
  return text.str();
}

// The file is there whole or not at all.
void WriteSecret(const std::string& path, const std::string& text) {
  const std::string draft = path + ".draft";
  const Descriptor file(open(draft.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
  if (!file || write(file.get(), text.data(), text.size()) != static_cast<ssize_t>(text.size()) ||
      fsync(file.get()) != 0 || rename(draft.c_str(), path.c_str()) != 0) {
    Fail("cannot write " + path);
  }
}

}  // namespace

// The key is written last: it is what tells that the pair is whole.
Identity OwnIdentity(const std::string& folder, const std::string& host) {
  const std::string certificateFile = folder + "/certificate.pem";
  const std::string keyFile = folder + "/key.pem";
  const std::optional<std::string> certificate = ReadWhole(certificateFile);
  const std::optional<std::string> key = ReadWhole(keyFile);
  if (certificate && key) {
    return {*certificate, *key};
  }
  if (key) {
    throw std::runtime_error("there is " + keyFile + ", but no " + certificateFile);
  }
  Identity made = MakeIdentity(host);
  WriteSecret(certificateFile, made.certificate);
  WriteSecret(keyFile, made.key);
  return made;
}

std::string OwnToken(const std::string& folder) {
  const std::string file = folder + "/token";
  std::string token = ReadWhole(file).value_or("");
  token.erase(token.find_last_not_of(" \r\n") + 1);
  if (token.empty()) {
    token = RandomHex(kTokenBytes);
    WriteSecret(file, token + "\n");
  }
  return token;
}

Descriptor LockFolder(const std::string& folder) {
  const std::string path = folder + "/lock";
  Descriptor file(open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
  if (!file) {
    Fail("cannot open " + path);
  }
  if (flock(file.get(), LOCK_EX | LOCK_NB) != 0) {
    throw std::runtime_error("another quendel-desk serves " + folder);
  }
  return file;
}

}  // namespace quendeldesk
