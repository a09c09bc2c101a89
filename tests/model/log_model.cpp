// What the log collector has to do, said once more.
#include "model/log_model.h"

#include <openssl/evp.h>

#include <algorithm>
#include <cstdlib>
#include <sstream>

namespace quendel::test {
namespace {

std::string Md5Of(const std::string& text) {
  unsigned char digest[EVP_MAX_MD_SIZE];
  unsigned int length = 0;
  EVP_Digest(text.data(), text.size(), digest, &length, EVP_md5(), nullptr);
  std::string hex;
  for (unsigned int i = 0; i < length; ++i) {
    char digits[3];
    snprintf(digits, sizeof digits, "%02x", digest[i]);
    hex += digits;
  }
  return hex;
}

std::string Quoted(const std::string& text) {
  return "'" + text + "'";
}

// Reads the line at a position and moves the position behind it. False where nothing is left.
bool GetLine(const std::string& text, size_t& position, std::string& line) {
  if (position >= text.size()) {
    return false;
  }
  const size_t newline = text.find('\n', position);
  line = text.substr(position, newline - position);
  position = newline == std::string::npos ? text.size() : newline + 1;
  return true;
}

class Collection {
 public:
  Collection(ModelDisk& disk, std::string dir, ModelFault fault)
      : disk_(disk), dir_(std::move(dir)), fault_(std::move(fault)) {}

  ModelRun Run(const ModelConfs& confs) {
    if (Fails("ALIBCSzListAlloc")) {
      Say("Failed to allocate memory for list");
      run_.result = -1;
      return run_;
    }
    for (const auto& [path, conf] : confs) {
      k_ = path;
      r_ = conf;
      h_.clear();
      if (!CollectOne()) {
        Say("Failed to collect log in conf " + Quoted(k_));
      }
    }
    return run_;
  }

 private:
  bool Fails(const std::string& call) { return call == fault_.call && --fault_.nth == 0; }
  void Say(const std::string& message) { run_.log.push_back(message); }
  bool Say(const std::string& message, bool result) { return Say(message), result; }
  bool Exists(const std::string& path) const { return disk_.count(path) != 0; }
  int64_t Number(const std::string& key) const { return atoll(r_.at(key).c_str()); }
  std::string Output() const { return dir_ + "/" + r_.at("name"); }

  std::string Archive(const std::string& log, size_t n) const {
    return log + "." + std::to_string(n) + ".xz";
  }

  bool Copy(const std::string& from, const std::string& to) {
    if (Fails("ARVOFileCopy") || !Exists(from)) {
      return false;
    }
    disk_[to].bytes = disk_[from].bytes;
    disk_[to].plain = disk_[from].plain;
    return true;
  }

  bool Set(const std::string& key, const std::string& value) {
    if (Fails("ALIBCSzHashSetValue")) {
      return Say("Failed to set key-value pair (" + key + ", " + value + ") of conf " + Quoted(k_),
                 false);
    }
    h_[key] = value;
    return true;
  }

  bool SetState(const std::string& last, int64_t total) {
    return Set("last_hash", Md5Of(last)) && Set("total_byte", std::to_string(total)) &&
           Set("last_byte", std::to_string(last.size()));
  }

  // 0 done, 1 the last line is not there, -1 failed.
  int Diff(const std::string& source, const std::string& output, size_t limit) {
    const std::string text = disk_[source].bytes;
    const int64_t size = static_cast<int64_t>(text.size());
    const int64_t start = Number("total_byte") - Number("last_byte") - 1;
    if (size < start) {
      return 1;
    }
    size_t position = static_cast<size_t>(start);
    std::string line;
    if (start < 0 || !GetLine(text, position, line)) {
      Say("Failed to read hash line in log " + Quoted(source));
      return -1;
    }
    if (Md5Of(line) != r_.at("last_hash")) {
      return 1;
    }
    std::string& out = disk_[output].bytes;
    out.clear();
    std::string last;
    int64_t total = size;
    while (GetLine(text, position, line)) {
      out += line + "\n";
      last = line;
      total = static_cast<int64_t>(position);
      if (position >= limit) {
        break;
      }
    }
    if (!SetState(last, total)) {
      Say("Failed to update config of log " + Quoted(source));
      return -1;
    }
    return 0;
  }

  bool Append(const std::string& source, const std::string& output, size_t& base) {
    if (Fails("ALIBCFileStat")) {
      return Say("Failed to stat file " + Quoted(output), false);
    }
    base = disk_[output].bytes.size();
    if (!Copy(source, output + ".tmp")) {
      Say("Failed to copy log " + Quoted(source) + " to " + Quoted(output + ".tmp"));
      disk_.erase(output + ".tmp");
      return Say("Failed to collect log " + Quoted(source), false);
    }
    disk_[output].bytes += disk_[output + ".tmp"].bytes;
    disk_.erase(output + ".tmp");
    return true;
  }

  bool Whole(const std::string& source, const std::string& output, uint64_t inode) {
    size_t base = 0;
    if (Exists(output)) {
      if (!Append(source, output, base)) {
        return false;
      }
    } else if (!Copy(source, output)) {
      return Say("Failed to copy log " + Quoted(source) + " to " + Quoted(output), false);
    }
    if (!Set("inode", std::to_string(static_cast<uint32_t>(inode)))) {
      return false;
    }
    std::string last;
    size_t position = 0;
    while (GetLine(disk_[output].bytes, position, last)) {
    }
    if (!SetState(last, static_cast<int64_t>(position) - static_cast<int64_t>(base))) {
      return Say("Failed to update config of log " + Quoted(source), false);
    }
    return true;
  }

