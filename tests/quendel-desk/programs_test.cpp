// What programs may ask of a desk, and who may.
#include <gmock/gmock.h>
#include <json/writer.h>

#include <set>

#include "api_service.h"
#include "quendel-desk/running_desk.h"
#include "support/appliance.h"
#include "support/json.h"

using namespace quendel::test;
using testing::HasSubstr;

namespace {

// Posts an archive of one file as a collection, by the way that is at hand here.
void SendArchive() {
  WriteFile("/tmp/pack/run/log/messages", "line one\nline two\n");
  ASSERT_EQ(system("tar -C /tmp/pack -cJf /tmp/run.tar.xz run && curl -sk -F file=@/tmp/run.tar.xz "
                   "-F 'file=[{\"filename\":\"run.tar.xz\"}]' "
                   "https://127.0.0.1:51790/collect/a1/b2/S1 >/tmp/reply"),
            0);
  ASSERT_THAT(ReadFile("/tmp/reply"), HasSubstr("true"));
}

const Json::Value& OpenApi() {
  static const Json::Value document = AskJson("/openapi.json");
  return document;
}

// Follows a "$ref" of the document.
const Json::Value& Resolved(const Json::Value& schema) {
  if (!schema.isMember("$ref")) {
    return schema;
  }
  const Json::Value* found = &OpenApi();
  std::istringstream path(schema["$ref"].asString().substr(2));
  for (std::string piece; std::getline(path, piece, '/');) {
    found = &(*found)[piece];
  }
  return *found;
}

bool HasType(const Json::Value& value, const std::string& type) {
  return (type == "null" && value.isNull()) || (type == "string" && value.isString()) ||
         (type == "integer" && value.isIntegral()) || (type == "boolean" && value.isBool()) ||
         (type == "object" && value.isObject()) || (type == "array" && value.isArray());
}

void ExpectFits(const Json::Value& value, const Json::Value& reference, const std::string& where);

void ExpectMembersFit(const Json::Value& value, const Json::Value& schema,
                      const std::string& where) {
  for (const Json::Value& name : schema["required"]) {
    EXPECT_TRUE(value.isMember(name.asString())) << where << " lacks " << name.asString();
  }
  const Json::Value& properties = schema["properties"];
  for (const std::string& name : properties.getMemberNames()) {
    if (value.isMember(name)) {
      ExpectFits(value[name], properties[name], where + "." + name);
    }
  }
}

void ExpectFits(const Json::Value& value, const Json::Value& reference, const std::string& where) {
  const Json::Value& schema = Resolved(reference);
  if (schema.isMember("type")) {
    const Json::Value& types = schema["type"];
    bool fits = types.isString() && HasType(value, types.asString());
    for (Json::ArrayIndex i = 0; types.isArray() && i < types.size(); ++i) {
      fits = fits || HasType(value, types[i].asString());
    }
    EXPECT_TRUE(fits) << where << " is " << Json::FastWriter().write(value);
  }
  if (schema.isMember("enum")) {
    bool found = false;
    for (const Json::Value& choice : schema["enum"]) {
      found = found || choice == value;
    }
    EXPECT_TRUE(found) << where << " is " << Json::FastWriter().write(value);
  }
  if (value.isObject()) {
    ExpectMembersFit(value, schema, where);
  }
  for (Json::ArrayIndex i = 0; value.isArray() && i < value.size(); ++i) {
    ExpectFits(value[i], schema["items"], where + "[" + std::to_string(i) + "]");
  }
}

// Does what the document says of one path, and compares the reply with what it promises.
void ExpectAsDescribed(const std::string& method, const std::string& path,
                       const std::string& concrete, const std::string& body = "") {
  std::string key = method;
  std::transform(key.begin(), key.end(), key.begin(), tolower);
  const Json::Value& operation = OpenApi()["paths"]["/api/v1" + path][key];
  ASSERT_TRUE(operation.isObject()) << method << " " << path << " is not described";
  const HttpReply reply = Ask(method, concrete, body);
  const Json::Value& described = operation["responses"][std::to_string(reply.status)];
  ASSERT_TRUE(described.isObject()) << method << " " << path << ": " << reply.status << reply.body;
  const Json::Value& content = Resolved(described)["content"];
  if (content.isMember("application/json")) {
    ExpectFits(JsonOf(reply.body), content["application/json"]["schema"], method + " " + path);
  }
}

}  // namespace

