// The exchanges with the service's server: HTTPS on TCP port 51790. Neither the server's
// certificate nor its host name is verified, and a reply is held in memory whole, whatever its
// size. docs/protocol.md shows each exchange.
#ifndef QUENDEL_TRANSPORT_H_
#define QUENDEL_TRANSPORT_H_

#include <json/value.h>

#include <cstddef>
#include <map>
#include <string>
#include <vector>

#include "quendel/export.h"
#include "quendel/types.h"

// Error numbers of the appliance's web API that tell its user interface what the server answered.
enum _tag_WEBAPI_CORE_ERR : int {
  WEBAPI_CORE_ERR_QUENDEL_DENIED = 403,     // server code 111000
  WEBAPI_CORE_ERR_QUENDEL_UNKNOWN = 6900,   // any code that the table does not hold
  WEBAPI_CORE_ERR_QUENDEL_REJECTED = 6905,  // server code 111001
  WEBAPI_CORE_ERR_QUENDEL_SERVER_FAILURE =
      6999  // server code 119999, and replies without an answer
};

// The web-API error of each server code that has one of its own. Filled when the library is loaded
// and only read afterwards.
extern QUENDEL_EXPORT const std::map<int, _tag_WEBAPI_CORE_ERR> QUENDELWebapiErrorMap;

// Builds the URL of a request: "https://", QUENDELGetServerHost(), and each piece with a "/" before
// it. Pieces are taken as they are: nothing is escaped, an empty piece gives an empty segment. No
// piece gives the bare "https://" + host. The URL never names the port.
//
// Returns the URL; never fails.
QUENDEL_EXPORT std::string QUENDELGenerateReq(const std::vector<std::string>& pieces);

// Posts a JSON value to the server and reads its JSON reply.
//
// `response` receives the reply whenever that was JSON, also when the status was not 200; otherwise
// it is untouched. Whether the reply reports success is for the caller to judge.
//
// The first transfer of a process initialises libcurl, which must not race with another thread's
// first transfer; later calls may run in parallel.
//
// Returns 0 when the server answered with status 200 and a reply that is JSON, else -1.
QUENDEL_EXPORT int QUENDELPostDataToServer(const char* url, const Json::Value& request,
                                           Json::Value& response);

// The write callback that the library gives to libcurl: appends size * count bytes of data to the
// std::string at sink.
//
// Returns size * count, or 0, which ends the transfer as failed, when memory ran out.
QUENDEL_EXPORT size_t QUENDELGetResponse(char* data, size_t size, size_t count, void* sink);

// Judges the text of a reply: a JSON object with a boolean "success" and, on failure, an integer
// "code".
//
// A member that is missing or of a kind that cannot be converted reads as false or 0.
//
// Returns 0 when "success" is true, whatever "code" says; else the code when that is not 0; else,
// and for a text that is not JSON, 119999.
QUENDEL_EXPORT int QUENDELParseResponse(const std::string& text);

// Translates a server code into the error number of the appliance's web API.
//
// Returns the entry of QUENDELWebapiErrorMap, or 6900 for a code that has none.
QUENDEL_EXPORT int QUENDELGetWebapiError(int code);

// Tells whether the server can be reached: two connections in a row, a second apart, must succeed
// within six attempts at the first IPv4 address of the server host. Nothing is sent. Takes up to
// five seconds and the system's own time for each connection.
//
// Each failed attempt leaves its socket open, so a call can cost the process up to six descriptors.
// Not safe to call from several threads at once.
//
// Returns 1 when the server is reachable, else 0.
QUENDEL_EXPORT int QUENDELIsServerReachable();

// Posts files to the server as one multipart/form-data request: a part for each file, in the order
// of `items`, and last a text part that holds a JSON array with the description of each file. Every
// part has the name `name`. No item at all still posts the array, empty.
//
// Files are read from disk while they are sent, whatever their size, and must stay in place until
// the function returns. File name and content type of a part are what libcurl derives from the
// path.
//
// `meta` describes one file: it gets an empty JSON object to fill and the item, and returns 0, or
// non-zero when it cannot. A file without a description is posted all the same and the array lacks
// its entry, so its entries may be fewer than the files. A file that cannot be opened fails the
// whole post.
//
// The list of parts, some hundred bytes for each file and not the files' contents, is kept until
// the process exits.
//
// Returns 0 when the server answered with status 200 and a reply that reports success, as
// QUENDELParseResponse() judges it, else -1.
QUENDEL_EXPORT int QUENDELPostFileToServer(const char* url, const char* name,
                                           const std::vector<QUENDELSendDataParam_t>& items,
                                           int (*meta)(Json::Value& info,
                                                       const QUENDELSendDataParam_t& item));

// Posts a single file, like the function above with a list of one.
//
// Returns what that returns.
QUENDEL_EXPORT int QUENDELPostFileToServer(const char* url, const char* name,
                                           const QUENDELSendDataParam_t& item,
                                           int (*meta)(Json::Value& info,
                                                       const QUENDELSendDataParam_t& item));

#endif  // QUENDEL_TRANSPORT_H_
