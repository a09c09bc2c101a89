// The commands of the program, on a folder that a desk serves meanwhile.
#include <gmock/gmock.h>

#include "quendel-desk/running_desk.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/json.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::Not;

namespace {

std::string Desk(const std::vector<std::string>& arguments, int expected = 0) {
  std::string output;
  EXPECT_EQ(RunDesk(arguments, output), expected) << output;
  return output;
}

int Describe(Json::Value& info, const QUENDELSendDataParam_t& item) {
  info["filename"] = item.path.substr(item.path.rfind('/') + 1);
  return 0;
}

void Send(const std::string& path, const std::string& bytes) {
  WriteFile(path, bytes);
  QUENDELSendDataParam_t item;
  item.path = path;
  ASSERT_EQ(
      QUENDELPostFileToServer("https://support.test/collect/a1/b2/S1", "file", item, Describe), 0);
}

std::string OnlyFile() {
  EXPECT_EQ(system("find /volume1/desk/files/kept -type f > /tmp/files"), 0);
  std::string path = ReadFile("/tmp/files");
  EXPECT_EQ(std::count(path.begin(), path.end(), '\n'), 1) << path;
  path.pop_back();
  return path;
}

}  // namespace

TEST(DeskCommandsTest, ListsDevicesAndShowsOne) {
  const RunningDesk desk;
  Send("/tmp/run.tar.xz", "archive");
  EXPECT_THAT(Desk({"devices"}), HasSubstr("S1 "));
  EXPECT_THAT(Desk({"devices", "S1"}), HasSubstr("run.tar.xz (7 bytes)"));
  const Json::Value one = JsonOf(Desk({"devices", "S1", "--json"}));
  EXPECT_EQ(one["collections"][0]["files"][0]["size"], 7);
  EXPECT_TRUE(one["success"].asBool());
  EXPECT_THAT(Desk({"devices", "S2"}, 1), HasSubstr("no device with the serial number S2"));
}

TEST(DeskCommandsTest, WhatADeviceSaysCannotSteerATerminal) {
  const RunningDesk desk;
  Send("/tmp/a\x1b[31mred", "bytes");
  EXPECT_THAT(Desk({"devices", "S1"}), Not(HasSubstr("\x1b")));
}

TEST(DeskCommandsTest, QueuesAnAction) {
  const RunningDesk desk;
  Json::Value actions;
  QUENDELHeartbeat(actions);
  EXPECT_EQ(JsonOf(Desk({"queue", "S1", "upload_file", "--file", "debug.dat", "--file",
                         "/var/crash/@a.core", "--json"}))["request_id"],
            1);
  Desk({"queue", "S1", "remote_close", "--failed"});
  EXPECT_THAT(Desk({"queue", "S1", "upload_file", "--file", "/etc/shadow"}, 1),
              HasSubstr("no device sends /etc/shadow"));
  ASSERT_EQ(QUENDELHeartbeat(actions), 0);
  ASSERT_EQ(actions.size(), 2U);
  EXPECT_EQ(actions[0]["files"][1]["file_path"], "/var/crash/@a.core");
  EXPECT_EQ(actions[1]["progress"], -1);
}

TEST(DeskCommandsTest, CopiesFilesOutUnderHarmlessNames) {
  const RunningDesk desk;
  Send("/tmp/run.tar.xz", "archive");
  Send("/tmp/..hidden", "bytes");
  WriteFile("/tmp/out/.folder", "");
  EXPECT_EQ(Desk({"get", "1", "/tmp/out"}), "/tmp/out/run.tar.xz\n");
  EXPECT_EQ(ReadFile("/tmp/out/run.tar.xz"), "archive");
  EXPECT_EQ(Desk({"get", "2", "/tmp/out"}), "/tmp/out/file-0\n");
  EXPECT_THAT(Desk({"get", "1", "/tmp/out"}, 1), HasSubstr("cannot write /tmp/out/run.tar.xz"));
  Desk({"get", "3", "/tmp/out"}, 1);
}

