// What somebody with a local account puts in the way of a run or an upload, before it or during it:
// nothing of anybody's is read, written, removed or changed in mode because of it.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <random>

#include "base/paths.h"
#include "collect/collection.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/device.h"
#include "support/log.h"
#include "support/server.h"

using namespace quendel::test;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

namespace {

namespace fs = std::filesystem;

constexpr uid_t kNeighbour = 1234;
constexpr char kHome[] = "/volume1/home";
constexpr char kSecret[] = "/volume1/secret";
constexpr char kVictimConf[] = "/volume1/victim.conf";
constexpr char kSecretText[] = "what only root may read";
constexpr char kForged[] = "[/volume1/victim.conf]\nowner=neighbour\n";
constexpr char kWorkRoot[] = "/tmp/quendel";
constexpr char kZip[] = "/tmp/quendel/debugdat.zip";

using Plant = std::function<void()>;

// Of the entry itself: a link is not followed.
mode_t ModeOfEntry(const std::string& path) {
  struct stat status = {};
  EXPECT_EQ(lstat(path.c_str(), &status), 0) << path;
  return status.st_mode;
}

// Everything at the places that are nobody's business here: owner, mode, times and text.
std::map<std::string, std::string> Outside() {
  std::map<std::string, std::string> found;
  for (const auto& entry : fs::recursive_directory_iterator("/volume1")) {
    struct stat status = {};
    lstat(entry.path().c_str(), &status);
    found[entry.path()] = std::to_string(status.st_uid) + " " + std::to_string(status.st_mode) +
                          " " + std::to_string(status.st_mtim.tv_sec) + "." +
                          std::to_string(status.st_mtim.tv_nsec) +
                          (entry.is_regular_file() ? ReadFile(entry.path()) : "");
  }
  return found;
}

void Own(const std::string& path) {
  ASSERT_EQ(lchown(path.c_str(), kNeighbour, kNeighbour), 0) << path;
}

void MakeOpenDirectory(const std::string& path) {
  ASSERT_EQ(mkdir(path.c_str(), 0777), 0);
  ASSERT_EQ(chmod(path.c_str(), 0777), 0);
}

void PlantDirectory(const std::string& path) {
  MakeOpenDirectory(path);
  Own(path);
}

void PlantLink(const std::string& path, const std::string& target) {
  ASSERT_EQ(symlink(target.c_str(), path.c_str()), 0);
  Own(path);
}

void PlantFile(const std::string& path) {
  WriteFile(path, kForged);
  Own(path);
}

// A second name of the secret, which lies on another file system.
void PlantHardLink(const std::string& path) {
  WriteFile("/tmp/roots-own", kForged);
  ASSERT_EQ(link("/tmp/roots-own", path.c_str()), 0);
}

void PlantFifo(const std::string& path) {
  ASSERT_EQ(mkfifo(path.c_str(), 0666), 0);
}

// A device with something to collect and to upload, and a neighbour's home beside root's secrets.
class NeighbourTest : public testing::Test {
 protected:
  void SetUp() override {
    SetIdentity();
    InstallCollectors();
    WriteFile("/var/crash/@app.core", "what the program held in memory");
    InstallTool("/usr/arvo/bin/arvomsg_collector2", "echo facts > \"$1/facts.txt\"");
    InstallTool("/usr/bin/zip",
                "while [ $# -gt 2 ]; do shift; done; tar -cf \"$1\" \"$2\" 2>/dev/null");
    WriteFile(kSecret, kSecretText);
    ASSERT_EQ(chmod(kSecret, 0600), 0);
    WriteFile(kVictimConf, "owner=root\n");
    for (const char* name : {"coredump/kept", "debugdat/kept", "udc/kept", "log/kept", "perf/kept",
                             "quendel.log.update.conf", "quendel.udc.update.conf"}) {
      WriteFile(std::string(kHome) + "/" + name, kForged);
    }
    for (const auto& entry : fs::recursive_directory_iterator(kHome)) {
      Own(entry.path());
    }
    Own(kHome);
    outside_ = Outside();
  }