  bool CopyArchive(size_t n) {
    const std::string archive = Archive(r_.at("path"), n);
    const std::string copy = Archive(Output(), n);
    return Copy(archive, copy) ||
           Say("Failed to copy " + Quoted(archive) + " to " + Quoted(copy), false);
  }

  // As Diff(), of an archive; one that cannot be prepared is done.
  int DiffArchive(const std::string& copy, const std::string& plain, size_t n) {
    if (!CopyArchive(n)) {
      return 0;
    }
    if (Fails("ALIBCExec") || !disk_[copy].plain) {
      return Say("Failed to untar " + Quoted(copy)), 0;
    }
    disk_[plain].bytes = *disk_[copy].plain;
    if (Fails("ALIBCFileStat")) {
      return Say("Failed to stat file " + Quoted(plain)), 0;
    }
    const int result = Diff(plain, Output(), disk_[plain].bytes.size());
    if (result < 0) {
      Say("Failed to collect diff log " + Quoted(plain));
    }
    return result;
  }

  bool Archives() {
    if (Fails("ALIBCSzListAlloc") || Fails("ALIBCSzListAlloc")) {
      return Say("Failed to allocate memory for list", false);
    }
    const std::string& log = r_.at("path");
    std::vector<std::string> inodes;
    for (size_t n = 1; Exists(Archive(log, n)); ++n) {
      const std::string inode = std::to_string(disk_[Archive(log, n)].inode);
      const bool isUnknown = Fails("ALIBCFileStat");
      if (isUnknown || Fails("ALIBCSzListPush")) {
        Say(isUnknown ? "Failed to stat file " + Quoted(Archive(log, n))
                      : "Failed to insert inode " + Quoted(inode) + " into list");
        return Say("Failed to get the inode of tared logs of " + Quoted(log), false);
      }
      inodes.push_back(inode);
    }
    if (inodes.empty()) {
      return true;
    }
    if (Fails("ALIBCStrTok")) {
      return Say("Failed to parse tar log inode " + Quoted(r_.at("tar_log_inode")), false);
    }
    const std::string known = "," + r_.at("tar_log_inode").substr(0, 255) + ",";
    bool isOldest = true;
    for (size_t n = inodes.size(); n > 0; --n) {
      if (known.find("," + inodes[n - 1] + ",") != std::string::npos) {
        continue;
      }
      bool copies = true;
      if (isOldest) {
        const std::string plain = Output() + "." + std::to_string(n);
        copies = DiffArchive(plain + ".xz", plain, n) != 0;
        disk_.erase(plain + ".xz");
        disk_.erase(plain);
      }
      isOldest = false;
      if (copies && !CopyArchive(n)) {
        return false;
      }
    }
    std::string joined;
    for (const std::string& inode : inodes) {
      joined += (joined.empty() ? "" : ",") + inode;
    }
    return isOldest || Set("tar_log_inode", joined);
  }

  // Whether the log did not fail; `collected` and `replaced` tell what was done.
  bool Live(bool& collected, bool& replaced) {
    const std::string& log = r_.at("path");
    if (!Exists(log)) {
      return true;
    }
    if (Fails("ALIBCFileStat")) {
      return Say("Failed to stat file " + Quoted(log), false);
    }
    const uint64_t inode = disk_[log].inode;
    const size_t size = disk_[log].bytes.size();
    replaced = inode != static_cast<uint32_t>(Number("inode"));
    if (!replaced) {
      if (static_cast<int64_t>(size) == Number("total_byte")) {
        return true;
      }
      const int result = Diff(log, Output(), size);
      collected = result == 0;
      if (result < 0) {
        return Say("Failed to collect diff log " + Quoted(log), false);
      }
      if (collected) {
        return true;
      }
      Say("Failed to collect diff log " + Quoted(log) + " because of hash not match");
    }
    collected = Whole(log, Output(), inode);
    return collected || Say("Failed to collect whole log " + Quoted(log), false);
  }

  bool CollectOne() {
    if (Fails("calloc")) {
      return Say("Failed to allocate memory for pLogConf", false);
    }
    if (Fails("ALIBCSzHashAlloc")) {
      return Say("Failed to allocate memory for log hash", false);
    }
    if (!Archives()) {
      return Say("Failed to collect tared log of " + Quoted(k_), false);
    }
    bool collected = false;
    bool replaced = false;
    if (!Live(collected, replaced)) {
      return false;
    }
    if (collected && Fails("ALIBCFileAddSection")) {
      Say("Failed to add new section to '/tmp/quendel/quendel.log.update.conf'");
      return !replaced;
    }
    if (collected) {
      run_.sections.emplace_back(k_, h_);
    }
    return true;
  }

  ModelDisk& disk_;
  std::string dir_;
  ModelFault fault_;
  ModelRun run_;
  std::string k_;  // path of the configuration file at hand
  ModelState r_;   // its values
  ModelState h_;   // the values staged for it
};

}  // namespace

ModelRun ModelCollect(ModelDisk& disk, const ModelConfs& confs, const std::string& dir,
                      const ModelFault& fault) {
  return Collection(disk, dir, fault).Run(confs);
}

}  // namespace quendel::test
