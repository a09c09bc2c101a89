// The commands beside serving: looking into the desk's folder and changing what is in it.
#include "commands.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <ctime>
#include <memory>
#include <system_error>

#include "access_log.h"
#include "actions.h"
#include "desk.h"
#include "json.h"
#include "verify.h"
#include "views.h"

namespace quendeldesk {
namespace {

constexpr int kExitFailed = 1;
constexpr int kEverything = 1'000'000;

// What a command has to say: lines for people, or members for programs.
struct Report {
  bool success = true;
  std::vector<std::string> lines;
  Json::Value members{Json::objectValue};
};

struct Arguments {
  std::string serial;
  std::string action;
  std::vector<std::string> files;
  std::string folder;
  std::string age;
  long long delivery = 0;
  long long expires_in = 0;
  bool quick = false;
  bool failed = false;
  bool refuse = false;
  bool json = false;
};

std::unique_ptr<Archive> OpenArchive(const std::string& folder) {
  if (access((folder + "/desk.db").c_str(), F_OK) != 0) {
    throw std::runtime_error("there is no desk in " + folder);
  }
  return std::make_unique<Archive>(folder);
}

std::string TimeText(const Json::Value& milliseconds) {
  if (milliseconds.isNull()) {
    return "never";
  }
  const auto seconds = static_cast<time_t>(milliseconds.asInt64() / 1000);
  tm utc = {};
  char text[32];
  strftime(text, sizeof(text), "%Y-%m-%d %H:%M:%SZ", gmtime_r(&seconds, &utc));
  return text;
}

std::string Padded(std::string text, size_t width) {
  text.resize(std::max(width, text.size()), ' ');
  return text;
}

long long DeviceNamed(Archive& archive, const std::string& serial) {
  const long long device =
      archive.store.Read([&](soci::session& s) { return DeviceBySerial(s, serial); });
  if (device == 0) {
    throw std::runtime_error("there is no device with the serial number " + serial);
  }
  return device;
}

// ---- devices

std::string DeviceLine(const Json::Value& device) {
  return Padded(Printable(device["serial"].asString()), 36) + " " +
         Padded(TimeText(device["last_heartbeat"]), 21) + " " +
         Padded(device["enrolment"].asString(), 9) + " " + Printable(device["version"].asString()) +
         (device["conflict"].asBool() ? " (conflict: more than one account)" : "");
}

Report ListDevices(Archive& archive) {
  Report report;
  DeviceQuery query;
  query.limit = kEverything;
  report.members["devices"] =
      archive.store.Read([&](soci::session& s) { return DeviceList(s, query); });
  report.lines.push_back(Padded("SERIAL", 36) + " " + Padded("LAST HEARTBEAT", 21) +
                         " ENROLMENT VERSION");
  for (const Json::Value& device : report.members["devices"]) {
    report.lines.push_back(DeviceLine(device));
  }
  return report;
}

void AddDeliveries(Report& report, const char* kind, const Json::Value& deliveries) {
  for (const Json::Value& delivery : deliveries) {
    std::string line =
        std::string(kind) + " " + delivery["id"].asString() + ", " + TimeText(delivery["at"]) + ":";
    for (const Json::Value& file : delivery["files"]) {
      line +=
          " " + Printable(file["filename"].asString()) + " (" + file["size"].asString() + " bytes)";
    }
    report.lines.push_back(line + (delivery["mismatch"].isNull() ? "" : ", not as described"));
  }
}

Report ShowDevice(Archive& archive, const std::string& serial) {
  Report report;
  const long long device = DeviceNamed(archive, serial);
  Span span;
  span.to = INT64_MAX;
  span.limit = kEverything;
  archive.store.Read([&](soci::session& session) {
    report.members["device"] = DeviceView(session, device);
    report.members["actions"] = ActionList(session, device, NowMs());
    report.members["collections"] = DeliveryList(session, device, "collection", span);
    report.members["uploads"] = DeliveryList(session, device, "upload", span);
    return 0;
  });
  report.lines.push_back(DeviceLine(report.members["device"]));
  for (const Json::Value& owner : report.members["device"]["owners"]) {
    report.lines.push_back("account " + owner["id"].asString() + ": " +
                           Printable(owner["field_a"].asString()) + " " +
                           Printable(owner["field_b"].asString()));
  }
  for (const Json::Value& action : report.members["actions"]) {
    report.lines.push_back("action " + action["request_id"].asString() + " " +
                           action["name"].asString() + ": " + action["state"].asString());
  }
  AddDeliveries(report, "collection", report.members["collections"]);
  AddDeliveries(report, "upload", report.members["uploads"]);
  return report;
}

Report Devices(Archive& archive, const Arguments& arguments) {
  return arguments.serial.empty() ? ListDevices(archive) : ShowDevice(archive, arguments.serial);
}

Report AdmitDevice(Archive& archive, const Arguments& arguments) {
  const std::string enrolment = arguments.refuse ? "refused" : "approved";
  archive.store.WriteAndWait(
      [&](soci::session& session) { SetEnrolment(session, arguments.serial, enrolment, NowMs()); });
  Report report;
  report.lines = {Printable(arguments.serial) + " is " + enrolment + "."};
  report.members["enrolment"] = enrolment;
  return report;
}

// ---- queue

Json::Value ActionRequest(const Arguments& arguments) {
  Json::Value request;
  request["action"] = arguments.action;
  if (arguments.action == "remote_close") {
    request["progress"] = arguments.failed ? -1 : 0;
  }
  if (arguments.expires_in > 0) {
    request["expires_in"] = static_cast<Json::Int64>(arguments.expires_in);
  }
  for (const std::string& path : arguments.files) {
    Json::Value file;
    file["file_type"] = path == "debug.dat" ? "debug.dat" : "coredump";
    file["file_path"] = path == "debug.dat" ? "" : path;
    request["files"].append(file);
  }
  return request;
}

Report Queue(Archive& archive, const Arguments& arguments) {
  const long long device = DeviceNamed(archive, arguments.serial);
  const NewAction action = ActionFrom(ActionRequest(arguments), NowMs());
  long long id = 0;
  archive.store.WriteAndWait(
      [&](soci::session& session) { id = QueueAction(session, device, action, NowMs()); });
  Report report;
  report.lines = {"Queued with the number " + std::to_string(id) + "."};
  report.members["request_id"] = static_cast<Json::Int64>(id);
  return report;
}

// ---- get

// A name for a file here, whatever the device called it.
std::string HarmlessName(const FileRow& row) {
  std::string name = row.filename;
  std::replace_if(
      name.begin(), name.end(), [](char c) { return c <= ' ' || c > '~' || c == '/'; }, '_');
  return name.empty() || name[0] == '.' || name.size() > 200 ? "file-" + std::to_string(row.number)
                                                             : name;
}

void CopyOut(const Archive& archive, const FileRow& row, const std::string& path) {
  const Descriptor from = archive.objects->Open(row.object);
  const Descriptor to(open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
  if (!to || !CopyRest(from.get(), to.get())) {
    throw std::system_error(errno, std::generic_category(), "cannot write " + path);
  }
}

Report Get(Archive& archive, const Arguments& arguments) {
  const std::vector<FileRow> files =
      archive.store.Read([&](soci::session& s) { return FilesOf(s, arguments.delivery); });
  if (files.empty()) {
    throw std::runtime_error("nothing was delivered under this number");
  }
  Report report;
  report.members["files"] = Json::Value(Json::arrayValue);
  for (const FileRow& file : files) {
    const std::string path = arguments.folder + "/" + HarmlessName(file);
    CopyOut(archive, file, path);
    report.lines.push_back(path);
    report.members["files"].append(path);
  }
  return report;
}

// ---- verify, backup, prune, forget

Report VerifyAll(Archive& archive, const Arguments& arguments) {
  const VerifyReport found = Verify(archive, arguments.quick);
  Report report;
  report.success = found.faults.empty();
  report.members["files"] = static_cast<Json::Int64>(found.files);
  report.members["bytes"] = static_cast<Json::UInt64>(found.bytes);
  report.members["faults"] = Json::Value(Json::arrayValue);
  for (const std::string& fault : found.faults) {
    report.lines.push_back(fault);
    report.members["faults"].append(fault);
  }
  report.lines.push_back(std::to_string(found.files) + " files of " + std::to_string(found.bytes) +
                         " bytes; faults: " + std::to_string(found.faults.size()));
  return report;
}

Report BackUp(Archive& archive, const Arguments& arguments) {
  Backup(archive, arguments.folder);
  Report report;
  report.lines = {"Copied to " + arguments.folder + "."};
  return report;
}

// Reads "90d", "12h" or "30m". Returns milliseconds.
long long AgeFrom(const std::string& text) {
  const std::map<char, long long> units = {{'d', 86'400'000}, {'h', 3'600'000}, {'m', 60'000}};
  const auto unit = text.empty() ? units.end() : units.find(text.back());
  const std::string number = text.substr(0, text.size() - (text.empty() ? 0 : 1));
  if (unit == units.end() || number.empty() || number.size() > 6 ||
      number.find_first_not_of("0123456789") != number.npos) {
    throw std::runtime_error("an age is a number of days, hours or minutes: 90d, 12h, 30m");
  }
  return std::stoll(number) * unit->second;
}

Report PruneOld(Archive& archive, const Arguments& arguments) {
  const long long before = NowMs() - AgeFrom(arguments.age);
  archive.store.WriteAndWait([&](soci::session& session) { Prune(session, before); });
  archive.RemoveDiscarded();
  Report report;
  report.lines = {"Removed what is older than " + arguments.age + "."};
  return report;
}

Report ForgetDevice(Archive& archive, const Arguments& arguments) {
  const long long device = DeviceNamed(archive, arguments.serial);
  archive.store.WriteAndWait([&](soci::session& session) { Forget(session, device); });
  archive.RemoveDiscarded();
  Report report;
  report.lines = {"Nothing is known of " + Printable(arguments.serial) + " any more."};
  return report;
}

// ---- The command line

int Print(const Report& report, bool json) {
  std::string text;
  if (json) {
    Json::Value members = report.members;
    members["success"] = report.success;
    text = JsonText(members) + "\n";
  } else {
    for (const std::string& line : report.lines) {
      text += line + "\n";
    }
  }
  if (fwrite(text.data(), 1, text.size(), stdout) != text.size() || fflush(stdout) != 0) {
    throw std::system_error(errno, std::generic_category(), "cannot write the output");
  }
  return report.success ? 0 : kExitFailed;
}

using Carry = Report (*)(Archive&, const Arguments&);

}  // namespace

void DeclareCommands(CLI::App& app, const std::string& folder, Command& chosen) {
  const auto arguments = std::make_shared<Arguments>();
  const auto add = [&](const char* name, const char* what, Carry carry) {
    CLI::App* command = app.add_subcommand(name, what);
    command->add_flag("--json", arguments->json, "Print one JSON object");
    command->callback([&folder, &chosen, arguments, carry] {
      chosen = [&folder, arguments, carry] {
        return Print(carry(*OpenArchive(folder), *arguments), arguments->json);
      };
    });
    return command;
  };
  const auto serial = [&](CLI::App* command) {
    return command->add_option("SERIAL", arguments->serial, "Serial number of the device");
  };
  serial(add("devices", "List the devices, or show one", Devices));
  CLI::App* admit = add("admit", "Admit a device, heard of or not", AdmitDevice);
  serial(admit)->required();
  admit->add_flag("--refuse", arguments->refuse, "Refuse it instead");
  CLI::App* queue = add("queue", "Ask something of a device", Queue);
  serial(queue)->required();
  queue->add_option("ACTION", arguments->action, "upload_file, start_collect, remote_close...")
      ->required();
  queue->add_option("--file", arguments->files, "Path of a crash dump, or debug.dat (repeatable)");
  queue->add_option("--expires-in", arguments->expires_in, "Seconds (a week)");
  queue->add_flag("--failed", arguments->failed, "Close a remote session as failed");
  CLI::App* get = add("get", "Copy the files of a collection or an upload", Get);
  get->add_option("NUMBER", arguments->delivery, "Its number")->required();
  get->add_option("FOLDER", arguments->folder, "Where to")
      ->required()
      ->check(CLI::ExistingDirectory);
  CLI::App* verify = add("verify", "Compare the database with the files", VerifyAll);
  verify->add_flag("--quick", arguments->quick, "Compare sizes, not hashes");
  CLI::App* backup = add("backup", "Copy everything to a new folder", BackUp);
  backup->add_option("FOLDER", arguments->folder, "Where to")->required();
  CLI::App* prune = add("prune", "Remove what is old", PruneOld);
  prune->add_option("--older-than", arguments->age, "Age, such as 90d, 12h or 30m")->required();
  serial(add("forget", "Remove everything that is known of a device", ForgetDevice))->required();
}

}  // namespace quendeldesk