  // Undoes what was planted, and what came of it.
  static void StartOver() {
    for (const auto& entry : fs::directory_iterator("/tmp")) {
      RemoveFile(entry.path());
    }
    ResetCalls();
    ClearLog();
    StopTheClock();
  }

  void ExpectOutsideUntouched() { EXPECT_EQ(Outside(), outside_); }

  std::map<std::string, std::string> outside_;
};

int CollectOnce(int removeAfter = 1) {
  return InAGroupOfItsOwn([removeAfter] {
           signal(SIGTERM, SIG_IGN);
           On("sleep").Before(AwaitAnyChild);
           return QUENDELStartCollect(removeAfter, 0, Json::Value());
         })
      .result;
}

int Upload(const std::string& type) {
  Json::Value file;
  file["file_type"] = type;
  file["file_path"] = "/var/crash/@app.core";
  Json::Value files;
  files.append(file);
  return QUENDELUploadFile(17, QUENDEL_ACT_PROGRESS_RUN, files);
}

testing::Matcher<LogLine> NoDirectory(const std::string& what, const std::string& path) {
  return Logged("quendel_start_collect",
                "Failed to create " + what + " collect dir '" + path + "'");
}

testing::Matcher<LogLine> NoUploadDirectory(const std::string& path) {
  return Logged("quendel_upload_file", "Fail to ARVOFSMkdirP for '" + path + "'");
}

}  // namespace

// ---- The work root.

TEST_F(NeighbourTest, GetsNoRunAndNoUploadThroughAWorkRootOfHis) {
  const std::vector<Plant> plants = {
      [] { PlantDirectory(kWorkRoot); },
      [] { PlantLink(kWorkRoot, kHome); },
      [] { PlantLink(kWorkRoot, "/volume1"); },
      [] { PlantLink(kWorkRoot, "/volume1/none"); },
      [] { fs::create_symlink(kHome, kWorkRoot); },  // not even one of root's own
      [] { PlantFile(kWorkRoot); },
      [] { PlantFifo(kWorkRoot); },
  };
  for (size_t i = 0; i < plants.size(); ++i) {
    SCOPED_TRACE("plant " + std::to_string(i));
    StartOver();
    plants[i]();
    EXPECT_EQ(CollectOnce(), -1);
    EXPECT_THAT(Log(), Contains(NoDirectory("UDC", kWorkRoot)));
    EXPECT_EQ(Upload("coredump"), 0);
    EXPECT_THAT(Log(), Contains(NoUploadDirectory("/tmp/quendel/coredump")));
    EXPECT_EQ(Upload("debug.dat"), 0);
    EXPECT_THAT(Log(), Contains(NoUploadDirectory("/tmp/quendel/debugdat")));
    EXPECT_TRUE(!S_ISDIR(ModeOfEntry(kWorkRoot)) || fs::is_empty(kWorkRoot));
    ExpectOutsideUntouched();
  }
}

TEST_F(NeighbourTest, LosesTheWorkRootThatRootLeftOpenToHim) {
  for (const mode_t mode : {0777U, 0720U, 0702U}) {
    StartOver();
    ASSERT_EQ(mkdir(kWorkRoot, 0700), 0);
    ASSERT_EQ(chmod(kWorkRoot, mode), 0);
    EXPECT_EQ(CollectOnce(), 0);
    EXPECT_EQ(ModeOfEntry(kWorkRoot), S_IFDIR | 0700U);
    ASSERT_EQ(chmod(kWorkRoot, mode), 0);
    EXPECT_EQ(Upload("coredump"), 0);
    EXPECT_EQ(ModeOfEntry(kWorkRoot), S_IFDIR | 0700U);
    EXPECT_THAT(Log(), IsEmpty());
  }
}

