// Looking into archives that mean harm.
#include "archive_list.h"

#include <fcntl.h>
#include <gmock/gmock.h>

#include <cstdlib>

#include "support/appliance.h"

using namespace quendel::test;
using quendeldesk::Descriptor;
using quendeldesk::ListArchive;
using quendeldesk::ReadArchiveEntry;
using testing::HasSubstr;

namespace {

Descriptor Open(const std::string& path) {
  return Descriptor(open(path.c_str(), O_RDONLY | O_CLOEXEC));
}

// Lets Python write an archive, which can say anything.
void Make(const std::string& script) {
  WriteFile("/tmp/make.py", "import tarfile, zipfile, io, lzma, gzip, sys\n" + script);
  ASSERT_EQ(system("cd /tmp && python3 make.py"), 0);
}

Json::Value List(const std::string& path = "/tmp/a") {
  return ListArchive(Open(path));
}

std::string Read(long long number) {
  const auto source = ReadArchiveEntry(Open("/tmp/a"), number);
  std::string text;
  char block[1000];
  while (const size_t size = source(block, sizeof(block))) {
    text.append(block, size);
  }
  return text;
}

}  // namespace

TEST(ListArchiveTest, TellsEachKindOfEntry) {
  Make(R"(
t = tarfile.open("a", "w:xz")
def add(name, kind, link=""):
    i = tarfile.TarInfo(name); i.type = kind; i.linkname = link; t.addfile(i)
add("folder", tarfile.DIRTYPE); add("soft", tarfile.SYMTYPE, "/etc/shadow")
add("hard", tarfile.LNKTYPE, "/etc/shadow"); add("pipe", tarfile.FIFOTYPE)
add("device", tarfile.CHRTYPE); add("/etc/passwd", tarfile.REGTYPE); add("../../up", tarfile.REGTYPE)
t.close()
)");
  const Json::Value list = List();
  EXPECT_TRUE(list["complete"].asBool());
  std::string kinds;
  for (const Json::Value& entry : list["entries"]) {
    kinds += entry["type"].asString() + " ";
  }
  EXPECT_EQ(kinds, "folder link link other other file file ");
  EXPECT_EQ(list["entries"][5]["path"], "/etc/passwd");
  EXPECT_EQ(list["entries"][6]["path"], "../../up");
  for (const int link : {0, 1, 2, 3, 4}) {
    EXPECT_THROW(ReadArchiveEntry(Open("/tmp/a"), link), std::out_of_range);
  }
}

TEST(ListArchiveTest, NamesOfAnyBytesAreTold) {
  Make(R"(
t = tarfile.open("a", "w", format=tarfile.GNU_FORMAT, encoding="latin-1")
for name in ["line\nbreak\x1b[31m", "caf\xe9", "x" * 9000]:
    t.addfile(tarfile.TarInfo(name))
t.close()
)");
  const Json::Value list = List();
  ASSERT_EQ(list["entries"].size(), 3U);
  EXPECT_EQ(list["entries"][0]["path"], "line\nbreak\x1b[31m");
  EXPECT_EQ(list["entries"][1]["path"], "caf\xEF\xBF\xBD");
  EXPECT_EQ(list["entries"][2]["path"].asString().size(), 4096U);
}

TEST(ListArchiveTest, StopsAtSoManyEntries) {
  Make(R"(
t = tarfile.open("a", "w:gz", compresslevel=1)
i = tarfile.TarInfo("x").tobuf()
for n in range(20): t.fileobj.write(i * 50000)
t.offset = t.fileobj.tell(); t.close()
)");
  const Json::Value list = List();
  EXPECT_FALSE(list["complete"].asBool());
  EXPECT_EQ(list["entries"].size(), 20'000U);
  EXPECT_THAT(list["reason"].asString(), HasSubstr("more entries"));
}

TEST(ListArchiveTest, StopsAtSoManyBytes) {
  // 5 GiB of zeros, in some megabytes; an archive of them in less would take long to make.
  Make(R"(
block = b"\0" * (1 << 20)
i = tarfile.TarInfo("bomb"); i.size = 5 << 30
with gzip.open("a", "wb", 1) as f:
    f.write(i.tobuf(tarfile.GNU_FORMAT))
    for n in range(5 << 10): f.write(block)
)");
  const Json::Value list = List();
  EXPECT_FALSE(list["complete"].asBool());
  EXPECT_THAT(list["reason"].asString(), HasSubstr("more bytes"));
}

TEST(ListArchiveTest, ADamagedArchiveIsToldAsFarAsItGoes) {
  Make(R"(
b = io.BytesIO(); t = tarfile.open(fileobj=b, mode="w")
for name in ["one", "two"]:
    i = tarfile.TarInfo(name); i.size = 5000; t.addfile(i, io.BytesIO(b"x" * 5000))
t.close(); open("a", "wb").write(b.getvalue()[:8000])
)");
  const Json::Value list = List();
  EXPECT_FALSE(list["complete"].asBool());
  EXPECT_EQ(list["entries"][0]["path"], "one");
}

TEST(ListArchiveTest, WhatIsNoArchiveIsAFile) {
  WriteFile("/tmp/a", "just text\n");
  EXPECT_EQ(List()["entries"][0]["path"], "data");
  EXPECT_EQ(Read(0), "just text\n");
  WriteFile("/tmp/a", "");
  EXPECT_TRUE(List()["entries"].empty());
}

TEST(ListArchiveTest, ReadsZipFiles) {
  Make(R"(
z = zipfile.ZipFile("a", "w", zipfile.ZIP_DEFLATED)
z.writestr("debug/one.txt", "1" * 5000); z.writestr("debug/two.txt", "2"); z.close()
)");
  EXPECT_EQ(List()["entries"][1]["path"], "debug/two.txt");
  EXPECT_EQ(Read(0), std::string(5000, '1'));
  EXPECT_THROW(Read(2), std::out_of_range);
}
