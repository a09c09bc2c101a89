// The calls of libcurl that a test can make fail. libcurl's calls of its own are not seen.
#include <curl/curl.h>

#include <algorithm>
#include <cstdarg>
#include <iterator>

#include "support/require.h"
#include "support/wrap.h"

QUENDEL_WRAP(CURL*, curl_easy_init, ());
QUENDEL_WRAP(CURLcode, curl_easy_perform, (CURL * handle), handle);
QUENDEL_WRAP(curl_slist*, curl_slist_append, (curl_slist * list, const char* text), list, text);

// The variadic ones pass on what fits a pointer, which is everything that libcurl takes.
extern "C" {

QUENDEL_WRAP_BY_HAND(curl_easy_setopt);
CURLcode __real_curl_easy_setopt(CURL* handle, CURLoption option, ...);
CURLcode __wrap_curl_easy_setopt(CURL* handle, CURLoption option, ...) {
  va_list arguments;
  va_start(arguments, option);
  void* value = va_arg(arguments, void*);
  va_end(arguments);
  const quendel::test::WrappedCall call("curl_easy_setopt", option);
  return call.fails() ? call.result<CURLcode>() : __real_curl_easy_setopt(handle, option, value);
}

QUENDEL_WRAP_BY_HAND(curl_easy_getinfo);
CURLcode __real_curl_easy_getinfo(CURL* handle, CURLINFO info, ...);
CURLcode __wrap_curl_easy_getinfo(CURL* handle, CURLINFO info, ...) {
  va_list arguments;
  va_start(arguments, info);
  void* value = va_arg(arguments, void*);
  va_end(arguments);
  const quendel::test::WrappedCall call("curl_easy_getinfo", info);
  return call.fails() ? call.result<CURLcode>() : __real_curl_easy_getinfo(handle, info, value);
}

// Pairs of an option and its value, up to CURLFORM_END.
QUENDEL_WRAP_BY_HAND(curl_formadd);
CURLFORMcode __real_curl_formadd(curl_httppost** first, curl_httppost** last, ...);
CURLFORMcode __wrap_curl_formadd(curl_httppost** first, curl_httppost** last, ...) {
  constexpr size_t kMostPairs = 5;
  void* values[kMostPairs] = {};
  CURLformoption options[kMostPairs + 1];
  std::fill(std::begin(options), std::end(options), CURLFORM_END);
  va_list arguments;
  va_start(arguments, last);
  size_t pairs = 0;
  for (int option; (option = va_arg(arguments, int)) != CURLFORM_END; ++pairs) {
    quendel::test::Require(pairs < kMostPairs, "curl_formadd with more options than expected");
    options[pairs] = static_cast<CURLformoption>(option);
    values[pairs] = va_arg(arguments, void*);
  }
  va_end(arguments);
  const quendel::test::WrappedCall call("curl_formadd");
  if (call.fails()) {
    return call.result<CURLFORMcode>();
  }
  return __real_curl_formadd(first, last, options[0], values[0], options[1], values[1], options[2],
                             values[2], options[3], values[3], options[4], values[4], options[5]);
}
}