TEST_F(NeighbourTest, GetsNothingMadeWhereHeIsFasterThanThePlatform) {
  StartOver();
  On("ARVOFSMkdirP").Before([] {
    fs::remove(kWorkRoot);
    PlantLink(kWorkRoot, kHome);
  });
  EXPECT_EQ(Upload("coredump"), 0);
  EXPECT_THAT(Log(), Contains(NoUploadDirectory("/tmp/quendel/coredump")));
  ExpectOutsideUntouched();
}

// ---- What lies below it.

TEST_F(NeighbourTest, GetsNothingPreparedInADirectoryOfHis) {
  for (const std::string name : {"coredump", "debugdat"}) {
    const std::string path = std::string(kWorkRoot) + "/" + name;
    const std::vector<Plant> plants = {
        [&] { PlantDirectory(path); },
        [&] { PlantLink(path, kHome); },
        [&] { fs::create_symlink(kHome, path); },
        [&] { PlantFile(path); },
    };
    for (size_t i = 0; i < plants.size(); ++i) {
      SCOPED_TRACE(name + " " + std::to_string(i));
      StartOver();
      MakeOpenDirectory(kWorkRoot);
      plants[i]();
      const auto requests = Requests().size();
      EXPECT_EQ(Upload(name == "coredump" ? "coredump" : "debug.dat"), 0);
      EXPECT_THAT(Log(), Contains(NoUploadDirectory(path)));
      ASSERT_EQ(Requests().size(), requests + 1);
      EXPECT_THAT(Requests().back().line, HasSubstr("/action_progress/17/-3/"));
      EXPECT_TRUE(Exists(path));
      ExpectOutsideUntouched();
    }
  }
}

TEST_F(NeighbourTest, GetsNothingSentInPlaceOfTheDebugArchive) {
  const std::vector<Plant> plants = {
      [] { PlantLink(kZip, kSecret); }, [] { PlantFile(kZip); },      [] { PlantHardLink(kZip); },
      [] { PlantFifo(kZip); },          [] { PlantDirectory(kZip); },
  };
  for (size_t i = 0; i < plants.size(); ++i) {
    SCOPED_TRACE("plant " + std::to_string(i));
    StartOver();
    MakeOpenDirectory(kWorkRoot);
    plants[i]();
    EXPECT_EQ(Upload("debug.dat"), 0);
    EXPECT_THAT(Log(), Contains(Logged("quendel_upload_file",
                                       "Fail to zip attachment /tmp/quendel/debugdat.zip")));
    EXPECT_THAT(Requests().back().line, HasSubstr("/action_progress/17/-3/"));
    ExpectOutsideUntouched();
  }
}

TEST_F(NeighbourTest, GetsNothingCommittedThatHeStaged) {
  for (const char* file : {quendel::kLogUpdateFile, quendel::kUdcUpdateFile}) {
    const std::vector<Plant> plants = {
        [&] { PlantFile(file); },
        [&] {
          WriteFile("/tmp/forged", kForged);
          PlantLink(file, "/tmp/forged");
        },
        [&] { PlantHardLink(file); },
        [&] {
          WriteFile("/tmp/roots-own", kForged);
          fs::create_symlink("/tmp/roots-own", file);
        },
        [&] {
          fs::remove(kWorkRoot);
          PlantDirectory(kWorkRoot);
          WriteFile(file, kForged);
        },
        [&] {
          fs::remove(kWorkRoot);
          PlantLink(kWorkRoot, kHome);
        },
    };
    for (size_t i = 0; i < plants.size(); ++i) {
      SCOPED_TRACE(file + std::to_string(i));
      StartOver();
      MakeOpenDirectory(kWorkRoot);
      plants[i]();
      EXPECT_EQ(QUENDELUpdateCollectConf(file), -1);
      EXPECT_THAT(Log(), ElementsAre(Logged("quendel_update_conf", "Failed to enum section of '" +
                                                                       std::string(file) + "'")));
      ExpectOutsideUntouched();
    }
  }
}

