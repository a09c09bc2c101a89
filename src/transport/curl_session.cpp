// What the exchanges with the server share: the port, one libcurl transfer, and its header list.
#include "transport/curl_session.h"

#include "quendel/transport.h"

namespace quendel {

void CurlSession::Address(const char* url) {
  Set(CURLOPT_URL, url);
  Set(CURLOPT_PORT, static_cast<long>(kServerPort));
  // Deliberate: devices accept whatever certificate the server shows.
  Set(CURLOPT_SSL_VERIFYPEER, 0L);
  Set(CURLOPT_SSL_VERIFYHOST, 0L);
}

void CurlSession::ReceiveInto(std::string& reply) {
  Set(CURLOPT_WRITEFUNCTION, &QUENDELGetResponse);
  Set(CURLOPT_WRITEDATA, static_cast<void*>(&reply));
}

long CurlSession::Perform() {
  long status = 0;
  if (result_ == CURLE_OK) {
    result_ = curl_easy_perform(handle_);
  }
  if (result_ == CURLE_OK) {
    result_ = curl_easy_getinfo(handle_, CURLINFO_RESPONSE_CODE, &status);
  }
  return status;
}

void HeaderList::Add(const char* header) {
  curl_slist* longer = curl_slist_append(headers_, header);
  if (longer == nullptr) {
    complete_ = false;
    return;
  }
  headers_ = longer;
}

}  // namespace quendel
