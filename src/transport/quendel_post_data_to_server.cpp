// One conversation with the server: a JSON value is posted, a JSON reply comes back.
#include "base/json_text.h"
#include "base/log.h"
#include "quendel/transport.h"
#include "transport/curl_session.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_post_data_to_server";

constexpr long kHttpOk = 200;

// Sends the body and collects the reply. Returns the HTTP status; session.result() tells whether
// there is one.
long Exchange(CurlSession& session, const HeaderList& headers, const char* url,
              const std::string& body, std::string& reply) {
  session.Set(CURLOPT_HTTPHEADER, headers.get());
  session.Address(url);
  session.Set(CURLOPT_POSTFIELDS, body.c_str());
  session.Set(CURLOPT_POSTFIELDSIZE, static_cast<long>(body.size()));
  session.ReceiveInto(reply);
  return session.Perform();
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELPostDataToServer(const char* url, const Json::Value& request,
                            Json::Value& response) try {
  HeaderList headers;
  headers.Add("Content-Type: application/json");
  const std::string body = JsonToText(request);
  std::string reply;

  CurlSession session;
  if (!session) {
    QUENDEL_LOG("Failed to allocate memory for curl");
    return -1;
  }
  headers.Add("Accept: application/json");
  headers.Add("charsets: utf-8");  // [sic]
  if (!headers.complete()) {
    QUENDEL_LOG("Failed to allocate memory for curl");
    return -1;
  }

  const long status = Exchange(session, headers, url, body, reply);
  if (session.result() != CURLE_OK) {
    QUENDEL_LOG("CURL Error(%d): %s", session.result(), curl_easy_strerror(session.result()));
    return -1;
  }
  // Deliberate: the reply is parsed before its status is looked at, so an error page that is not
  // JSON is a parse failure whatever its status.
  if (!JsonFromText(reply, response)) {
    QUENDEL_LOG("Failed to parse response. [%s]", reply.c_str());
    return -1;
  }
  if (status != kHttpOk) {
    QUENDEL_LOG("Failed to send data '%s', server return %ld", body.c_str(), status);
    return -1;
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to allocate memory for curl");
  return -1;
}