TEST_F(NeighbourTest, MayStageInAnyOtherFile) {
  StartOver();
  PlantFile("/tmp/others.conf");
  EXPECT_EQ(QUENDELUpdateCollectConf("/tmp/others.conf"), 0);
  EXPECT_THAT(ReadFile(kVictimConf), HasSubstr("owner=neighbour"));
}

// The collectors are called without a run here, so that nobody looked at anything before them.
TEST_F(NeighbourTest, GetsNoStateStagedThroughWhatHePlanted) {
  const std::string unitOf[] = {"quendel_collect_log", "quendel_collect_udc"};
  const char* const files[] = {quendel::kLogUpdateFile, quendel::kUdcUpdateFile};
  for (int kind = 0; kind < 2; ++kind) {
    const char* const file = files[kind];
    const std::vector<Plant> plants = {
        [&] { PlantLink(file, "/volume1/none"); },
        [&] {
          fs::remove(kWorkRoot);
          PlantDirectory(kWorkRoot);
        },
        [&] {
          fs::remove(kWorkRoot);
          PlantLink(kWorkRoot, kHome);
        },
    };
    for (size_t i = 0; i < plants.size(); ++i) {
      SCOPED_TRACE(file + std::to_string(i));
      StartOver();
      MakeOpenDirectory(kWorkRoot);
      plants[i]();
      ASSERT_EQ(mkdir("/tmp/out", 0700), 0);
      EXPECT_EQ(kind == 0 ? QUENDELCollectLog("/tmp/out") : QUENDELCollectUDC("/tmp/out"), 0);
      EXPECT_THAT(Log(), Contains(Logged(unitOf[kind], "Failed to add new section to '" +
                                                           std::string(file) + "'")));
      ExpectOutsideUntouched();
    }
    EXPECT_THAT(Log(), Contains(Logged(unitOf[kind],
                                       "Failed to remove " + std::string(file) + " [errno=1]")))
        << "what lies in his home is his";
  }
}

TEST_F(NeighbourTest, GetsNoTimesChangedThroughAMarker) {
  StartOver();
  MakeOpenDirectory(kWorkRoot);
  for (pid_t child = getpid(); child < getpid() + 300; ++child) {
    PlantLink("/tmp/quendel/udc.p." + std::to_string(child), kSecret);
  }
  EXPECT_EQ(CollectOnce(), 0);
  EXPECT_THAT(Log(), ElementsAre(Logged("quendel_start_collect",
                                        StartsWith("Failed to touch file '/tmp/quendel/udc.p."))));
  ExpectOutsideUntouched();
}

// ---- The run's own directory.

// The name was free when the run looked for one.
TEST_F(NeighbourTest, GetsNoRunIntoADirectoryThatHeMadeMeanwhile) {
  const std::vector<Plant> plants = {
      [] { PlantDirectory(kRunDir); },
      [] { PlantLink(kRunDir, kHome); },
      [] { PlantLink(kRunDir, "/volume1"); },
      [] { fs::create_symlink(kHome, kRunDir); },
      [] { PlantFile(kRunDir); },
  };
  for (size_t i = 0; i < plants.size(); ++i) {
    SCOPED_TRACE("plant " + std::to_string(i));
    StartOver();
    On("mkdir").With(kRunDir).Before(plants[i]);
    EXPECT_EQ(CollectOnce(), -1);
    EXPECT_THAT(Log(), Contains(NoDirectory("quendel", kRunDir)));
    EXPECT_TRUE(fs::is_symlink(kRunDir) || Exists(kRunDir)) << "what is his stays";
    ExpectOutsideUntouched();
  }
}

