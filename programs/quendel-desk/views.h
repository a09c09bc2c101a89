// What programs and people get to see of the database, as JSON. Times are milliseconds since 1970
// in UTC; one that is not known is null.
#ifndef QUENDEL_DESK_VIEWS_H_
#define QUENDEL_DESK_VIEWS_H_

#include <json/value.h>
#include <soci/soci.h>

#include <optional>
#include <string>
#include <vector>

namespace quendeldesk {

struct DeviceQuery {
  std::string text;     // part of the serial number; empty for all
  long long after = 0;  // the number of the last device of the page before
  int limit = 100;
};
Json::Value DeviceList(soci::session& session, const DeviceQuery& query);

// Null when there is none.
Json::Value DeviceView(soci::session& session, long long device);

// Returns 0 when there is none.
long long DeviceBySerial(soci::session& session, const std::string& serial);

struct Span {
  long long from = 0;
  long long to = 0;
  int limit = 1000;
};
Json::Value Heartbeats(soci::session& session, long long device, const Span& span);

// Events, progress, actions and deliveries of a device, newest first, each with its "kind".
Json::Value TimeLine(soci::session& session, long long device, const Span& span, long long now);

Json::Value ActionList(soci::session& session, long long device, long long now);
Json::Value DeliveryList(soci::session& session, long long device, const std::string& kind,
                         const Span& span);

// Null when there is none of that kind.
Json::Value DeliveryView(soci::session& session, long long delivery, const std::string& kind);

struct FileRow {
  long long delivery = 0;
  long long number = 0;
  std::string object;
  std::string filename;
  std::string content_type;
  long long size = 0;
  std::string sha256;
};
std::vector<FileRow> FilesOf(soci::session& session, long long delivery);
std::vector<FileRow> AllFiles(soci::session& session);

long long CountOf(soci::session& session, const std::string& table);
long long CountOpenActions(soci::session& session, long long now);

}  // namespace quendeldesk

#endif  // QUENDEL_DESK_VIEWS_H_
