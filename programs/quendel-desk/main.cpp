// The service's server for a laboratory or a small fleet.
#include <sys/stat.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <cstdio>
#include <map>

#include "commands.h"
#include "quendel/version.h"
#include "serve.h"

namespace quendeldesk {
namespace {

constexpr int kExitSuccess = 0;
constexpr int kExitFailed = 1;
constexpr int kExitUsage = 2;

constexpr char kDescription[] =
    "Serves devices that have libquendel: takes their heartbeats, events and files, keeps them in a\n"
    "folder, and hands out actions. Without a command it serves; the folder is made when it is not\n"
    "there, with a certificate and a token. The commands work while a desk serves the folder, and\n"
    "while none does.";

void DeclareServing(CLI::App& app, Settings& settings) {
  const std::map<std::string, Enrolment> enrolments = {
      {"open", Enrolment::kOpen}, {"list", Enrolment::kList}, {"approval", Enrolment::kApproval}};
  app.add_option("--address", settings.device_address, "Address to listen on for devices (all)");
  app.add_option("--port", settings.device_port, "Port for devices")->capture_default_str();
  app.add_option("--people-port", settings.people_port, "Loopback port for people and programs")
      ->capture_default_str();
  app.add_option("--host", settings.host, "Name in a certificate that is made")
      ->capture_default_str();
  app.add_option("--enrolment", settings.enrolment,
                 "How a new device comes in: open, list or approval (open)")
      ->transform(CLI::CheckedTransformer(enrolments))
      ->option_text("HOW");
  app.add_option("--max-upload", settings.most_upload_mib, "Most MiB in one delivery")
      ->capture_default_str();
  app.add_option("--min-free", settings.least_free_mib, "MiB of disk that files leave free")
      ->capture_default_str();
  app.add_option("--rate-per-device", settings.per_device, "Requests a minute; 0 is no limit")
      ->capture_default_str();
  app.add_option("--rate-per-address", settings.per_address, "Requests a minute; 0 is no limit")
      ->capture_default_str();
  app.add_option("--max-connections", settings.connections.connections, "Open at once")
      ->capture_default_str();
  app.add_option("--max-connections-per-address", settings.connections.connections_per_address,
                 "Open at once from one address")
      ->capture_default_str();
  app.add_option("--head-seconds", settings.http.head_time, "Time to send a request's head")
      ->default_str("20");
  app.add_option("--pause-seconds", settings.http.more_time, "Longest pause in a request's body")
      ->default_str("30");
  app.add_option("--threads", settings.threads, "Threads for devices (one a processor)");
}

int Run(int argc, char** argv) {
  CLI::App app(kDescription, "quendel-desk");
  Settings settings;
  Command command;
  app.set_version_flag("--version", "quendel-desk " QUENDEL_VERSION);
  app.add_option("--data", settings.data, "Folder for everything that is kept")->required();
  DeclareServing(app, settings);
  DeclareCommands(app, settings.data, command);
  app.require_subcommand(0, 1);
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    return app.exit(error) == 0 ? kExitSuccess : kExitUsage;
  }
  if (command) {
    return command();
  }
  Serve(settings);
  return kExitSuccess;
}

}  // namespace
}  // namespace quendeldesk

int main(int argc, char** argv) {
  umask(077);  // all that a desk keeps is its owner's
  try {
    return quendeldesk::Run(argc, argv);
  } catch (const std::exception& error) {
    fprintf(stderr, "quendel-desk: %s\n", error.what());
    return quendeldesk::kExitFailed;
  }
}