TEST_F(NeighbourTest, GetsNoLinesThroughWhatHePutIntoAnOpenRunDirectory) {
  for (const std::string name : {"udc", "log", "perf"}) {
    SCOPED_TRACE(name);
    StartOver();
    On("mkdir").With(kRunDir).Before([&] {
      MakeOpenDirectory(kRunDir);
      PlantLink(std::string(kRunDir) + "/" + name, kHome);
    });
    EXPECT_EQ(CollectOnce(0), -1);
    EXPECT_EQ(ModeOfEntry(kRunDir), S_IFDIR | 0700U);
    EXPECT_THAT(Log(), Contains(NoDirectory(name == "udc" ? "UDC" : name,
                                            std::string(kRunDir) + "/" + name)));
    ExpectOutsideUntouched();
  }
}

// ---- The attacker: whatever he plants, whenever he exchanges it.

namespace {

constexpr int kRounds = 40;  // QUENDEL_ATTACK_ROUNDS sets another number
constexpr char kAttic[] = "/tmp/attic";
constexpr char kRootsOwn[] = "/tmp/attic/of-root";

// Lets go of what some kernels forbid in "/tmp" by themselves, where the machine lets it.
class UnprotectedTmp {
 public:
  UnprotectedTmp() {
    for (const std::string name : {"symlinks", "hardlinks", "fifos", "regular"}) {
      const std::string path = "/proc/sys/fs/protected_" + name;
      const std::string value = fs::exists(path) ? ReadFile(path) : "";
      if (!value.empty() && value[0] != '0' && Set(path, "0")) {
        before_[path] = value;
      }
    }
  }
  ~UnprotectedTmp() {
    for (const auto& [path, value] : before_) {
      Set(path, value);
    }
  }
  UnprotectedTmp(const UnprotectedTmp&) = delete;
  UnprotectedTmp& operator=(const UnprotectedTmp&) = delete;

 private:
  static bool Set(const std::string& path, const std::string& value) {
    std::ofstream file(path);
    return (file << value).flush().good();
  }

  std::map<std::string, std::string> before_;
};

// Every name that a run or an upload uses, with those of the run that starts now.
std::vector<std::string> NamesToTake() {
  std::vector<std::string> names = {kWorkRoot, "/tmp/quendel/coredump", "/tmp/quendel/debugdat",
                                    kZip,      quendel::kLogUpdateFile, quendel::kUdcUpdateFile};
  char stamp[64] = {};
  const time_t now = time(nullptr);
  struct tm local = {};
  strftime(stamp, sizeof stamp, "/tmp/quendel_%Y%m%d_%H%M%S_0", localtime_r(&now, &local));
  for (const char* below :
       {"", ".tar.xz", "/log", "/udc", "/perf", "/log/messages", "/udc/udc.result"}) {
    names.push_back(std::string(stamp) + below);
  }
  return names;
}

void PlantAnything(const std::string& path, std::minstd_rand& random) {
  const char* const targets[] = {kHome, kSecret, "/volume1", kVictimConf, "/volume1/none"};
  switch (random() % 6) {
    case 0:
      mkdir(path.c_str(), 0777);
      break;
    case 1:
    case 2:
      symlink(targets[random() % 5], path.c_str());
      break;
    case 3:
      mkfifo(path.c_str(), 0666);
      break;
    case 4:
      std::ofstream(path) << kForged;
      break;
    default:
      link(kRootsOwn, path.c_str());
      break;
  }
}

// Reads an archive that is not his. Only a finding is left behind, in his own directory.
void TryToRead(const std::string& path) {
  const int file = open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK);
  struct stat status = {};
  if (file >= 0 && fstat(file, &status) == 0 && status.st_uid != kNeighbour &&
      S_ISREG(status.st_mode)) {
    std::ofstream(std::string(kAttic) + "/read") << path << "\n";
  }
  close(file);
}

// Goes on until he is killed.
[[noreturn]] void Attack() {
  if (setgid(kNeighbour) != 0 || setuid(kNeighbour) != 0) {
    _exit(1);
  }
  umask(0);
  std::minstd_rand random(static_cast<unsigned>(getpid()));
  for (;;) {
    for (const std::string& name : NamesToTake()) {
      if (fs::path(name).extension() == ".xz") {
        TryToRead(name);
      }
      const std::string away = std::string(kAttic) + "/" + std::to_string(random() % 50);
      rename(name.c_str(), away.c_str());
      PlantAnything(name, random);
    }
    usleep(static_cast<useconds_t>(random() % 2 * (random() % 20000)));  // so that some last
  }
}

