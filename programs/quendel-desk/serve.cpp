// A running desk.
#include "serve.h"

#include <sys/resource.h>

#include <algorithm>
#include <csignal>
#include <thread>

#include "acceptor.h"
#include "access_log.h"
#include "api_service.h"
#include "device_service.h"
#include "secrets.h"

namespace quendeldesk {
namespace {

constexpr char kPeopleAddress[] = "127.0.0.1";
constexpr unsigned kPeopleThreads = 2;

// A connection is a descriptor, and the shell's usual thousand are few.
void RaiseDescriptorLimit() {
  rlimit limit = {};
  getrlimit(RLIMIT_NOFILE, &limit);
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

// Before there is a thread, as each takes its mask from whoever starts it.
sigset_t BlockEndSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  signal(SIGPIPE, SIG_IGN);
  return signals;
}

unsigned ThreadsFor(const Settings& settings) {
  const unsigned processors = std::max(2U, std::thread::hardware_concurrency());
  return settings.threads > 0 ? settings.threads : processors;
}

Acceptor::Hand To(HttpServer& server) {
  return [&server](int descriptor, const sockaddr* address, socklen_t size) {
    server.Take(descriptor, address, size);
  };
}

}  // namespace

void Serve(const Settings& settings) {
  const sigset_t signals = BlockEndSignals();
  RaiseDescriptorLimit();
  Desk desk(settings);
  const Descriptor lock = LockFolder(settings.data);
  desk.archive.Recover();
  const Identity identity = OwnIdentity(settings.data, settings.host);
  ConnectionTable table(settings.connections);
  DeviceService devices(desk);
  ApiService people(desk, table, OwnToken(settings.data));
  HttpServer deviceServer(devices, table, settings.http, ThreadsFor(settings), &identity);
  HttpServer peopleServer(people, table, settings.http, kPeopleThreads, nullptr);
  Acceptor acceptor(table, settings.http.head_time);
  acceptor.Listen(settings.device_address, settings.device_port, To(deviceServer));
  acceptor.Listen(kPeopleAddress, settings.people_port, To(peopleServer));
  acceptor.Start();
  LogLine("listening for devices on port " + std::to_string(settings.device_port) +
          " and for people on " + kPeopleAddress + ":" + std::to_string(settings.people_port));
  int signal = 0;
  sigwait(&signals, &signal);
  LogLine("ending");
}

}  // namespace quendeldesk
