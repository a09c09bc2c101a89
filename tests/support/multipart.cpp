// Takes a captured multipart request apart.
#include "support/multipart.h"

#include <gtest/gtest.h>
#include <strings.h>

namespace quendel::test {

bool operator==(const Part& left, const Part& right) {
  return left.headers == right.headers && left.body == right.body;
}

std::ostream& operator<<(std::ostream& out, const Part& part) {
  return out << part.headers << '\n' << part.body;
}

Part FilePart(const std::string& name, const std::string& fileName, const std::string& contentType,
              const std::string& body) {
  return {"Content-Disposition: form-data; name=\"" + name + "\"; filename=\"" + fileName +
              "\"\r\nContent-Type: " + contentType + "\r\n",
          body};
}

Part TextPart(const std::string& name, const std::string& body) {
  return {"Content-Disposition: form-data; name=\"" + name + "\"\r\n", body};
}

std::string Header(const Request& request, const std::string& name) {
  for (const auto& [key, value] : request.headers) {
    if (strcasecmp(key.c_str(), name.c_str()) == 0) {
      return value;
    }
  }
  return {};
}

std::vector<Part> Parts(const Request& request) {
  const std::string form = "multipart/form-data; boundary=";
  const std::string type = Header(request, "Content-Type");
  EXPECT_EQ(type.substr(0, form.size()), form);
  const std::string mark = "\r\n--" + type.substr(std::min(form.size(), type.size()));
  const std::string body = "\r\n" + request.body;

  std::vector<Part> parts;
  size_t begin = 0;
  EXPECT_EQ(body.compare(0, mark.size() + 2, mark + "\r\n"), 0);
  for (size_t end; (end = body.find(mark, begin + 1)) != std::string::npos; begin = end) {
    const size_t headers = begin + mark.size() + 2;
    const size_t blank = body.find("\r\n\r\n", headers);
    if (blank == std::string::npos || blank > end) {
      ADD_FAILURE() << "a part without an end to its headers";
      return parts;
    }
    parts.push_back(
        {body.substr(headers, blank + 2 - headers), body.substr(blank + 4, end - blank - 4)});
  }
  EXPECT_EQ(body.substr(begin), mark + "--\r\n");
  return parts;
}

}  // namespace quendel::test