pid_t StartAttacker() {
  const pid_t attacker = fork();
  if (attacker == 0) {
    Attack();
  }
  return attacker;
}

// What a round leaves, root's and the neighbour's, goes; the last name of a file of root's that the
// neighbour could move about stays.
void ClearTmp() {
  for (const auto& entry : fs::directory_iterator("/tmp")) {
    if (entry.path().filename().string().rfind("quendel", 0) == 0) {
      std::error_code ignored;
      fs::remove_all(entry.path(), ignored);
    }
  }
}

// Files of root's in directories of the neighbour's: what root was made to write.
std::vector<std::string> RootsFilesInTheAttic() {
  std::vector<std::string> found;
  for (const auto& entry : fs::recursive_directory_iterator(kAttic)) {
    struct stat status = {};
    lstat(entry.path().c_str(), &status);
    if (status.st_uid == 0 && entry.path() != kRootsOwn && status.st_nlink == 1) {
      found.push_back(entry.path());
    }
  }
  return found;
}

}  // namespace

TEST_F(NeighbourTest, GetsNothingHoweverFastHeIs) {
  const UnprotectedTmp unprotected;
  const char* const asked = getenv("QUENDEL_ATTACK_ROUNDS");
  const int rounds = asked == nullptr ? kRounds : std::stoi(asked);
  ASSERT_EQ(mkdir(kAttic, 0777), 0);
  ASSERT_EQ(chmod(kAttic, 0777), 0);
  Own(kAttic);
  // What he cannot write to himself: somebody else's home.
  for (const auto& entry : fs::recursive_directory_iterator(kHome)) {
    ASSERT_EQ(chown(entry.path().c_str(), kNeighbour + 1, kNeighbour + 1), 0);
  }
  ASSERT_EQ(chown(kHome, kNeighbour + 1, kNeighbour + 1), 0);
  outside_ = Outside();
  int good = 0;
  for (int round = 0; round < rounds; ++round) {
    SCOPED_TRACE("round " + std::to_string(round));
    ClearTmp();
    WriteFile(kRootsOwn, kForged);
    ASSERT_EQ(chmod(kRootsOwn, 0600), 0);
    const pid_t attacker = StartAttacker();
    usleep(static_cast<useconds_t>(round % 5) * 500);
    if (round % 3 == 0) {
      const mode_t mask = umask(0);  // a chmod could follow what he puts there
      mkdir(kWorkRoot, 0777);
      umask(mask);
    }
    const Ending ending = InAGroupOfItsOwn([] {
      signal(SIGTERM, SIG_IGN);
      On("sleep").Before(AwaitAnyChild);
      const int collected = QUENDELStartCollect(1, 0, Json::Value());
      Upload("coredump");
      Upload("debug.dat");
      return collected;
    });
    EXPECT_EQ(ending.signal, 0) << "nothing waits for him";
    good += ending.result == 0 ? 1 : 0;
    kill(attacker, SIGKILL);
    ASSERT_EQ(waitpid(attacker, nullptr, 0), attacker);
    ASSERT_EQ(Outside(), outside_);
    ASSERT_FALSE(Exists(std::string(kAttic) + "/read")) << ReadFile(std::string(kAttic) + "/read");
    ASSERT_THAT(RootsFilesInTheAttic(), IsEmpty());
    ASSERT_EQ(ReadFile(kRootsOwn), kForged);
    ASSERT_EQ(ModeOfEntry(kRootsOwn), S_IFREG | 0600U);
  }
  for (const Request& request : Requests()) {
    ASSERT_THAT(request.body, Not(HasSubstr(kSecretText)));
  }
  RecordProperty("runs_that_succeeded", good);
}
