#include "received.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "support/appliance.h"
#include "support/server.h"

namespace quendel::test {
namespace {

// Takes the archive out of the form, unpacks it, and puts the log's text into one file.
constexpr char kUnpack[] = R"(cd "$1" && perl -0777 -ne '
    /boundary=([^\r\n;]+)/; my $boundary = $1;
    for my $part (split /\r\n--\Q$boundary\E/) {
      my ($head, $data) = split /\r\n\r\n/, $part, 2;
      next unless defined $data && $head =~ /filename="/;
      open my $file, ">:raw", "a.tar.xz"; print $file $data;
    }' "$2" && tar -xJf a.tar.xz --strip-components 1 && { cat log/one 2>/dev/null
    for archive in log/*.xz; do [ ! -e "$archive" ] || xz -dc "$archive"; done; } >text)";

bool IsCollection(const std::string& file) {
  std::ifstream request(file, std::ios::binary);
  std::string line;
  std::getline(request, line);
  return line.rfind("POST /collect/", 0) == 0;
}

}  // namespace

std::string Received(const std::set<std::string>& refused) {
  RemoveFile("/tmp/received");
  std::string text;
  int number = 0;
  for (const std::string& file : RequestFiles()) {
    if (refused.count(file) == 0 && IsCollection(file)) {
      const std::string folder = "/tmp/received/" + std::to_string(++number);
      std::filesystem::create_directories(folder);
      WriteFile("/tmp/received/unpack", kUnpack);
      EXPECT_EQ(system(("sh /tmp/received/unpack " + folder + " " + file).c_str()), 0);
      text += ReadFile(folder + "/text");
    }
  }
  return text;
}

}  // namespace quendel::test
