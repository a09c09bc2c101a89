// The string-to-string hash.
#include "platform/hash.h"

#include <gmock/gmock.h>

#include <string>

#include "platform/containers.h"
#include "platform/error.h"
#include "platform/owned.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;

TEST(SzHashTest, StartsEmpty) {
  platform::OwnedHash hash(1024);
  ASSERT_TRUE(hash);
  EXPECT_THAT(Pairs(hash), IsEmpty());
}

TEST(SzHashTest, TakesNoNegativeSize) {
  EXPECT_EQ(ALIBCSzHashAlloc(-1), nullptr);
  EXPECT_EQ(ALIBCErrGet(), 0x0100);
}

TEST(SzHashTest, FreesNothing) {
  ALIBCSzHashFree(nullptr);
}

TEST(SzHashTest, KeepsCopiesOfKeyAndValue) {
  platform::OwnedHash hash(1);
  char key[] = "key";
  char value[] = "value";
  EXPECT_EQ(ALIBCSzHashSetValue(hash.slot(), key, value), 0);
  key[0] = value[0] = 'x';
  EXPECT_THAT(Pairs(hash), ElementsAre(Pair("key", "value")));
}

TEST(SzHashTest, GivesNullForAnAbsentKey) {
  platform::OwnedHash hash(1);
  EXPECT_EQ(ALIBCSzHashGetValue(hash.get(), "key"), nullptr);
}

TEST(SzHashTest, TellsAnEmptyValueFromNone) {
  platform::OwnedHash hash(1);
  ALIBCSzHashSetValue(hash.slot(), "key", "");
  ASSERT_NE(ALIBCSzHashGetValue(hash.get(), "key"), nullptr);
  EXPECT_STREQ(ALIBCSzHashGetValue(hash.get(), "key"), "");
}

TEST(SzHashTest, ReplacesAValue) {
  platform::OwnedHash hash(1);
  ALIBCSzHashSetValue(hash.slot(), "key", "old");
  ALIBCSzHashSetValue(hash.slot(), "key", "new");
  EXPECT_THAT(Pairs(hash), ElementsAre(Pair("key", "new")));
}

TEST(SzHashTest, TakesAValueOfItsOwn) {
  platform::OwnedHash hash(1);
  const std::string text(1000, 'v');
  ALIBCSzHashSetValue(hash.slot(), "a", text.c_str());
  // The pointer into the hash stays good while many more pairs make it grow.
  for (int i = 0; i < 1000; ++i) {
    ALIBCSzHashSetValue(hash.slot(), std::to_string(i).c_str(),
                        ALIBCSzHashGetValue(hash.get(), "a"));
  }
  ALIBCSzHashSetValue(hash.slot(), "a", ALIBCSzHashGetValue(hash.get(), "a"));
  EXPECT_EQ(ALIBCSzHashGetValue(hash.get(), "a"), text);
  EXPECT_EQ(ALIBCSzHashGetValue(hash.get(), "999"), text);
}

TEST(SzHashTest, GrowsBeyondItsFirstSize) {
  platform::OwnedHash hash(0);
  for (int i = 0; i < 10000; ++i) {
    ASSERT_EQ(ALIBCSzHashSetValue(hash.slot(), std::to_string(i).c_str(), "v"), 0);
  }
  EXPECT_EQ(Pairs(hash).size(), 10000U);
}

TEST(SzHashTest, IsUsableAfterAllWasTakenOut) {
  platform::OwnedHash hash(1);
  ALIBCSzHashSetValue(hash.slot(), "old", "1");
  ALIBCHashRemoveAll(hash.get());
  EXPECT_THAT(Pairs(hash), IsEmpty());
  ALIBCSzHashSetValue(hash.slot(), "new", "2");
  EXPECT_THAT(Pairs(hash), ElementsAre(Pair("new", "2")));
}

TEST(SzHashTest, ListsKeysInDescendingOrder) {
  platform::OwnedHash hash(8);
  for (const char* key : {"inode", "last_byte", "last_hash", "tar_log_inode", "total_byte"}) {
    ALIBCSzHashSetValue(hash.slot(), key, "1");
  }
  platform::OwnedList keys(0);
  EXPECT_EQ(ALIBCSzHashEnumKey(hash.get(), keys.slot()), 5);
  EXPECT_THAT(Texts(keys),
              ElementsAre("total_byte", "tar_log_inode", "last_hash", "last_byte", "inode"));
}

TEST(SzHashTest, ComparesKeysAsBytes) {
  platform::OwnedHash hash(8);
  for (const char* key : {"a", "\xC3\xA4", "Z", "aa"}) {
    ALIBCSzHashSetValue(hash.slot(), key, "1");
  }
  platform::OwnedList keys(0);
  ALIBCSzHashEnumKey(hash.get(), keys.slot());
  EXPECT_THAT(Texts(keys), ElementsAre("\xC3\xA4", "aa", "a", "Z"));
}

TEST(SzHashTest, AppendsKeysToWhatTheListHolds) {
  platform::OwnedHash hash(8);
  ALIBCSzHashSetValue(hash.slot(), "key", "1");
  platform::OwnedList keys(0);
  ALIBCSzListPush(keys.slot(), "before");
  EXPECT_EQ(ALIBCSzHashEnumKey(hash.get(), keys.slot()), 1);
  EXPECT_THAT(Texts(keys), ElementsAre("before", "key"));
}

TEST(SzHashTest, RefusesNullArguments) {
  platform::OwnedHash hash(1);
  platform::OwnedList keys(1);
  ALIBSZHASH* none = nullptr;
  ALIBSZLIST* noList = nullptr;
  EXPECT_LT(ALIBCSzHashSetValue(nullptr, "k", "v"), 0);
  EXPECT_LT(ALIBCSzHashSetValue(&none, "k", "v"), 0);
  EXPECT_LT(ALIBCSzHashSetValue(hash.slot(), nullptr, "v"), 0);
  EXPECT_LT(ALIBCSzHashSetValue(hash.slot(), "k", nullptr), 0);
  EXPECT_EQ(ALIBCSzHashGetValue(nullptr, "k"), nullptr);
  EXPECT_EQ(ALIBCSzHashGetValue(hash.get(), nullptr), nullptr);
  EXPECT_LT(ALIBCSzHashEnumKey(nullptr, keys.slot()), 0);
  EXPECT_LT(ALIBCSzHashEnumKey(hash.get(), nullptr), 0);
  EXPECT_LT(ALIBCSzHashEnumKey(hash.get(), &noList), 0);
  ALIBCHashRemoveAll(nullptr);
}
