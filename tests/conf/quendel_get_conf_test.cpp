// The contact list, the server's host name, the service's state.
#include <gmock/gmock.h>

#include <thread>

#include "platform/owned.h"
#include "quendel.h"
#include "support/appliance.h"
#include "support/calls.h"
#include "support/log.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr char kConf[] = "/usr/arvo/etc/quendel.conf";
constexpr char kDefaults[] = "/etc.defaults/arvoinfo.conf";

const Json::Value kEmptyArray(Json::arrayValue);

// Reads the configuration that holds this text and expects success.
Json::Value ContactOf(const std::string& confText) {
  WriteFile(kConf, confText);
  QUENDELConf_t conf;
  EXPECT_EQ(QUENDELGetConf(&conf), 0);
  return conf.contact;
}

}  // namespace

TEST(GetConfTest, TakesTheContactList) {
  const Json::Value contact = ContactOf("contact=[{\"name\":\"A\"}]\n");
  ASSERT_TRUE(contact.isArray());
  EXPECT_EQ(contact[0]["name"], "A");
}

TEST(GetConfTest, TakesAnyKindOfJson) {
  EXPECT_EQ(ContactOf("contact={\"a\":1}\n")["a"], 1);
  EXPECT_EQ(ContactOf("contact=12\n"), Json::Value(12));
  EXPECT_EQ(ContactOf("contact=null\n"), Json::Value());
}

