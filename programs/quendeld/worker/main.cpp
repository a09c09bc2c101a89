// quendel-worker: does one piece of work for quendeld and ends. It takes a line of JSON from its
// standard input and gives one on its standard output.
#include <fcntl.h>
#include <sys/prctl.h>
#include <syslog.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <cstring>
#include <exception>
#include <string>

#include "json.h"
#include "quendel.h"
#include "worker/work.h"

namespace quendel_worker {
namespace {

struct Row {
  const char* work;
  Json::Value (*function)(const Json::Value& request);
};

constexpr Row kWorks[] = {
    {"facts", TellFacts},
    {"look", Look},
    {"heartbeat", SendHeartbeat},
    {"report", SendReports},
    {"event", SendEvent},
    {"sample", TakeSample},
    {"collect", Collect},
    {"send_outbox", SendOutbox},
    {"tidy", Tidy},
    {"upload", Upload},
    {"remote_close", CloseRemote},
    {"stopping", TellWhyStopping},
    {"power", SwitchPower},
};

std::string ReadRequest() {
  std::string text;
  char part[8192];
  ssize_t got = 0;
  while (text.find('\n') == std::string::npos &&
         (got = read(STDIN_FILENO, part, sizeof part)) > 0) {
    text.append(part, static_cast<size_t>(got));
  }
  return text;
}

// Keeps the answer's way to itself: what the work starts gets /dev/null for both streams, and can
// neither answer nor hold the pipe.
int TakeAnswerPipe() {
  const int answer = fcntl(STDOUT_FILENO, F_DUPFD_CLOEXEC, STDERR_FILENO + 1);
  const int null = open("/dev/null", O_RDWR | O_CLOEXEC);
  dup2(null, STDIN_FILENO);
  dup2(null, STDOUT_FILENO);
  close(null);
  return answer;
}

Json::Value Work(const Json::Value& request) {
  const std::string work = quendeld::TextOf(request, "work");
  for (const Row& row : kWorks) {
    if (work == row.work) {
      return row.function(request);
    }
  }
  syslog(LOG_ERR, "there is no work of the name \"%s\"", work.c_str());
  return Failed();
}

// An answer that does not fit the pipe would wait for a reader that waits for the worker's end.
int GiveAnswer(int pipe, const Json::Value& answer) {
  std::string line = quendeld::JsonLine(answer) + "\n";
  if (line.size() > static_cast<size_t>(fcntl(pipe, F_GETPIPE_SZ))) {
    syslog(LOG_ERR, "an answer of %zu bytes is too long", line.size());
    line = quendeld::JsonLine(Failed()) + "\n";
  }
  return write(pipe, line.data(), line.size()) == static_cast<ssize_t>(line.size()) ? 0 : 1;
}

int Run() {
  const std::optional<Json::Value> request = quendeld::JsonFromText(ReadRequest());
  if (!request) {
    fprintf(stderr, "quendel-worker: a part of quendeld, which starts it with a request\n");
    return 2;
  }
  const int answer = TakeAnswerPipe();
  return GiveAnswer(answer, Work(*request));
}

}  // namespace

Json::Value Failed() {
  Json::Value answer = Json::objectValue;
  answer["result"] = -1;
  return answer;
}

Json::Value Disabled() {
  Json::Value answer = Failed();
  answer["disabled"] = true;
  return answer;
}

}  // namespace quendel_worker

int main(int argc, char** argv) {
  prctl(PR_SET_PDEATHSIG, SIGKILL);  // nobody would take the answer
  const bool foreground = argc > 1 && strcmp(argv[1], "--foreground") == 0;
  openlog("quendel-worker", LOG_PID | (foreground ? LOG_PERROR : 0), LOG_DAEMON);
  try {
    return quendel_worker::Run();
  } catch (const std::exception& error) {
    syslog(LOG_ERR, "the work was given up: %s", error.what());
    return 1;
  }
}
