// Posts files and their descriptions to the server, as one multipart form.

// The form calls are deprecated in libcurl. What the server gets is the same with them as with
// their successors, and the appliance's libcurl has these.
#define CURL_DISABLE_DEPRECATION

#include "base/json_text.h"
#include "base/log.h"
#include "quendel/transport.h"
#include "transport/curl_session.h"

namespace quendel {
namespace {

constexpr char kLogUnit[] = "quendel_post_file_to_server";

constexpr long kHttpOk = 200;

using Describe = int (*)(Json::Value& info, const QUENDELSendDataParam_t& item);

// The parts of the request, in the order in which they were added.
//
// Deliberate: nothing frees the list. It lives until the process exits.
class Form {
 public:
  // Notes a file's path; libcurl reads the file when it sends it.
  bool AddFile(const char* name, const std::string& path) {
    return curl_formadd(&first_, &last_, CURLFORM_COPYNAME, name, CURLFORM_FILE, path.c_str(),
                        CURLFORM_END) == CURL_FORMADD_OK;
  }

  bool AddText(const char* name, const std::string& text) {
    return curl_formadd(&first_, &last_, CURLFORM_COPYNAME, name, CURLFORM_COPYCONTENTS,
                        text.c_str(), CURLFORM_END) == CURL_FORMADD_OK;
  }

  curl_httppost* get() const { return first_; }

 private:
  curl_httppost* first_ = nullptr;
  curl_httppost* last_ = nullptr;
};

// Appends the item's description. Returns false when there is none.
bool AppendDescription(Json::Value& descriptions, const QUENDELSendDataParam_t& item,
                       Describe meta) {
  try {
    Json::Value info(Json::objectValue);
    if (meta(info, item) != 0) {
      return false;
    }
    descriptions.append(std::move(info));
    return true;
  } catch (...) {
    return false;
  }
}

// Adds one file to the form and its description to the list. What fails costs only this file.
void AddItem(Form& form, const char* name, const QUENDELSendDataParam_t& item, Describe meta,
             Json::Value& descriptions) {
  if (!form.AddFile(name, item.path)) {
    QUENDEL_LOG("Failed to add curl form: '%s'", item.path.c_str());
    return;
  }
  if (!AppendDescription(descriptions, item, meta)) {
    QUENDEL_LOG("Failed to gen file metadata: '%s'", item.path.c_str());
  }
}

// Sends the form and collects the reply. Returns the HTTP status; session.result() tells whether
// there is one.
long Exchange(CurlSession& session, const char* url, const Form& form, std::string& reply) {
  session.Address(url);
  session.Set(CURLOPT_HTTPPOST, form.get());
  session.ReceiveInto(reply);
  return session.Perform();
}

}  // namespace
}  // namespace quendel

using namespace quendel;

int QUENDELPostFileToServer(const char* url, const char* name,
                            const std::vector<QUENDELSendDataParam_t>& items, Describe meta) try {
  Form form;
  Json::Value descriptions(Json::arrayValue);
  for (const QUENDELSendDataParam_t& item : items) {
    AddItem(form, name, item, meta, descriptions);
  }
  const std::string list = JsonToText(descriptions);
  if (!form.AddText(name, list)) {
    // Deliberate: no quotes round the list, unlike round the path of a file.
    QUENDEL_LOG("Failed to add curl form: %s", list.c_str());
    return -1;
  }

  std::string reply;
  CurlSession session;
  if (!session) {
    QUENDEL_LOG("Failed to allocate memory for curl");
    return -1;
  }
  const long status = Exchange(session, url, form, reply);
  if (session.result() != CURLE_OK) {
    QUENDEL_LOG("CURL Error(%d): %s", session.result(), curl_easy_strerror(session.result()));
    return -1;
  }
  // Deliberate: what the reply says comes before the status, so a rejected post is reported with
  // the server's own words whatever its status.
  if (QUENDELParseResponse(reply) != 0) {
    QUENDEL_LOG("Failed to handle response: [%s]", reply.c_str());
    return -1;
  }
  if (status != kHttpOk) {
    QUENDEL_LOG("Failed to post file, server return %ld", status);
    return -1;
  }
  return 0;
} catch (...) {
  QUENDEL_LOG("Failed to allocate memory for curl");
  return -1;
}

int QUENDELPostFileToServer(const char* url, const char* name, const QUENDELSendDataParam_t& item,
                            Describe meta) try {
  return QUENDELPostFileToServer(url, name, std::vector<QUENDELSendDataParam_t>{item}, meta);
} catch (...) {
  QUENDEL_LOG("Failed to allocate memory for curl");
  return -1;
}
