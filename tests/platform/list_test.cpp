// The list of strings, and splitting a text into one.
#include "platform/list.h"

#include <gmock/gmock.h>

#include <string>

#include "platform/containers.h"
#include "platform/error.h"
#include "platform/owned.h"

using namespace quendel::test;
using testing::ElementsAre;
using testing::IsEmpty;

TEST(SzListTest, StartsEmpty) {
  platform::OwnedList list(512);
  ASSERT_TRUE(list);
  EXPECT_EQ(ALIBCSzListSize(list.get()), 0);
}

TEST(SzListTest, TakesNoNegativeSize) {
  EXPECT_EQ(ALIBCSzListAlloc(-1), nullptr);
  EXPECT_EQ(ALIBCErrGet(), 0x0100);
}

TEST(SzListTest, FreesNothing) {
  ALIBCSzListFree(nullptr);
}

TEST(SzListTest, KeepsCopiesInOrder) {
  platform::OwnedList list(0);
  char text[] = "one";
  EXPECT_EQ(ALIBCSzListPush(list.slot(), text), 1);
  text[0] = 'x';
  EXPECT_EQ(ALIBCSzListPush(list.slot(), ""), 2);
  EXPECT_EQ(ALIBCSzListPush(list.slot(), "one"), 3);
  EXPECT_THAT(Texts(list), ElementsAre("one", "", "one"));
}

TEST(SzListTest, TakesATextOfItsOwnWhileGrowing) {
  platform::OwnedList list(0);
  const std::string text(1000, 't');
  ALIBCSzListPush(list.slot(), text.c_str());
  for (int i = 0; i < 100; ++i) {
    ALIBCSzListPush(list.slot(), ALIBCSzListGet(list.get(), i));
  }
  EXPECT_EQ(ALIBCSzListGet(list.get(), 100), text);
}

TEST(SzListTest, FindsTheFirstEqualText) {
  platform::OwnedList list(0);
  for (const char* text : {"10", "1", "100", "1"}) {
    ALIBCSzListPush(list.slot(), text);
  }
  EXPECT_EQ(ALIBCSzListFind(list.get(), "1"), 1);
  EXPECT_LT(ALIBCSzListFind(list.get(), "0"), 0);
  EXPECT_LT(ALIBCSzListFind(list.get(), ""), 0);
}

TEST(SzListTest, GivesNullOutOfRange) {
  platform::OwnedList list(4);
  ALIBCSzListPush(list.slot(), "only");
  EXPECT_STREQ(ALIBCSzListGet(list.get(), 0), "only");
  EXPECT_EQ(ALIBCSzListGet(list.get(), 1), nullptr);
  EXPECT_EQ(ALIBCSzListGet(list.get(), -1), nullptr);
}

TEST(SzListTest, IsUsableAfterAllWasTakenOut) {
  platform::OwnedList list(0);
  ALIBCSzListPush(list.slot(), "old");
  ALIBCSzListRemoveAll(list.get());
  EXPECT_THAT(Texts(list), IsEmpty());
  EXPECT_EQ(ALIBCSzListPush(list.slot(), "new"), 1);
}

TEST(SzListTest, RefusesNullArguments) {
  platform::OwnedList list(0);
  ALIBSZLIST* none = nullptr;
  EXPECT_LT(ALIBCSzListPush(nullptr, "t"), 0);
  EXPECT_LT(ALIBCSzListPush(&none, "t"), 0);
  EXPECT_LT(ALIBCSzListPush(list.slot(), nullptr), 0);
  EXPECT_LT(ALIBCSzListFind(nullptr, "t"), 0);
  EXPECT_LT(ALIBCSzListFind(list.get(), nullptr), 0);
  EXPECT_EQ(ALIBCSzListSize(nullptr), 0);
  EXPECT_EQ(ALIBCSzListGet(nullptr, 0), nullptr);
  ALIBCSzListRemoveAll(nullptr);
}

TEST(StrTokTest, SplitsAtEverySeparator) {
  platform::OwnedList list(0);
  EXPECT_EQ(ALIBCStrTok("11,22;33", ",;", list.slot()), 3);
  EXPECT_THAT(Texts(list), ElementsAre("11", "22", "33"));
}

TEST(StrTokTest, DropsEmptyPieces) {
  platform::OwnedList list(0);
  EXPECT_EQ(ALIBCStrTok(",,11,,22,", ",", list.slot()), 2);
  EXPECT_THAT(Texts(list), ElementsAre("11", "22"));
}

TEST(StrTokTest, GivesNothingForNothing) {
  platform::OwnedList list(0);
  EXPECT_EQ(ALIBCStrTok("", ",", list.slot()), 0);
  EXPECT_EQ(ALIBCStrTok(",,,", ",", list.slot()), 0);
  EXPECT_THAT(Texts(list), IsEmpty());
}

TEST(StrTokTest, TakesATextWithoutSeparatorsWhole) {
  platform::OwnedList list(0);
  EXPECT_EQ(ALIBCStrTok("\"\"", ",", list.slot()), 1);
  EXPECT_EQ(ALIBCStrTok("a,b", "", list.slot()), 1);
  EXPECT_THAT(Texts(list), ElementsAre("\"\"", "a,b"));
}

TEST(StrTokTest, AppendsToWhatTheListHolds) {
  platform::OwnedList list(0);
  ALIBCSzListPush(list.slot(), "before");
  EXPECT_EQ(ALIBCStrTok("a", ",", list.slot()), 1);
  EXPECT_THAT(Texts(list), ElementsAre("before", "a"));
}

TEST(StrTokTest, RefusesNullArguments) {
  platform::OwnedList list(0);
  ALIBSZLIST* none = nullptr;
  EXPECT_LT(ALIBCStrTok(nullptr, ",", list.slot()), 0);
  EXPECT_LT(ALIBCStrTok("a", nullptr, list.slot()), 0);
  EXPECT_LT(ALIBCStrTok("a", ",", nullptr), 0);
  EXPECT_LT(ALIBCStrTok("a", ",", &none), 0);
}