TEST(DeskCommandsTest, VerifyFindsAChangedByte) {
  const RunningDesk desk;
  Send("/tmp/run.tar.xz", "archive");
  EXPECT_THAT(Desk({"verify"}), HasSubstr("faults: 0"));
  WriteFile(OnlyFile(), "archivE");
  EXPECT_THAT(Desk({"verify"}, 1), HasSubstr("its hash is not what the database says"));
  EXPECT_THAT(Desk({"verify", "--quick"}), HasSubstr("faults: 0"));
}

TEST(DeskCommandsTest, VerifyFindsALostAndAStrayFile) {
  const RunningDesk desk;
  Send("/tmp/run.tar.xz", "archive");
  const std::string file = OnlyFile();
  RemoveFile(file);
  EXPECT_THAT(Desk({"verify"}, 1), HasSubstr("No such file"));
  WriteFile(file, "archive and more");
  EXPECT_THAT(Desk({"verify"}, 1), HasSubstr("its size"));
  WriteFile(file, "archive");
  WriteFile("/volume1/desk/files/kept/00/00112233", "stray");
  const Json::Value report = JsonOf(Desk({"verify", "--json"}, 1));
  EXPECT_FALSE(report["success"].asBool());
  ASSERT_EQ(report["faults"].size(), 1U);
  EXPECT_THAT(report["faults"][0].asString(), HasSubstr("the database does not name it"));
}

TEST(DeskCommandsTest, ABackupIsADeskOfItsOwn) {
  const RunningDesk desk;
  Send("/tmp/run.tar.xz", "archive");
  Desk({"backup", "/volume1/copy"});
  EXPECT_EQ(system("diff -r /volume1/desk/files /volume1/copy/files"), 0);
  EXPECT_EQ(system("diff /volume1/desk/token /volume1/copy/token"), 0);
  Desk({"forget", "S1"});
  EXPECT_EQ(system(QUENDEL_DESK " --data /volume1/copy verify > /tmp/verified"), 0);
  EXPECT_THAT(ReadFile("/tmp/verified"), HasSubstr("1 files of 7 bytes"));
  Desk({"backup", "/volume1/copy"}, 1);
}

TEST(DeskCommandsTest, PruneRemovesWhatIsOld) {
  const RunningDesk desk;
  Send("/tmp/run.tar.xz", "archive");
  Desk({"prune", "--older-than", "1d"});
  EXPECT_EQ(AskJson("/devices/1/collections")["collections"].size(), 1U);
  usleep(2000);
  Desk({"prune", "--older-than", "0m"});
  EXPECT_EQ(AskJson("/devices/1/collections")["collections"].size(), 0U);
  EXPECT_EQ(system("test -z \"$(find /volume1/desk/files -type f)\""), 0);
  Desk({"prune", "--older-than", "yesterday"}, 1);
}

TEST(DeskCommandsTest, ForgetLeavesNothingButANumber) {
  RunningDesk desk;
  Send("/tmp/run.tar.xz", "the archive of SN-0815");
  Desk({"queue", "S1", "start_collect"});
  Desk({"forget", "S1"});
  EXPECT_EQ(DeviceNumber(), 0);
  EXPECT_EQ(system("test -z \"$(find /volume1/desk/files -type f)\""), 0);
  Desk({"forget", "S1"}, 1);
}

TEST(DeskCommandsTest, AdmitsAndRefusesDevices) {
  const RunningDesk desk({"--enrolment", "list"});
  Json::Value actions;
  EXPECT_EQ(QUENDELHeartbeat(actions), -1);
  Desk({"admit", "S1"});
  EXPECT_EQ(QUENDELHeartbeat(actions), 0);
  Desk({"admit", "S1", "--refuse"});
  EXPECT_EQ(QUENDELHeartbeat(actions), -1);
}

TEST(DeskCommandsTest, NeedAFolderThatADeskHasMade) {
  std::string output;
  EXPECT_EQ(RunDesk({"devices"}, output), 1);
  EXPECT_THAT(output, HasSubstr("there is no desk in /volume1/desk"));
  EXPECT_FALSE(Exists(kDeskFolder));
}

TEST(DeskCommandsTest, ACommandLineThatCannotBeUnderstoodIsNotCarriedOut) {
  Desk({"devices", "--nonsense"}, 2);
  Desk({"queue", "S1"}, 2);
  Desk({"--enrolment", "sometimes"}, 2);
}
