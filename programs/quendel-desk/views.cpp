// What programs and people get to see of the database, as JSON.
#include "views.h"

#include <algorithm>

#include "json.h"

namespace quendeldesk {
namespace {

using soci::into;
using soci::use;

Json::Value Number(long long value) {
  return static_cast<Json::Int64>(value);
}
Json::Value Moment(long long value) {
  return value == 0 ? Json::Value() : Number(value);
}

// A text that the desk wrote as JSON, or null.
Json::Value Parsed(const std::string& text) {
  Json::Value value;
  return ReadJson(text, value) ? value : Json::Value();
}

struct DeviceColumns {
  long long id = 0;
  std::string serial;
  std::string enrolment;
  long long first_seen = 0;
  long long last_seen = 0;
  long long last_heartbeat = 0;
  long long owner = 0;
  std::string version;
  std::string email;
  std::string info;
  int owners = 0;
};

constexpr char kDeviceColumns[] =
    "SELECT id, serial, enrolment, first_seen, last_seen, last_heartbeat, owner_id, version, email,"
    " info, (SELECT COUNT(*) FROM owners WHERE owners.device_id = devices.id) FROM devices ";

// Binds the columns of the query above.
#define QUENDEL_DESK_INTO_DEVICE(row)                                                            \
  into((row).id), into((row).serial), into((row).enrolment), into((row).first_seen),             \
      into((row).last_seen), into((row).last_heartbeat), into((row).owner), into((row).version), \
      into((row).email), into((row).info), into((row).owners)

Json::Value ViewOf(const DeviceColumns& row) {
  Json::Value view;
  view["id"] = Number(row.id);
  view["serial"] = row.serial;
  view["enrolment"] = row.enrolment;
  view["first_seen"] = Moment(row.first_seen);
  view["last_seen"] = Moment(row.last_seen);
  view["last_heartbeat"] = Moment(row.last_heartbeat);
  view["owner"] = row.owner == 0 ? Json::Value() : Number(row.owner);
  view["version"] = row.version;
  view["email"] = row.email;
  view["info"] = Parsed(row.info);
  view["conflict"] = row.owners > 1;
  return view;
}

Json::Value OwnersOf(soci::session& session, long long device) {
  Json::Value list(Json::arrayValue);
  long long id = 0;
  long long first = 0;
  long long last = 0;
  std::string a;
  std::string b;
  soci::statement select =
      (session.prepare << "SELECT id, field_a, field_b, first_seen, last_seen FROM owners"
                          " WHERE device_id = :device ORDER BY id",
       use(device, "device"), into(id), into(a), into(b), into(first), into(last));
  select.execute();
  while (select.fetch()) {
    Json::Value& owner = list.append(Json::Value());
    owner["id"] = Number(id);
    owner["field_a"] = a;
    owner["field_b"] = b;
    owner["first_seen"] = Moment(first);
    owner["last_seen"] = Moment(last);
  }
  return list;
}

// The text with what means something to LIKE taken literally.
std::string LikePattern(const std::string& text) {
  std::string pattern = "%";
  for (const char c : text) {
    if (c == '%' || c == '_' || c == '!') {
      pattern += '!';
    }
    pattern += c;
  }
  return pattern + "%";
}

}  // namespace

Json::Value DeviceList(soci::session& session, const DeviceQuery& query) {
  Json::Value list(Json::arrayValue);
  const std::string pattern = LikePattern(query.text);
  DeviceColumns row;
  soci::statement select =
      (session.prepare << kDeviceColumns
                       << "WHERE id > :after AND serial LIKE :pattern ESCAPE '!' ORDER BY id"
                          " LIMIT :limit",
       use(query.after, "after"), use(pattern, "pattern"), use(query.limit, "limit"),
       QUENDEL_DESK_INTO_DEVICE(row));
  select.execute();
  while (select.fetch()) {
    list.append(ViewOf(row));
  }
  return list;
}

Json::Value DeviceView(soci::session& session, long long device) {
  DeviceColumns row;
  session << kDeviceColumns << "WHERE id = :id", use(device, "id"), QUENDEL_DESK_INTO_DEVICE(row);
  if (!session.got_data()) {
    return Json::Value();
  }
  Json::Value view = ViewOf(row);
  view["owners"] = OwnersOf(session, device);
  return view;
}

long long DeviceBySerial(soci::session& session, const std::string& serial) {
  long long id = 0;
  session << "SELECT id FROM devices WHERE serial = :serial", use(serial, "serial"), into(id);
  return id;
}

Json::Value Heartbeats(soci::session& session, long long device, const Span& span) {
  Json::Value list(Json::arrayValue);
  long long at = 0;
  soci::statement select =
      (session.prepare << "SELECT at FROM heartbeats WHERE device_id = :device AND at >= :begin"
                          " AND at < :finish ORDER BY at DESC LIMIT :limit",
       use(device, "device"), use(span.from, "begin"), use(span.to, "finish"),
       use(span.limit, "limit"), into(at));
  select.execute();
  while (select.fetch()) {
    list.append(Number(at));
  }
  return list;
}

namespace {

void AddEvents(soci::session& session, long long device, const Span& span, Json::Value& list) {
  long long at = 0;
  long long owner = 0;
  std::string name;
  std::string body;
  soci::statement select =
      (session.prepare << "SELECT at, owner_id, name, body FROM events WHERE device_id = :device"
                          " AND at >= :begin AND at < :finish ORDER BY at DESC LIMIT :limit",
       use(device, "device"), use(span.from, "begin"), use(span.to, "finish"),
       use(span.limit, "limit"), into(at), into(owner), into(name), into(body));
  select.execute();
  while (select.fetch()) {
    Json::Value& entry = list.append(Json::Value());
    entry["kind"] = "event";
    entry["at"] = Number(at);
    entry["owner"] = Number(owner);
    entry["name"] = name;
    entry["body"] = Parsed(body);
  }
}

void AddProgress(soci::session& session, long long device, const Span& span, Json::Value& list) {
  long long at = 0;
  long long owner = 0;
  long long id = 0;
  long long value = 0;
  std::string details;
  soci::statement select =
      (session.prepare << "SELECT at, owner_id, request_id, value, details FROM progress"
                          " WHERE device_id = :device AND at >= :begin AND at < :finish"
                          " ORDER BY at DESC LIMIT :limit",
       use(device, "device"), use(span.from, "begin"), use(span.to, "finish"),
       use(span.limit, "limit"), into(at), into(owner), into(id), into(value), into(details));
  select.execute();
  while (select.fetch()) {
    Json::Value& entry = list.append(Json::Value());
    entry["kind"] = "progress";
    entry["at"] = Number(at);
    entry["owner"] = Number(owner);
    entry["request_id"] = Number(id);
    entry["progress"] = Number(value);
    entry["details"] = Parsed(details);
  }
}

void AddAll(const Json::Value& from, const char* kind, const char* moment, const Span& span,
            Json::Value& list) {
  for (Json::Value entry : from) {
    const long long at = entry[moment].asInt64();
    if (at >= span.from && at < span.to) {
      entry["kind"] = kind;
      entry["at"] = entry[moment];
      list.append(entry);
    }
  }
}

}  // namespace

Json::Value TimeLine(soci::session& session, long long device, const Span& span, long long now) {
  Json::Value all(Json::arrayValue);
  AddEvents(session, device, span, all);
  AddProgress(session, device, span, all);
  AddAll(ActionList(session, device, now), "action", "created_at", span, all);
  for (const char* kind : {"collection", "upload"}) {
    AddAll(DeliveryList(session, device, kind, span), kind, "at", span, all);
  }
  std::vector<Json::Value> entries(all.begin(), all.end());
  std::stable_sort(entries.begin(), entries.end(), [](const auto& left, const auto& right) {
    return left["at"].asInt64() > right["at"].asInt64();
  });
  Json::Value list(Json::arrayValue);
  for (size_t i = 0; i < entries.size() && i < static_cast<size_t>(span.limit); ++i) {
    list.append(entries[i]);
  }
  return list;
}

Json::Value ActionList(soci::session& session, long long device, long long now) {
  Json::Value list(Json::arrayValue);
  long long id = 0;
  long long created = 0;
  long long expires = 0;
  long long closed = 0;
  std::string name;
  std::string body;
  std::string state;
  soci::statement select =
      (session.prepare << "SELECT request_id, name, body, state, created_at, expires_at, closed_at"
                          " FROM actions WHERE device_id = :device ORDER BY request_id DESC",
       use(device, "device"), into(id), into(name), into(body), into(state), into(created),
       into(expires), into(closed));
  select.execute();
  while (select.fetch()) {
    Json::Value& action = list.append(Json::Value());
    action["request_id"] = Number(id);
    action["name"] = name;
    action["body"] = Parsed(body);
    action["state"] = state == "open" && expires <= now ? "expired" : state;
    action["created_at"] = Number(created);
    action["expires_at"] = Number(expires);
    action["closed_at"] = Moment(closed);
  }
  return list;
}

namespace {

struct DeliveryColumns {
  long long id = 0;
  long long device = 0;
  long long owner = 0;
  long long request = 0;
  long long at = 0;
  std::string descriptions;
  std::string mismatch;
};

constexpr char kDeliveryColumns[] =
    "SELECT id, device_id, owner_id, request_id, at, descriptions, mismatch FROM deliveries ";

#define QUENDEL_DESK_INTO_DELIVERY(row)                                                       \
  into((row).id), into((row).device), into((row).owner), into((row).request), into((row).at), \
      into((row).descriptions), into((row).mismatch)

Json::Value ViewOf(const FileRow& row) {
  Json::Value view;
  view["number"] = Number(row.number);
  view["filename"] = row.filename;
  view["content_type"] = row.content_type;
  view["size"] = Number(row.size);
  view["sha256"] = row.sha256;
  return view;
}

Json::Value ViewOf(soci::session& session, const DeliveryColumns& row) {
  Json::Value view;
  view["id"] = Number(row.id);
  view["device"] = Number(row.device);
  view["owner"] = Number(row.owner);
  view["request_id"] = row.request == 0 ? Json::Value() : Number(row.request);
  view["at"] = Number(row.at);
  view["descriptions"] = Parsed(row.descriptions);
  view["mismatch"] = Parsed(row.mismatch);
  view["files"] = Json::Value(Json::arrayValue);
  for (const FileRow& file : FilesOf(session, row.id)) {
    view["files"].append(ViewOf(file));
  }
  return view;
}

std::vector<FileRow> Files(soci::session& session, const std::string& condition, long long value) {
  std::vector<FileRow> files;
  FileRow row;
  soci::statement select =
      (session.prepare << "SELECT delivery_id, number, object, filename, content_type, size, sha256"
                          " FROM files WHERE "
                       << condition << " :value ORDER BY delivery_id, number",
       use(value, "value"), into(row.delivery), into(row.number), into(row.object),
       into(row.filename), into(row.content_type), into(row.size), into(row.sha256));
  select.execute();
  while (select.fetch()) {
    files.push_back(row);
  }
  return files;
}

}  // namespace

Json::Value DeliveryList(soci::session& session, long long device, const std::string& kind,
                         const Span& span) {
  std::vector<DeliveryColumns> rows;
  DeliveryColumns row;
  soci::statement select =
      (session.prepare << kDeliveryColumns
                       << "WHERE device_id = :device AND kind = :kind AND at >= :begin"
                          " AND at < :finish ORDER BY at DESC, id DESC LIMIT :limit",
       use(device, "device"), use(kind, "kind"), use(span.from, "begin"), use(span.to, "finish"),
       use(span.limit, "limit"), QUENDEL_DESK_INTO_DELIVERY(row));
  select.execute();
  while (select.fetch()) {
    rows.push_back(row);
  }
  Json::Value list(Json::arrayValue);
  for (const DeliveryColumns& delivery : rows) {
    list.append(ViewOf(session, delivery));
  }
  return list;
}

Json::Value DeliveryView(soci::session& session, long long delivery, const std::string& kind) {
  DeliveryColumns row;
  session << kDeliveryColumns << "WHERE id = :id AND kind = :kind", use(delivery, "id"),
      use(kind, "kind"), QUENDEL_DESK_INTO_DELIVERY(row);
  return session.got_data() ? ViewOf(session, row) : Json::Value();
}

std::vector<FileRow> FilesOf(soci::session& session, long long delivery) {
  return Files(session, "delivery_id =", delivery);
}

std::vector<FileRow> AllFiles(soci::session& session) {
  return Files(session, "delivery_id >", 0);
}

long long CountOf(soci::session& session, const std::string& table) {
  long long count = 0;
  session << "SELECT COUNT(*) FROM " << table, into(count);
  return count;
}

long long CountOpenActions(soci::session& session, long long now) {
  long long count = 0;
  session << "SELECT COUNT(*) FROM actions WHERE state = 'open' AND expires_at > :now",
      use(now, "now"), into(count);
  return count;
}

}  // namespace quendeldesk