TEST(DeskInterfaceTest, TheDescriptionNamesEveryRouteAndNoOther) {
  const RunningDesk desk;
  std::set<std::pair<std::string, std::string>> described;
  const Json::Value& paths = OpenApi()["paths"];
  for (const std::string& path : paths.getMemberNames()) {
    for (std::string method : paths[path].getMemberNames()) {
      std::transform(method.begin(), method.end(), method.begin(), toupper);
      described.insert({method, path});
    }
  }
  const auto routes = quendeldesk::ApiRoutes();
  EXPECT_EQ(described,
            (std::set<std::pair<std::string, std::string>>(routes.begin(), routes.end())));
}

TEST(DeskInterfaceTest, RepliesAreAsDescribed) {
  const RunningDesk desk;
  SendArchive();
  PostAsDevice("/action/a1/b2/S1", R"({"action":"enable","hmx_info":{"model":"X"}})");
  const std::string action = R"({"action":"upload_file","files":[{"file_type":"debug.dat"}]})";
  ExpectAsDescribed("POST", "/devices/{device}/actions", "/devices/1/actions", action);
  PostAsDevice("/action_progress/1/1/a1/b2/S1", "{}");
  const std::vector<std::pair<std::string, std::string>> gets = {
      {"/devices", "/devices?limit=1"},
      {"/devices", "/devices?limit=x"},
      {"/devices/{device}", "/devices/1"},
      {"/devices/{device}", "/devices/7"},
      {"/devices/{device}/timeline", "/devices/1/timeline"},
      {"/devices/{device}/heartbeats", "/devices/1/heartbeats"},
      {"/devices/{device}/actions", "/devices/1/actions"},
      {"/devices/{device}/collections", "/devices/1/collections"},
      {"/devices/{device}/uploads", "/devices/1/uploads"},
      {"/collections/{collection}", "/collections/1"},
      {"/uploads/{upload}", "/uploads/1"},
      {"/collections/{collection}/files/{file}", "/collections/1/files/0"},
      {"/collections/{collection}/files/{file}/entries", "/collections/1/files/0/entries"},
      {"/collections/{collection}/files/{file}/entries/{entry}",
       "/collections/1/files/0/entries/2"},
      {"/uploads/{upload}/files/{file}", "/uploads/1/files/0"},
  };
  for (const auto& [path, concrete] : gets) {
    ExpectAsDescribed("GET", path, concrete);
  }
  ExpectAsDescribed("POST", "/devices", "/devices", R"({"serial":"S2","enrolment":"approved"})");
  ExpectAsDescribed("POST", "/devices", "/devices", R"({"serial":"S2","enrolment":"x"})");
  ExpectAsDescribed("PUT", "/devices/{device}/enrolment", "/devices/1/enrolment",
                    R"({"enrolment":"approved"})");
  ExpectAsDescribed("PUT", "/devices/{device}/owner", "/devices/1/owner", R"({"owner":1})");
  ExpectAsDescribed("DELETE", "/devices/{device}/actions/{request_id}", "/devices/1/actions/1");
  ExpectAsDescribed("DELETE", "/devices/{device}", "/devices/1");
}

TEST(DeskInterfaceTest, NothingIsToldWithoutTheToken) {
  const RunningDesk desk;
  PostAsDevice("/heartbeat/S1");
  const std::string path = "/api/v1/devices/1";
  EXPECT_EQ(AskWith({}, "GET", path).status, 401);
  EXPECT_EQ(AskWith({"Authorization: Bearer " + Token() + "x"}, "GET", path).status, 401);
  EXPECT_EQ(AskWith({"Authorization: " + Token()}, "GET", path).status, 401);
  EXPECT_EQ(AskWith({}, "DELETE", path).status, 401);
  EXPECT_EQ(DeviceNumber(), 1);
}

TEST(DeskInterfaceTest, NothingIsDoneForAPageOfAnotherOrigin) {
  const RunningDesk desk;
  PostAsDevice("/heartbeat/S1");
  const std::string token = "Authorization: Bearer " + Token();
  const std::string path = "/api/v1/devices/1";
  for (const char* origin : {"http://evil.test", "http://127.0.0.1:51790", "null",
                             "http://127.0.0.1.evil.test:51791", "https://127.0.0.1:51791.evil"}) {
    EXPECT_EQ(AskWith({token, std::string("Origin: ") + origin}, "DELETE", path).status, 403)
        << origin;
  }
  EXPECT_EQ(AskWith({token, "Host: evil.test"}, "DELETE", path).status, 403);
  EXPECT_EQ(DeviceNumber(), 1);
  EXPECT_EQ(AskWith({token, "Origin: http://localhost:51791"}, "DELETE", path).status, 200);
}

