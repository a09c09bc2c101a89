// What the benchmarks set up: collectors with their logs, and other programs to compare with.
#include "scene.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>

namespace bench {
namespace {

constexpr char kFreshState[] =
    "last_hash=\"\"\ntar_log_inode=\"\"\nlast_byte=\"\"\ntotal_byte=\"\"\ninode=\"\"\n";

}  // namespace

void Require(bool holds, const std::string& what) {
  if (!holds) {
    perror(what.c_str());
    exit(1);
  }
}

void WriteText(const std::string& path, const std::string& text) {
  std::ofstream out(path, std::ios::binary);
  out << text << std::flush;
  Require(static_cast<bool>(out), path);
}

void AppendLines(const std::string& path, int64_t bytes) {
  std::string block;
  for (int i = 0; block.size() < kMebibyte; ++i) {
    block += "2024-03-05T07:08:09.123456+00:00 appliance service[" +
             std::to_string(1000 + i % 9000) + "]: request " + std::to_string(i * 7919 % 1000003) +
             " done\n";
  }
  std::ofstream out(path, std::ios::binary | std::ios::app);
  for (int64_t written = 0; written < bytes; written += static_cast<int64_t>(block.size())) {
    out << block;
  }
  out << std::flush;
  Require(static_cast<bool>(out), path);
}

void MakeEmptyFolder(const std::string& path) {
  std::filesystem::remove_all(path);
  std::filesystem::create_directories(path);
}

std::string ConfOf(const std::string& name) {
  return "/usr/arvo/etc/quendel/quendel.log." + name;
}

void InstallLog(const std::string& name, const std::string& path) {
  WriteText(ConfOf(name), "name=" + name + "\npath=" + path + "\n" + kFreshState);
}

rusage RunProgram(std::vector<std::string> words, const std::string& output) {
  std::vector<char*> arguments;
  for (std::string& word : words) {
    arguments.push_back(word.data());
  }
  arguments.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 1, output.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
  pid_t child = 0;
  Require(posix_spawn(&child, arguments[0], &actions, nullptr, arguments.data(), environ) == 0,
          words[0]);
  posix_spawn_file_actions_destroy(&actions);
  int status = -1;
  rusage usage = {};
  Require(wait4(child, &status, 0, &usage) == child && status == 0, words[0]);
  return usage;
}

}  // namespace bench
