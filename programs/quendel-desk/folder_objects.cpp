// Objects as files in a folder. A file is written as "incoming/ID" and then linked as "kept/XX/ID",
// XX being the first two letters of ID; the first name is what marks it as unsettled.
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <system_error>

#include "crypto.h"
#include "objects.h"

namespace quendeldesk {
namespace {

namespace fs = std::filesystem;

constexpr size_t kIdBytes = 16;

[[noreturn]] void Fail(const std::string& what) {
  throw std::system_error(errno, std::generic_category(), what);
}

void Sync(const fs::path& path, int flags) {
  const Descriptor opened(open(path.c_str(), flags | O_CLOEXEC));
  if (!opened || fsync(opened.get()) != 0) {
    Fail("cannot write " + path.string());
  }
}

void SyncFolder(const fs::path& folder) {
  Sync(folder, O_RDONLY | O_DIRECTORY);
}

void MakeFolder(const fs::path& folder) {
  if (mkdir(folder.c_str(), 0700) == 0) {
    SyncFolder(folder.parent_path());
  } else if (errno != EEXIST) {
    Fail("cannot make " + folder.string());
  }
}

void RemoveFile(const fs::path& file) {
  if (unlink(file.c_str()) != 0 && errno != ENOENT) {
    Fail("cannot remove " + file.string());
  }
}

struct Places {
  fs::path incoming;
  fs::path kept;

  fs::path Incoming(const std::string& name) const { return incoming / fs::path(name).filename(); }
  fs::path Kept(const std::string& name) const { return kept / name; }
};

class FileWriter : public ObjectWriter {
 public:
  explicit FileWriter(const Places& places) : places_(places), id_(RandomHex(kIdBytes)) {
    const fs::path path = places_.incoming / id_;
    file_ = Descriptor(open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
    if (!file_) {
      Fail("cannot make " + path.string());
    }
  }
  ~FileWriter() override {
    if (!kept_) {
      unlink((places_.incoming / id_).c_str());
    }
  }

  void Write(std::string_view bytes) override {
    hash_.Add(bytes);
    size_ += bytes.size();
    while (!bytes.empty()) {
      const ssize_t written = write(file_.get(), bytes.data(), bytes.size());
      if (written >= 0) {
        bytes.remove_prefix(static_cast<size_t>(written));
      } else if (errno != EINTR) {
        Fail("cannot write a file");
      }
    }
  }

  StoredObject Keep() override {
    const std::string name = id_.substr(0, 2) + "/" + id_;
    const fs::path kept = places_.Kept(name);
    if (fsync(file_.get()) != 0) {
      Fail("cannot write a file");
    }
    SyncFolder(places_.incoming);  // before there is a second name, as the first one marks it
    MakeFolder(kept.parent_path());
    if (link(places_.Incoming(name).c_str(), kept.c_str()) != 0) {
      Fail("cannot keep a file");
    }
    SyncFolder(kept.parent_path());
    kept_ = true;
    return {name, size_, hash_.Take()};
  }

 private:
  const Places& places_;
  const std::string id_;
  Descriptor file_;
  Sha256 hash_;
  uint64_t size_ = 0;
  bool kept_ = false;
};

class FolderObjects : public Objects {
 public:
  explicit FolderObjects(const fs::path& folder) : places_{folder / "incoming", folder / "kept"} {
    MakeFolder(folder);
    MakeFolder(places_.incoming);
    MakeFolder(places_.kept);
  }

  std::unique_ptr<ObjectWriter> Create() override { return std::make_unique<FileWriter>(places_); }

  void Settle(const std::string& name) override { RemoveFile(places_.Incoming(name)); }

  std::vector<std::string> Unsettled() const override {
    std::vector<std::string> names;
    for (const fs::directory_entry& entry : fs::directory_iterator(places_.incoming)) {
      const std::string id = entry.path().filename();
      names.push_back(id.substr(0, 2) + "/" + id);
    }
    return names;
  }

  // The mark goes last, so that a removal that is cut short is made good at the next start.
  void Remove(const std::string& name) override {
    RemoveFile(places_.Kept(name));
    RemoveFile(places_.Incoming(name));
  }

  Descriptor Open(const std::string& name) const override {
    Descriptor file(open(places_.Kept(name).c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
    if (!file) {
      Fail("cannot read the file " + name);
    }
    return file;
  }

  void Import(const std::string& name, int file) override {
    const fs::path kept = places_.Kept(name);
    MakeFolder(kept.parent_path());
    const Descriptor copy(open(kept.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600));
    if (!copy || !CopyRest(file, copy.get()) || fsync(copy.get()) != 0) {
      Fail("cannot write " + kept.string());
    }
    SyncFolder(kept.parent_path());
  }

  void ForEach(const std::function<void(const std::string&)>& visit) const override {
    for (const fs::directory_entry& shard : fs::directory_iterator(places_.kept)) {
      for (const fs::directory_entry& file : fs::directory_iterator(shard)) {
        visit(shard.path().filename() / file.path().filename());
      }
    }
  }

  uint64_t FreeBytes() const override {
    struct statvfs system = {};
    return statvfs(places_.kept.c_str(), &system) == 0 ? system.f_bavail * system.f_frsize : 0;
  }

 private:
  const Places places_;
};

}  // namespace

std::unique_ptr<Objects> OpenFolderObjects(const std::string& folder) {
  return std::make_unique<FolderObjects>(folder);
}

}  // namespace quendeldesk