TEST(DeskInterfaceTest, ReadsTheFilesOfACollection) {
  const RunningDesk desk;
  SendArchive();
  const Json::Value list = AskJson("/collections/1/files/0/entries");
  EXPECT_TRUE(list["complete"].asBool());
  ASSERT_EQ(list["entries"].size(), 3U);
  EXPECT_EQ(list["entries"][2]["path"], "run/log/messages");
  EXPECT_EQ(list["entries"][2]["size"], 18);
  EXPECT_EQ(Ask("GET", "/collections/1/files/0/entries/2").body, "line one\nline two\n");
  EXPECT_EQ(Ask("GET", "/collections/1/files/0/entries/1").status, 404) << "a folder";
  EXPECT_EQ(Ask("GET", "/collections/1/files/0/entries/3").status, 404);
  EXPECT_EQ(Ask("GET", "/collections/1/files/1").status, 404);
  EXPECT_EQ(Ask("GET", "/uploads/1").status, 404) << "it is a collection";
}

TEST(DeskInterfaceTest, RefusesAnActionThatNoDeviceWouldCarryOut) {
  const RunningDesk desk;
  PostAsDevice("/heartbeat/S1");
  const std::string five = R"({"file_type":"debug.dat"},)";
  const std::vector<std::string> bad = {
      "",
      "[]",
      "{",
      R"({"action":"format"})",
      R"({"action":"upload_file"})",
      R"({"action":"upload_file","files":[]})",
      R"({"action":"upload_file","files":[{"file_type":"coredump","file_path":"/etc/shadow"}]})",
      R"({"action":"upload_file","files":[{"file_type":"core","file_path":"/var/crash/@a.core"}]})",
      R"({"action":"upload_file","files":[)" + five + five + five + five + five +
          R"({"file_type":"debug.dat"}]})",
      R"({"action":"remote_close","progress":1})",
      R"({"action":"reboot","progress":0})",
      R"({"action":"reboot","expires_in":0})",
      R"({"action":"reboot","expires_in":"1"})"};
  for (const std::string& body : bad) {
    EXPECT_EQ(Ask("POST", "/devices/1/actions", body).status, 400) << body;
  }
  EXPECT_TRUE(AskJson("/devices/1/actions")["actions"].empty());
}

TEST(DeskInterfaceTest, ForgettingADeviceRemovesItsFiles) {
  const RunningDesk desk;
  SendArchive();
  EXPECT_EQ(Ask("DELETE", "/devices/1").status, 200);
  EXPECT_EQ(system("test -z \"$(find /volume1/desk/files -type f)\""), 0);
  EXPECT_EQ(Ask("GET", "/collections/1").status, 404);
}

TEST(DeskInterfaceTest, ListsDevicesInPages) {
  const RunningDesk desk;
  for (const char* serial : {"A1", "B%25", "A3"}) {
    PostAsDevice(std::string("/heartbeat/") + serial);
  }
  const Json::Value first = AskJson("/devices?limit=2");
  EXPECT_EQ(first["devices"].size(), 2U);
  const Json::Value second = AskJson("/devices?limit=2&after=" + first["next"].asString());
  EXPECT_EQ(second["devices"].size(), 1U);
  EXPECT_TRUE(second["next"].isNull());
  EXPECT_EQ(AskJson("/devices?q=A")["devices"].size(), 2U);
  EXPECT_EQ(AskJson("/devices?q=%25")["devices"].size(), 1U) << "% means nothing else";
}

TEST(DeskInterfaceTest, MetricsCountRequests) {
  const RunningDesk desk;
  PostAsDevice("/heartbeat/S1");
  PostAsDevice("/heartbeat/S2");
  PostAsDevice("/nothing");
  desk.Logs("/nothing");
  const std::string metrics = AskWith({}, "GET", "/metrics").body;
  EXPECT_THAT(metrics, HasSubstr("\nquendel_desk_requests_total{path=\"heartbeat\",result=\"200\","
                                 "code=\"0\"} 2\n"));
  EXPECT_THAT(metrics, HasSubstr("{path=\"other\",result=\"200\",code=\"111001\"} 1\n"));
  EXPECT_THAT(metrics, HasSubstr("\nquendel_desk_devices 2\n"));
  EXPECT_EQ(AskWith({}, "GET", "/healthz").status, 200);
}
