// What tests put on the device, and ask of it.
#include "support/device.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "quendel.h"
#include "support/appliance.h"
#include "support/require.h"
#include "support/xz.h"

namespace quendel::test {
namespace {

namespace fs = std::filesystem;

void PushArchive(const std::string& log, const std::string& text) {
  int number = 1;
  while (Exists(ArchiveOf(log, number))) {
    ++number;
  }
  for (; number > 1; --number) {
    fs::rename(ArchiveOf(log, number - 1), ArchiveOf(log, number));
  }
  WriteFile(ArchiveOf(log, 1), Xz(text));
}

}  // namespace

std::string InstallLog(const std::string& name, const std::string& path) {
  const std::string conf = std::string(kConfFolder) + "/quendel.log." + name;
  WriteFile(conf, "name=" + name + "\npath=" + path +
                      "\nlast_hash=\"\"\ntar_log_inode=\"\"\nlast_byte=\"\"\ntotal_byte=\"\"\n"
                      "inode=\"\"\n");
  return conf;
}

std::string InstallUdc(const std::string& name, const std::string& script) {
  const std::string conf = std::string(kConfFolder) + "/quendel.udc." + name;
  const std::string program = "/volume1/" + name;
  WriteFile(conf, "name=" + name + "\npath=" + program + "\nlast_hash=\"\"\n");
  InstallTool(program, script);
  return conf;
}

void InstallTool(const std::string& path, const std::string& script) {
  RemoveFile(path);
  WriteFile(path, "#!/bin/sh\n" + script + "\n");
  fs::permissions(path, fs::perms(0755));
}

void AppendFile(const std::string& path, const std::string& text) {
  std::ofstream out(path, std::ios::binary | std::ios::app);
  out << text << std::flush;
  Require(out.good(), "cannot append to " + path);
}

std::string ArchiveOf(const std::string& log, int number) {
  return log + "." + std::to_string(number) + ".xz";
}

void Rotate(const std::string& log) {
  const std::string text = ReadFile(log);
  // The new log is there before the old one goes, so that it cannot have the old one's inode.
  fs::rename(log, log + ".1");
  WriteFile(log, "");
  PushArchive(log, text);
  fs::remove(log + ".1");
}

void CopyTruncate(const std::string& log) {
  PushArchive(log, ReadFile(log));
  fs::resize_file(log, 0);
}

struct stat StatusOf(const std::string& path) {
  struct stat status = {};
  EXPECT_EQ(stat(path.c_str(), &status), 0) << path;
  return status;
}

mode_t ModeOf(const std::string& path) {
  return StatusOf(path).st_mode;
}

uint64_t InodeOf(const std::string& path) {
  return StatusOf(path).st_ino;
}

int OpenDescriptors() {
  return static_cast<int>(
      std::distance(fs::directory_iterator("/proc/self/fd"), fs::directory_iterator()));
}

std::string Md5Of(const std::string& text) {
  char digits[33];
  QUENDELMD5String(text, digits);
  return digits;
}

}  // namespace quendel::test
