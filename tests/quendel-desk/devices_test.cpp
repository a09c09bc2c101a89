// What the library's own requests do to a real desk.
#include <gmock/gmock.h>

#include "quendel-desk/running_desk.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/json.h"

using namespace quendel::test;
using testing::HasSubstr;
using testing::Not;

namespace {

std::string EveryByte(size_t size) {
  std::string bytes(size, '\0');
  for (size_t i = 0; i < size; ++i) {
    bytes[i] = static_cast<char>(i * 31 + i / 251);
  }
  return bytes;
}

Json::Value Heartbeat() {
  Json::Value actions;
  EXPECT_EQ(QUENDELHeartbeat(actions), 0);
  return actions;
}

int QueueUpload() {
  const HttpReply reply =
      Ask("POST", DevicePath("/actions"),
          R"({"action":"upload_file","files":[{"file_type":"debug.dat","file_uuid":"u1"}]})");
  EXPECT_EQ(reply.status, 201) << reply.body;
  return JsonOf(reply.body)["request_id"].asInt();
}

int QueueCollection(const std::string& more = "") {
  const HttpReply reply =
      Ask("POST", DevicePath("/actions"), R"({"action":"start_collect")" + more + "}");
  EXPECT_EQ(reply.status, 201) << reply.body;
  return JsonOf(reply.body)["request_id"].asInt();
}

std::string StateOf(int requestId) {
  const Json::Value list = AskJson(DevicePath("/actions"));
  for (const Json::Value& action : list["actions"]) {
    if (action["request_id"] == requestId) {
      return action["state"].asString();
    }
  }
  return "";
}

int Report(int requestId, int progress) {
  return QUENDELUpdateActRequestProgress(requestId, static_cast<QuendelActionProgress_t>(progress),
                                         Json::Value(Json::objectValue));
}

std::vector<QUENDELSendDataParam_t> WriteItems(const std::vector<std::string>& names,
                                               const std::string& bytes) {
  std::vector<QUENDELSendDataParam_t> items;
  for (const std::string& name : names) {
    WriteFile("/tmp/" + name, bytes);
    items.emplace_back().path = "/tmp/" + name;
  }
  return items;
}

int DescribeByName(Json::Value& info, const QUENDELSendDataParam_t& item) {
  info["filename"] = item.path.substr(item.path.rfind('/') + 1);
  return 0;
}
int DescribeNothing(Json::Value& /*info*/, const QUENDELSendDataParam_t& /*item*/) {
  return -1;
}
int DescribeAnother(Json::Value& info, const QUENDELSendDataParam_t& /*item*/) {
  info["filename"] = "another";
  return 0;
}

int Send(const std::vector<QUENDELSendDataParam_t>& items,
         int (*describe)(Json::Value&, const QUENDELSendDataParam_t&) = DescribeByName) {
  return QUENDELPostFileToServer("https://support.test/collect/a1/b2/S1", "file", items, describe);
}

size_t FilesBelow(const std::string& folder) {
  const std::string command = "find " + folder + " -type f | wc -l > /tmp/count";
  EXPECT_EQ(system(command.c_str()), 0);
  return std::stoul(ReadFile("/tmp/count"));
}
const std::string kKept = std::string(kDeskFolder) + "/files";

void ExpectVerified() {
  std::string output;
  EXPECT_EQ(RunDesk({"verify"}, output), 0) << output;
}

}  // namespace

TEST(QuendelDeskTest, AHeartbeatEntersTheDevice) {
  const RunningDesk desk;
  EXPECT_EQ(Heartbeat(), Json::Value(Json::arrayValue));
  EXPECT_EQ(AskJson(DevicePath())["serial"], "S1");
  EXPECT_FALSE(AskJson(DevicePath())["conflict"].asBool());
}

