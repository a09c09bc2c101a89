// Runs the real quendelctl and keeps what it printed.
#include "quendelctl/run_quendelctl.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <json/reader.h>
#include <pty.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <cstdlib>
#include <thread>

#include "support/appliance.h"

namespace quendel::test {
namespace {

Output Run(const std::string& program, std::vector<std::string> arguments,
           const std::string& input) {
  WriteFile("/tmp/run/in", input);
  arguments.insert(arguments.begin(), program);
  std::vector<char*> argv;
  for (std::string& argument : arguments) {
    argv.push_back(argument.data());
  }
  argv.push_back(nullptr);

  constexpr int kWrite = O_WRONLY | O_CREAT | O_TRUNC;
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, "/tmp/run/in", O_RDONLY, 0);
  posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/tmp/run/out", kWrite, 0600);
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/tmp/run/err", kWrite, 0600);
  // Whoever started this test may have left more open, and one test counts what is.
  posix_spawn_file_actions_addclosefrom_np(&actions, STDERR_FILENO + 1);
  pid_t child = 0;
  EXPECT_EQ(posix_spawn(&child, argv[0], &actions, nullptr, argv.data(), environ), 0);
  posix_spawn_file_actions_destroy(&actions);
  int status = 0;
  EXPECT_EQ(waitpid(child, &status, 0), child);
  return {WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status),
          ReadFile("/tmp/run/out"), ReadFile("/tmp/run/err")};
}

}  // namespace

Output Quendelctl(const std::vector<std::string>& arguments, const std::string& input) {
  return Run(QUENDELCTL, arguments, input);
}

Output Shell(const std::string& command) {
  setenv("quendelctl", QUENDELCTL, 1);
  return Run("/bin/sh", {"-c", command}, "");
}

Terminal OnTerminal(const std::vector<std::string>& arguments, unsigned short columns,
                    const char* kind, const std::function<void(int)>& type) {
  winsize size = {};
  size.ws_row = 24;
  size.ws_col = columns;
  int master = -1;
  const pid_t child = forkpty(&master, nullptr, nullptr, &size);
  if (child == 0) {
    setenv("TERM", kind, 1);
    signal(SIGINT, SIG_DFL);  // whoever started this test may ignore them
    signal(SIGQUIT, SIG_DFL);
    std::vector<const char*> argv = {QUENDELCTL};
    for (const std::string& argument : arguments) {
      argv.push_back(argument.c_str());
    }
    argv.push_back(nullptr);
    execv(QUENDELCTL, const_cast<char**>(argv.data()));
    _exit(127);
  }
  std::thread typist([&] {
    if (type) {
      type(master);
    }
  });
  Terminal terminal;
  char chunk[4096];
  ssize_t got = 0;
  while ((got = read(master, chunk, sizeof chunk)) > 0) {
    terminal.shown.append(chunk, static_cast<size_t>(got));
  }
  typist.join();
  int status = 0;
  waitpid(child, &status, 0);
  close(master);
  terminal.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  return terminal;
}

Json::Value FromJsonLine(const std::string& line) {
  EXPECT_EQ(std::count(line.begin(), line.end(), '\n'), 1) << line;
  EXPECT_TRUE(std::all_of(line.begin(), line.end(), [](char c) {
    return c == '\n' || (c >= ' ' && c <= '~');
  })) << line;
  Json::Value value;
  EXPECT_TRUE(Json::Reader(Json::Features::strictMode()).parse(line, value)) << line;
  return value;
}

}  // namespace quendel::test
