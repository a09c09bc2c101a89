// Takes a captured multipart request apart.
#ifndef TESTS_SUPPORT_MULTIPART_H_
#define TESTS_SUPPORT_MULTIPART_H_

#include <ostream>
#include <string>
#include <vector>

#include "support/server.h"

namespace quendel::test {

struct Part {
  std::string headers;  // its header lines, each ended by CR LF
  std::string body;
};

bool operator==(const Part& left, const Part& right);
std::ostream& operator<<(std::ostream& out, const Part& part);

// The part that libcurl makes of a file, and of a text.
Part FilePart(const std::string& name, const std::string& fileName, const std::string& contentType,
              const std::string& body);
Part TextPart(const std::string& name, const std::string& body);

// Returns the value of a request's header, or an empty text.
std::string Header(const Request& request, const std::string& name);

// Returns the parts of a multipart/form-data request, in its order. A request that is not exactly
// one gives a test failure.
std::vector<Part> Parts(const Request& request);

}  // namespace quendel::test

#endif  // TESTS_SUPPORT_MULTIPART_H_
