// What both posts log of a transfer that failed.
#ifndef TESTS_TRANSPORT_CURL_LINE_H_
#define TESTS_TRANSPORT_CURL_LINE_H_

#include <curl/curl.h>

#include <string>

namespace quendel::test {

inline std::string CurlLine(CURLcode code) {
  return "CURL Error(" + std::to_string(code) + "): " + curl_easy_strerror(code);
}

}  // namespace quendel::test

#endif  // TESTS_TRANSPORT_CURL_LINE_H_
