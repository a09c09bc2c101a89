// Whether the database and the files agree, and a copy of both.
#include "verify.h"

#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <system_error>

#include "database.h"
#include "views.h"

namespace quendeldesk {
namespace {

constexpr size_t kBlock = 256UL * 1024;

std::string HashOf(int file) {
  Sha256 hash;
  std::string block(kBlock, '\0');
  ssize_t size = 0;
  while ((size = read(file, block.data(), block.size())) > 0) {
    hash.Add({block.data(), static_cast<size_t>(size)});
  }
  if (size < 0) {
    throw std::system_error(errno, std::generic_category(), "it cannot be read");
  }
  return hash.Take();
}

// Returns what is wrong with a file, or an empty text.
std::string FaultOf(const Archive& archive, const FileRow& row, bool quick) {
  try {
    const Descriptor file = archive.objects->Open(row.object);
    struct stat status = {};
    if (fstat(file.get(), &status) != 0 || status.st_size != row.size) {
      return "its size is not what the database says";
    }
    return quick || HashOf(file.get()) == row.sha256 ? ""
                                                     : "its hash is not what the database says";
  } catch (const std::system_error& error) {
    return error.what();
  }
}

bool Named(Archive& archive, const std::string& object) {
  return archive.store.Read([&](soci::session& session) { return IsNamed(session, object); });
}

template <typename Names>
bool Holds(const Names& names, const std::string& name) {
  return std::find(names.begin(), names.end(), name) != names.end();
}

// A serving desk may be just about to name it, or to remove it.
bool IsNobodys(Archive& archive, const std::string& object) {
  return !Named(archive, object) && !Holds(archive.objects->Unsettled(), object) &&
         !Holds(archive.store.Read(Discarded), object) && !Named(archive, object);
}

void CopyIfThere(const std::string& from, const std::string& to) {
  namespace fs = std::filesystem;
  if (fs::exists(from)) {
    fs::copy_file(from, to);
    fs::permissions(to, fs::perms::owner_read | fs::perms::owner_write);
  }
}

}  // namespace

VerifyReport Verify(Archive& archive, bool quick) {
  VerifyReport report;
  archive.store.Read([](soci::session& session) {
    CheckDatabase(session);
    return 0;
  });
  for (const FileRow& row : archive.store.Read(AllFiles)) {
    const std::string fault = FaultOf(archive, row, quick);
    if (!fault.empty() && Named(archive, row.object)) {
      report.faults.push_back("file " + row.object + " of delivery " +
                              std::to_string(row.delivery) + ": " + fault);
    }
    ++report.files;
    report.bytes += static_cast<uint64_t>(row.size);
  }
  archive.objects->ForEach([&](const std::string& object) {
    if (IsNobodys(archive, object)) {
      report.faults.push_back("file " + object + ": the database does not name it");
    }
  });
  return report;
}

void Backup(Archive& archive, const std::string& folder) {
  if (mkdir(folder.c_str(), 0700) != 0) {
    throw std::system_error(errno, std::generic_category(), "cannot make " + folder);
  }
  archive.store.Read([&](soci::session& session) {
    CopyDatabase(session, folder + "/desk.db");
    return 0;
  });
  Archive copy(folder);
  for (const FileRow& row : copy.store.Read(AllFiles)) {
    copy.objects->Import(row.object, archive.objects->Open(row.object).get());
  }
  for (const char* name : {"/certificate.pem", "/key.pem", "/token"}) {
    CopyIfThere(archive.folder + name, folder + name);
  }
}

}  // namespace quendeldesk
