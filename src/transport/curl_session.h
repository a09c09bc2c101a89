// What the exchanges with the server share: the port, one libcurl transfer, and its header list.
#ifndef TRANSPORT_CURL_SESSION_H_
#define TRANSPORT_CURL_SESSION_H_

#include <curl/curl.h>

#include <string>

namespace quendel {

// The TCP port of the service's server, for every exchange. No URL names it.
constexpr int kServerPort = 51790;

// One transfer. The first libcurl call that fails ends it: later ones do nothing, and result()
// tells what happened.
class CurlSession {
 public:
  CurlSession() : handle_(curl_easy_init()) {}
  ~CurlSession() { curl_easy_cleanup(handle_); }
  CurlSession(const CurlSession&) = delete;
  CurlSession& operator=(const CurlSession&) = delete;

  // False when libcurl had no memory for a transfer; nothing below may be called then.
  explicit operator bool() const { return handle_ != nullptr; }

  template <typename Value>
  void Set(CURLoption option, Value value) {
    if (result_ == CURLE_OK) {
      result_ = curl_easy_setopt(handle_, option, value);
    }
  }

  // Aims the transfer at the server. Neither its certificate nor its host name is verified.
  void Address(const char* url);

  // Collects the reply at the end of `reply`, which must live as long as the transfer.
  void ReceiveInto(std::string& reply);

  // Does the transfer. Returns the HTTP status of the reply.
  long Perform();

  CURLcode result() const { return result_; }

 private:
  CURL* handle_;
  CURLcode result_ = CURLE_OK;
};

// The request headers of a transfer, in the order in which they were added.
class HeaderList {
 public:
  HeaderList() = default;
  ~HeaderList() { curl_slist_free_all(headers_); }
  HeaderList(const HeaderList&) = delete;
  HeaderList& operator=(const HeaderList&) = delete;

  void Add(const char* header);

  // False when memory ran out for any of the headers.
  bool complete() const { return complete_; }
  curl_slist* get() const { return headers_; }

 private:
  curl_slist* headers_ = nullptr;
  bool complete_ = true;
};

}  // namespace quendel

#endif  // TRANSPORT_CURL_SESSION_H_
