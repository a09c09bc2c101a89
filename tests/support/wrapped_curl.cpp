// The calls of libcurl that pass through the kit; libcurl's calls of its own do not.
#include <curl/curl.h>

#include <algorithm>
#include <cstdarg>
#include <iterator>

#include "support/require.h"
#include "support/wrap.h"

QUENDEL_WRAP(curl_easy_init, CURL*, ());
QUENDEL_WRAP(curl_easy_perform, CURLcode, (CURL * handle), handle);
QUENDEL_WRAP(curl_slist_append, curl_slist*, (curl_slist * list, const char* text), list, text);

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"
QUENDEL_WRAP(curl_formfree, void, (curl_httppost * form), form);
#pragma GCC diagnostic pop

using quendel::test::PassCall;

// The variadic ones pass on what fits a pointer, which is everything that libcurl takes.
extern "C" {

QUENDEL_WRAP_BY_HAND(curl_easy_setopt, "curl_easy_setopt");
CURLcode __real_curl_easy_setopt(CURL* handle, CURLoption option, ...);
CURLcode __wrap_curl_easy_setopt(CURL* handle, CURLoption option, ...) {
  va_list arguments;
  va_start(arguments, option);
  void* value = va_arg(arguments, void*);
  va_end(arguments);
  return PassCall<CURLcode(CURL*, CURLoption, void*)>(
      wrapped_curl_easy_setopt, __real_curl_easy_setopt, handle, option, value);
}

QUENDEL_WRAP_BY_HAND(curl_easy_getinfo, "curl_easy_getinfo");
CURLcode __real_curl_easy_getinfo(CURL* handle, CURLINFO info, ...);
CURLcode __wrap_curl_easy_getinfo(CURL* handle, CURLINFO info, ...) {
  va_list arguments;
  va_start(arguments, info);
  void* value = va_arg(arguments, void*);
  va_end(arguments);
  return PassCall<CURLcode(CURL*, CURLINFO, void*)>(wrapped_curl_easy_getinfo,
                                                    __real_curl_easy_getinfo, handle, info, value);
}

// Pairs of an option and its value, up to CURLFORM_END.
QUENDEL_WRAP_BY_HAND(curl_formadd, "curl_formadd");
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
  const auto real = [&](curl_httppost** form, curl_httppost** end) {
    return __real_curl_formadd(form, end, options[0], values[0], options[1], values[1], options[2],
                               values[2], options[3], values[3], options[4], values[4], options[5]);
  };
  return PassCall<CURLFORMcode(curl_httppost**, curl_httppost**)>(wrapped_curl_formadd, real, first,
                                                                  last);
}
}