TEST(GetConfTest, ReplacesATextThatIsNotJsonInSilence) {
  EXPECT_EQ(ContactOf("contact=not json\n"), kEmptyArray);
  EXPECT_EQ(ContactOf("contact=" + std::string(2000, '[') + "\n"), kEmptyArray);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(GetConfTest, TakesAnEmptyOrMissingKeyForNoContacts) {
  EXPECT_EQ(ContactOf("contact=\n"), kEmptyArray);
  EXPECT_EQ(ContactOf("other=1\n"), kEmptyArray);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(GetConfTest, TakesAMissingFileForNoContacts) {
  QUENDELConf_t conf;
  EXPECT_EQ(QUENDELGetConf(&conf), 0);
  EXPECT_EQ(conf.contact, kEmptyArray);
  EXPECT_THAT(Log(), IsEmpty());
}

TEST(GetConfTest, LeavesTheRecordAloneWhenTheFileCannotBeRead) {
  WriteFile(std::string(kConf) + "/a-directory-of-that-name", "");
  QUENDELConf_t conf;
  conf.contact = "before";
  EXPECT_EQ(QUENDELGetConf(&conf), -1);
  EXPECT_EQ(conf.contact, "before");
  EXPECT_THAT(Log(),
              ElementsAre(Logged("quendel_get_conf", "Failed to get quendel configuration file")));
}

TEST(GetConfTest, LeavesTheRecordAloneWhenMemoryRunsOut) {
  On("ALIBCSzHashAlloc").Nth(1).Return(nullptr);
  QUENDELConf_t conf;
  conf.contact = "before";
  EXPECT_EQ(QUENDELGetConf(&conf), -1);
  EXPECT_EQ(conf.contact, "before");
  EXPECT_THAT(Log(),
              ElementsAre(Logged("quendel_get_conf", "Fail to allocate memory for alibc hash")));
}

TEST(GetConfTest, TakesOnlyANegativeAnswerForAFailedRead) {
  EXPECT_EQ(ContactOf(""), kEmptyArray);
  On("ALIBCFileGetPair").Nth(1).Return(-7);
  QUENDELConf_t conf;
  EXPECT_EQ(QUENDELGetConf(&conf), -1);
}

TEST(GetConfTest, MakesRoomForTheWholeFile) {
  Record("ALIBCSzHashAlloc");
  ContactOf("contact=1\n");
  EXPECT_THAT(Recorded(), ElementsAre("1024"));
}

TEST(GetConfTest, ReadsTheFileAnewAtEachCall) {
  EXPECT_EQ(ContactOf("contact=1\n"), Json::Value(1));
  EXPECT_EQ(ContactOf("contact=2\n"), Json::Value(2));
}

TEST(GetServerHostTest, IsTheConfiguredHost) {
  WriteFile(kDefaults, "quendel_server=\"a.example\"\n");
  EXPECT_EQ(QUENDELGetServerHost(), "a.example");
}

TEST(GetServerHostTest, KeepsTheFirstAnswerForTheLifeOfTheProcess) {
  WriteFile(kDefaults, "quendel_server=\"a.example\"\n");
  EXPECT_EQ(QUENDELGetServerHost(), "a.example");
  WriteFile(kDefaults, "quendel_server=\"b.example\"\n");
  EXPECT_EQ(QUENDELGetServerHost(), "a.example");
}

TEST(GetServerHostTest, TakesThirtyOneCharactersAtMost) {
  WriteFile(kDefaults, "quendel_server=" + std::string(40, 'h') + "\n");
  EXPECT_EQ(QUENDELGetServerHost(), std::string(31, 'h'));
}

TEST(GetServerHostTest, IsTheDefaultWhenTheKeyIsMissing) {
  WriteFile(kDefaults, "other=1\n");
  EXPECT_EQ(QUENDELGetServerHost(), QUENDEL_DEFAULT_SERVER_HOST);
}

TEST(GetServerHostTest, IsTheDefaultWhenTheValueIsEmpty) {
  WriteFile(kDefaults, "quendel_server=\n");
  EXPECT_EQ(QUENDELGetServerHost(), QUENDEL_DEFAULT_SERVER_HOST);
}

TEST(GetServerHostTest, IsWhateverTextTheReaderFound) {
  Record("ALIBCFileGetKeyValue");
  On("ALIBCFileGetKeyValue").Nth(1).Return(5);
  EXPECT_EQ(QUENDELGetServerHost(), "");
  EXPECT_THAT(Recorded(), ElementsAre("/etc.defaults/arvoinfo.conf|quendel_server|32|0"));
}

TEST(GetServerHostTest, NeverRetriesAFailedRead) {
  RemoveFile(kDefaults);
  EXPECT_EQ(QUENDELGetServerHost(), QUENDEL_DEFAULT_SERVER_HOST);
  WriteFile(kDefaults, "quendel_server=\"late.example\"\n");
  EXPECT_EQ(QUENDELGetServerHost(), QUENDEL_DEFAULT_SERVER_HOST);
  EXPECT_EQ(Calls("ALIBCFileGetKeyValue"), 1);
}

TEST(GetServerHostTest, GivesEveryThreadTheConfiguredHost) {
  WriteFile(kDefaults, "quendel_server=\"a.example\"\n");
  std::vector<std::string> hosts(16);
  std::vector<std::thread> threads;
  for (std::string& host : hosts) {
    threads.emplace_back([&host] { host = QUENDELGetServerHost(); });
  }
  for (std::thread& thread : threads) {
    thread.join();
  }
  EXPECT_THAT(hosts, testing::Each("a.example"));
}

TEST(IsEnableTest, IsThePlatformsAnswerUnchanged) {
  SetIdentity({{"service_quendeld", "yes"}});
  EXPECT_NE(QUENDELIsEnable(), 0);
  SetIdentity({{"service_quendeld", "no"}});
  EXPECT_EQ(QUENDELIsEnable(), 0);
  On("ALIBServiceIsEnabled").Nth(1).Return(7);
  EXPECT_EQ(QUENDELIsEnable(), 7);
}

TEST(GetHashValueTest, CopiesTheValue) {
  platform::OwnedHash hash(16);
  ASSERT_GE(ALIBCSzHashSetValue(hash.slot(), "key", "value"), 0);
  EXPECT_EQ(QUENDELGetHashValue(hash.get(), "key"), "value");
}

TEST(GetHashValueTest, IsEmptyForAnAbsentKey) {
  platform::OwnedHash hash(16);
  EXPECT_EQ(QUENDELGetHashValue(hash.get(), "key"), "");
  EXPECT_EQ(ALIBCSzHashGetValue(hash.get(), "key"), nullptr);
}