TEST(QuendelDeskTest, AHeartbeatsTimeIsWrittenWithinSeconds) {
  const RunningDesk desk;
  Heartbeat();
  Json::Value heartbeats;
  for (int i = 0; i < 50 && heartbeats.empty(); ++i) {
    usleep(100'000);
    heartbeats = AskJson(DevicePath("/heartbeats"))["heartbeats"];
  }
  EXPECT_EQ(heartbeats.size(), 1U);
}

TEST(QuendelDeskTest, AnActionIsInEachHeartbeatsAnswerUntilItIsClosed) {
  const RunningDesk desk;
  Heartbeat();
  const int id = QueueCollection();
  for (int i = 0; i < 2; ++i) {
    const Json::Value actions = Heartbeat();
    ASSERT_EQ(actions.size(), 1U);
    EXPECT_EQ(actions[0]["action"], "start_collect");
    EXPECT_EQ(actions[0]["request_id"], id);
  }
  EXPECT_EQ(Report(id, 0), 0);
  EXPECT_TRUE(Heartbeat().empty());
}

TEST(QuendelDeskTest, ProgressClosesAnActionAsWhatItSays) {
  const RunningDesk desk;
  Heartbeat();
  const std::vector<std::pair<int, std::string>> closing = {
      {0, "done"}, {-1, "failed"}, {-3, "no_file"}, {1, "open"}, {-2, "open"}};
  for (const auto& [progress, state] : closing) {
    const int id = QueueCollection();
    EXPECT_EQ(Report(id, progress), 0);
    EXPECT_EQ(StateOf(id), state) << progress;
  }
}

TEST(QuendelDeskTest, ProgressThatIsReportedTwiceIsAccepted) {
  const RunningDesk desk;
  Heartbeat();
  const int id = QueueCollection();
  EXPECT_EQ(Report(id, 0), 0);
  EXPECT_EQ(Report(id, -1), 0);
  EXPECT_EQ(StateOf(id), "done");
}

TEST(QuendelDeskTest, AnActionExpires) {
  const RunningDesk desk;
  Heartbeat();
  const int id = QueueCollection(R"(,"expires_in":1)");
  EXPECT_EQ(Heartbeat().size(), 1U);
  usleep(1'100'000);
  EXPECT_TRUE(Heartbeat().empty());
  EXPECT_EQ(StateOf(id), "expired");
}

TEST(QuendelDeskTest, AnActionCanBeTakenBack) {
  const RunningDesk desk;
  Heartbeat();
  const int id = QueueCollection();
  EXPECT_EQ(Ask("DELETE", DevicePath("/actions/" + std::to_string(id))).status, 200);
  EXPECT_TRUE(Heartbeat().empty());
  EXPECT_EQ(Ask("DELETE", DevicePath("/actions/" + std::to_string(id))).status, 404);
}

TEST(QuendelDeskTest, TheArrivalOfItsFilesClosesAnUpload) {
  const RunningDesk desk;
  Heartbeat();
  const int id = QueueUpload();
  const int other = QueueUpload();
  EXPECT_EQ(QUENDELSendUploadData(id, WriteItems({"debugdat.zip"}, "zip")), 0);
  EXPECT_EQ(StateOf(id), "done");
  EXPECT_EQ(StateOf(other), "open");
  const Json::Value uploads = AskJson(DevicePath("/uploads"))["uploads"];
  ASSERT_EQ(uploads.size(), 1U);
  EXPECT_EQ(uploads[0]["request_id"], id);
}

TEST(QuendelDeskTest, AnUploadWithoutFilesClosesNothing) {
  const RunningDesk desk;
  Heartbeat();
  const int id = QueueUpload();
  EXPECT_EQ(QUENDELSendUploadData(id, {}), 0);
  EXPECT_EQ(StateOf(id), "open");
}

TEST(QuendelDeskTest, RequestIdsAreNotUsedAgainForAForgottenDevice) {
  const RunningDesk desk;
  Heartbeat();
  EXPECT_EQ(QueueCollection(), 1);
  EXPECT_EQ(Ask("DELETE", DevicePath()).status, 200);
  EXPECT_EQ(DeviceNumber(), 0);
  Heartbeat();
  EXPECT_EQ(QueueCollection(), 2);
}

TEST(QuendelDeskTest, AnEventIsStoredWholeAndItsDescriptionShown) {
  const RunningDesk desk;
  Json::Value reply;
  Json::Value info;
  info["model"] = "caf\xC3\xA9";
  EXPECT_EQ(QUENDELPostEventToServer(QUENDEL_EVENT_ENABLE, reply, info), 0);
  EXPECT_EQ(AskJson(DevicePath())["info"], info);
  EXPECT_EQ(AskJson(DevicePath())["email"], "mail1");
  const Json::Value entry = AskJson(DevicePath("/timeline"))["entries"][0];
  EXPECT_EQ(entry["kind"], "event");
  EXPECT_EQ(entry["name"], "enable");
  EXPECT_EQ(entry["body"]["hmx_info"], info);
}

TEST(QuendelDeskTest, AnUnknownNumberIsRefusedAndZeroIsTheDevicesOwn) {
  const RunningDesk desk;
  const std::string own = "/action_progress/0/0/a1/b2/S1";
  EXPECT_EQ(PostAsDevice(own, "{}")["code"], 111001);
  Heartbeat();
  EXPECT_TRUE(PostAsDevice(own, "{}")["success"].asBool());
  EXPECT_EQ(AskJson(DevicePath("/timeline"))["entries"][0]["request_id"], 0);
  EXPECT_EQ(PostAsDevice("/action_progress/17/0/a1/b2/S1", "{}")["code"], 111001);
  EXPECT_EQ(Report(17, 0), -1);
}

TEST(QuendelDeskTest, AnUploadThatNobodyAskedForIsRefusedAndLeavesNothing) {
  const RunningDesk desk;
  Heartbeat();
  EXPECT_EQ(QUENDELSendUploadData(17, WriteItems({"dump.core.xz"}, "dump")), -1);
  EXPECT_TRUE(desk.Logs("code=111001"));
  for (int i = 0; i < 100 && FilesBelow(kKept) > 0; ++i) {
    usleep(20'000);
  }
  EXPECT_EQ(FilesBelow(kKept), 0U);
  ExpectVerified();
}

TEST(QuendelDeskTest, PiecesOfAPathAreTakenAsTheyAre) {
  const RunningDesk desk;
  EXPECT_TRUE(PostAsDevice("/action//%41?x=1/S1", R"({"action":"reboot"})")["success"].asBool());
  const Json::Value owner = AskJson(DevicePath())["owners"][0];
  EXPECT_EQ(owner["field_a"], "");
  EXPECT_EQ(owner["field_b"], "%41?x=1");
}

TEST(QuendelDeskTest, WhatNoDeviceAsksForIsAnUnknownRequest) {
  const RunningDesk desk;
  for (const char* path :
       {"/", "/heartbeat", "/heartbeat/S1/", "/heartbeats/S1", "/action/a1/S1",
        "/action_progress/x/0/a1/b2/S1", "/action_progress/1/0x1/a1/b2/S1",
        "/collect/a1/b2/S1/more", "/heartbeat/0123456789012345678901234567890123456"}) {
    const Json::Value reply = PostAsDevice(path);
    EXPECT_FALSE(reply["success"].asBool()) << path;
    EXPECT_EQ(reply["code"], 111001) << path;
  }
  EXPECT_TRUE(AskJson("/devices")["devices"].empty());
}

TEST(QuendelDeskTest, ABodyThatIsNoJsonIsRefused) {
  const RunningDesk desk;
  EXPECT_EQ(PostAsDevice("/action/a1/b2/S1", "{")["code"], 119999);
  EXPECT_EQ(PostAsDevice("/action/a1/b2/S1", "[]")["code"], 119999);
  EXPECT_EQ(PostAsDevice("/action/a1/b2/S1", std::string(200, '['))["code"], 119999);
  const std::string large = "\"" + std::string(2 << 20, 'x') + "\"";
  EXPECT_EQ(PostAsDevice("/action/a1/b2/S1", large)["code"], 119999);
  EXPECT_TRUE(AskJson("/devices")["devices"].empty());
}

TEST(QuendelDeskTest, FilesAreStoredByteForByteInTheirOrder) {
  const RunningDesk desk;
  const std::string bytes = EveryByte(3 << 20);
  const std::vector<std::string> names = {"one.tar.xz", "two words.txt", "caf\xC3\xA9", "q\"uote"};
  auto items = WriteItems(names, bytes);
  WriteFile("/tmp/empty", "");
  items.emplace_back().path = "/tmp/empty";
  items.emplace_back().path = "/tmp/empty";
  ASSERT_EQ(Send(items), 0);

  const Json::Value collection = AskJson(DevicePath("/collections"))["collections"][0];
  EXPECT_TRUE(collection["mismatch"].isNull());
  ASSERT_EQ(collection["files"].size(), 6U);
  for (Json::ArrayIndex i = 0; i < names.size(); ++i) {
    EXPECT_EQ(collection["files"][i]["filename"], names[i]);
    const HttpReply file =
        Ask("GET", "/collections/" + collection["id"].asString() + "/files/" + std::to_string(i));
    EXPECT_TRUE(file.body == bytes) << names[i];
    EXPECT_THAT(file.headers, HasSubstr("attachment; filename="));
  }
  EXPECT_EQ(collection["files"][5]["size"], 0);
  ExpectVerified();
}

TEST(QuendelDeskTest, ACollectionTellsTheVersionOfTheSystem) {
  const RunningDesk desk;
  WriteFile("/tmp/run.tar.xz", "archive");
  EXPECT_EQ(QUENDELSendCollectData("/tmp/run.tar.xz", 1709622489), 0);
  EXPECT_EQ(AskJson(DevicePath())["version"], "HMX 3.2-2044");
  const Json::Value collection = AskJson(DevicePath("/collections"))["collections"][0];
  EXPECT_EQ(collection["descriptions"][0]["timestamp"], "1709622489");
}

TEST(QuendelDeskTest, AMismatchOfDescriptionsAndFilesIsStoredAndShown) {
  const RunningDesk desk;
  const auto items = WriteItems({"a", "b"}, "bytes");
  const auto mismatch = [] {
    return AskJson(DevicePath("/collections"))["collections"][0]["mismatch"];
  };
  EXPECT_EQ(Send(items, DescribeNothing), 0);
  EXPECT_EQ(mismatch(), JsonOf(R"({"missing":[],"undescribed":["a","b"]})"));
  EXPECT_EQ(Send(items, DescribeAnother), 0);
  EXPECT_EQ(mismatch(), JsonOf(R"({"missing":["another","another"],"undescribed":["a","b"]})"));
}

TEST(QuendelDeskTest, OneSerialNumberUnderOtherFieldsIsAConflictAndNotMerged) {
  const RunningDesk desk;
  Heartbeat();
  const int id = QueueCollection();
  EXPECT_EQ(Report(id, 1), 0);
  const std::string others = "/action_progress/" + std::to_string(id) + "/0/x/y/S1";
  EXPECT_TRUE(PostAsDevice(others, "{}")["success"].asBool());
  EXPECT_EQ(StateOf(id), "open") << "a stranger closed it";
  Json::Value device = AskJson(DevicePath());
  EXPECT_TRUE(device["conflict"].asBool());
  ASSERT_EQ(device["owners"].size(), 2U);
  EXPECT_EQ(device["owner"], device["owners"][0]["id"]);

  const std::string stranger = R"({"owner":)" + device["owners"][1]["id"].asString() + "}";
  EXPECT_EQ(Ask("PUT", DevicePath("/owner"), stranger).status, 200);
  EXPECT_TRUE(PostAsDevice(others, "{}")["success"].asBool());
  EXPECT_EQ(StateOf(id), "done");
}

TEST(QuendelDeskTest, AListAdmitsOnlyWhatIsOnIt) {
  const RunningDesk desk({"--enrolment", "list"});
  Json::Value actions;
  EXPECT_EQ(QUENDELHeartbeat(actions), -1);
  EXPECT_EQ(PostAsDevice("/heartbeat/S1")["code"], 111000);
  EXPECT_EQ(Send(WriteItems({"a"}, "bytes")), -1);
  EXPECT_TRUE(AskJson("/devices")["devices"].empty());
  EXPECT_EQ(Ask("POST", "/devices", R"({"serial":"S1","enrolment":"approved"})").status, 201);
  EXPECT_EQ(QUENDELHeartbeat(actions), 0);
  EXPECT_EQ(Send(WriteItems({"a"}, "bytes")), 0);
  ExpectVerified();
}

TEST(QuendelDeskTest, UnderApprovalANewDeviceWaits) {
  const RunningDesk desk({"--enrolment", "approval"});
  EXPECT_EQ(PostAsDevice("/heartbeat/S1")["code"], 111000);
  EXPECT_EQ(AskJson(DevicePath())["enrolment"], "waiting");
  EXPECT_EQ(Ask("PUT", DevicePath("/enrolment"), R"({"enrolment":"approved"})").status, 200);
  EXPECT_TRUE(PostAsDevice("/heartbeat/S1")["success"].asBool());
  EXPECT_EQ(Ask("PUT", DevicePath("/enrolment"), R"({"enrolment":"refused"})").status, 200);
  EXPECT_EQ(PostAsDevice("/heartbeat/S1")["code"], 111000);
}

TEST(QuendelDeskTest, FilesThatAreTooLargeAreRefusedWithASentence) {
  const RunningDesk desk({"--max-upload", "1"});
  EXPECT_EQ(Send(WriteItems({"large"}, EveryByte(2 << 20))), -1);
  EXPECT_TRUE(desk.Logs("code=119999"));
  EXPECT_TRUE(desk.Logs("note=\"the files are too large\""));
  EXPECT_EQ(FilesBelow(kKept), 0U);
  EXPECT_EQ(Send(WriteItems({"small"}, EveryByte(1000))), 0);
}

TEST(QuendelDeskTest, WithoutRoomFilesAreRefusedAndHeartbeatsGoOn) {
  const RunningDesk desk({"--min-free", "100000000"});
  EXPECT_EQ(Send(WriteItems({"small"}, "bytes")), -1);
  EXPECT_TRUE(desk.Logs("there is no room for files"));
  Heartbeat();
}

TEST(QuendelDeskTest, ADeviceThatAsksTooOftenIsRefused) {
  const RunningDesk desk({"--rate-per-device", "3"});
  for (int i = 0; i < 3; ++i) {
    EXPECT_TRUE(PostAsDevice("/heartbeat/S1")["success"].asBool());
  }
  EXPECT_EQ(PostAsDevice("/heartbeat/S1")["code"], 119999);
  EXPECT_TRUE(PostAsDevice("/heartbeat/S2")["success"].asBool());
}

TEST(QuendelDeskTest, AnAddressThatAsksTooOftenIsRefused) {
  const RunningDesk desk({"--rate-per-address", "3"});
  for (int i = 0; i < 3; ++i) {
    PostAsDevice("/heartbeat/S" + std::to_string(i));
  }
  EXPECT_EQ(PostAsDevice("/heartbeat/S4")["code"], 119999);
}

TEST(QuendelDeskTest, ABareConnectionIsNoRequest) {
  const RunningDesk desk;
  EXPECT_EQ(QUENDELIsServerReachable(), 1);
  EXPECT_EQ(desk.Output(), "");
  EXPECT_THAT(AskWith({}, "GET", "/metrics").body, Not(HasSubstr("requests_total{")));
}

TEST(QuendelDeskTest, WhatDevicesSayCannotForgeALineOfTheLog) {
  const RunningDesk desk;
  PostAsDevice("/heartbeat/S\"200");
  EXPECT_TRUE(desk.Logs(R"("POST /heartbeat/S\"200" 200 code=0)")) << desk.Output();
}

TEST(QuendelDeskTest, EverythingAcknowledgedIsThereAfterAKill) {
  RunningDesk desk;
  Heartbeat();
  const int id = QueueCollection();
  ASSERT_EQ(Send(WriteItems({"a"}, EveryByte(100'000))), 0);
  ASSERT_EQ(Report(id, 0), 0);
  desk.Kill();
  desk.Start();
  EXPECT_EQ(StateOf(id), "done");
  EXPECT_EQ(AskJson(DevicePath("/collections"))["collections"].size(), 1U);
  ExpectVerified();
}

TEST(QuendelDeskTest, WhatACrashLeftUnsettledIsTidiedUp) {
  RunningDesk desk;
  ASSERT_EQ(Send(WriteItems({"a"}, "bytes")), 0);
  desk.Kill();
  const std::string name = "00112233445566778899aabbccddeeff";
  WriteFile(kKept + "/incoming/" + name, "half a file");
  WriteFile(kKept + "/kept/00/" + name, "half a file");
  desk.Start();
  EXPECT_EQ(FilesBelow(kKept), 1U);
  ExpectVerified();
}

TEST(QuendelDeskTest, AFolderIsServedByOneDesk) {
  const RunningDesk desk;
  std::string output;
  EXPECT_EQ(RunDesk({"--port", "51900", "--people-port", "51901"}, output), 1);
  EXPECT_THAT(output, HasSubstr("another quendel-desk serves"));
}

TEST(QuendelDeskTest, KeepsItsSecretsToItself) {
  const RunningDesk desk;
  EXPECT_EQ(system(("test -z \"$(find " + std::string(kDeskFolder) + " -perm /077)\"").c_str()), 0);
}
